// The whole road (SNMPParseReplyData over a described appliance and its
// reply) with one failure at a time: every call of every platform operation
// in turn, then every allocation in turn. Each case must give the failure's
// result, log exactly the failure's messages, each once, and leave nothing
// of the platform unreleased.
#include <map>
#include <new>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "allocation_failure.h"
#include "appliance.h"
#include "block_nodes.h"
#include "korv_standin.h"
#include "json_text.h"
#include "korvsnmp/parse_data.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using korvstandin::Fault, korvstandin::Op;

enum class Result { True, False, Threw };

// What one run of the road gives: its result, the result's members and the
// messages, each as "<unit> <text>".
struct Outcome {
    Result result = Result::True;
    std::set<std::string> members;
    std::vector<std::string> messages;
    Json::Value value{};  // the result itself; not compared
};

std::ostream &operator<<(std::ostream &out, const Outcome &outcome)
{
    static const char *const kResults[] = {"true", "false", "std::bad_alloc"};
    out << kResults[static_cast<int>(outcome.result)] << " {";
    for (const std::string &member : outcome.members) out << ' ' << member;
    for (const std::string &message : outcome.messages) out << " [" << message << ']';
    return out << " }";
}

bool operator==(const Outcome &a, const Outcome &b)
{ return a.result == b.result && a.members == b.members && a.messages == b.messages; }

const std::set<std::string> kAllMembers = {"cpu", "disk", "lun", "memory", "network", "nfs", "space", "time"};
const Outcome kClean = {Result::True, kAllMembers, {}};
// Members present when the named fill-in fails: those before it, and its own
// (created null, and left so except by the network section).
const std::set<std::string> kUpToDisk = {"cpu", "memory", "network", "disk=null"};

// What failing the call of `op` whose journal entry is `entry` must give.
Outcome FailedCallOutcome(Op op, const std::string &entry)
{
    switch (op) {
    case Op::KLIBNetGetInterfaceInfo:
        return {Result::False, {"cpu", "memory", "network"}, {"fill_in_current_network Failed to get net interface, errno=0xD01"}};
    case Op::DiskInfoEnum:
        return {Result::False, kUpToDisk, {"fill_in_current_disk_io Failed to enum disks"}};
    case Op::KORVEBoxInfoEnum:
        return {Result::False, kUpToDisk, {"fill_in_current_disk_io Failed to enum ebox"}};
    case Op::KORVUSBDevEnum:
        return {Result::False, kUpToDisk, {entry.find("(null)") != std::string::npos  // the size query
                                               ? "fill_in_current_disk_io Failed to KORVExternalDevEnum EXTERNAL_USB_DEVICE"
                                               : "fill_in_current_disk_io KORVExternalDevEnum: Error KORVUSBDevEnum"}};
    case Op::KORVSpaceInfoEnum:
        return {Result::False, {"cpu", "memory", "network", "disk", "space=null"},
                {"fill_in_current_space_io Failed to enum space info"}};
    case Op::KLIBCSzHashSetValue:  // the stand-in's last error: code, "standin" and the operation's index
        return {Result::True, kAllMembers, {"fill_in_current_disk_io KLIBCSzHashSetValue failed[0x0D01 standin:4]"}};
    case Op::KLIBCFileGetSectionValue: {  // "(path, volume, key, ...)"
        const std::string key = entry.substr(entry.find(", volume, ") + 10);
        return {Result::True, kAllMembers,
                {"fill_in_current_disk_io Fail to get text [volume:" + key.substr(0, key.find_first_of(",)")) + "]"}};
    }
    case Op::APIRunnerExec:
        return {Result::True, kAllMembers, {"fill_in_current_lun_io Failed to list LUNs"}};
    case Op::JsonArrayHasString:  // "all" not found: nothing is selected
        return {Result::True, {"time"}, {}};
    default:  // a failure that the road passes over silently
        return kClean;
    }
}


struct FaultSweep : korvtest::PlatformTest {
    void SetUp() override
    {
        PlatformTest::SetUp();
        const size_t count = static_cast<size_t>(korvexample::SpaceDeviceCount(korvexample::SmallAppliance()));
        if (std::string whyNot; !nodes_.Make(count, whyNot)) GTEST_SKIP() << whyNot;
        std::vector<korvexample::SpaceDevice> devices;
        for (size_t i = 0; i < count; ++i) devices.push_back({nodes_.Node(i), nodes_.Name(i)});
        appliance_ = korvexample::MakeAppliance(korvexample::SmallAppliance(), devices);
        Describe();
        korvstandin::SetJournal(true);
        baseline_ = Run();
        for (const std::string &entry : korvstandin::Journal())
            journal_[entry.substr(0, entry.find('('))].push_back(entry);
    }
    void Describe() { korvstandin::Reset(); korvstandin::Host() = appliance_.host; korvtest::ClearLog(); }

    // Runs the road on the described appliance; `Seam` (an allocation
    // count or failure) lives for the library's call only.
    template <typename Seam = korvtest::AllocationCount, typename... SeamArgs>
    Outcome Run(std::optional<Seam> *seam = nullptr, SeamArgs... args)
    {
        Outcome outcome;
        Json::Value result(Json::objectValue);
        try {
            if (seam != nullptr) seam->emplace(args...);
            outcome.result = SNMPParseReplyData(Json::Value(Json::objectValue), appliance_.reply, result)
                                 ? Result::True : Result::False;
        } catch (const std::bad_alloc &) { outcome.result = Result::Threw; }
        if (seam != nullptr) (*seam)->Stop();
        for (const std::string &member : result.getMemberNames())
            outcome.members.insert(member + (result[member].isNull() ? "=null" : ""));
        outcome.value = result;
        for (const korvtest::LogEntry &entry : korvtest::LoggedMessages()) {  // "<unit>:<line> <text>" as "<unit> <text>"
            const size_t colon = entry.text.find(':');
            outcome.messages.push_back(entry.text.substr(0, colon) + entry.text.substr(entry.text.find(' ', colon)));
        }
        return outcome;
    }

    // The journal entry of the `call`-th call of `op` in the run without failures.
    std::string Entry(Op op, int call) { return journal_[korvstandin::OpName(op)].at(call - 1); }

    korvtest::BlockNodes nodes_;
    korvexample::Appliance appliance_;
    Outcome baseline_;
    std::map<std::string, std::vector<std::string>> journal_;
};

TEST_F(FaultSweep, EveryPlatformCallFailedInTurn)
{
    ASSERT_EQ(baseline_, kClean);
    int cases = 0;
    for (int index = 0; index < static_cast<int>(Op::Count_); ++index) {
        const Op op = static_cast<Op>(index);
        for (int call = 1; call <= static_cast<int>(journal_[korvstandin::OpName(op)].size()); ++call, ++cases) {
            SCOPED_TRACE(Entry(op, call) + " failing, call " + std::to_string(call));
            Describe();
            korvstandin::SetFault(op, Fault::Fail, korvstandin::kOutOfMemoryError, korvstandin::Calls::Only(call));
            EXPECT_EQ(Run(), FailedCallOutcome(op, Entry(op, call)));
            EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
        }
    }
    for (Op op : {Op::DiskInfoEnum, Op::KORVEBoxInfoEnum, Op::KORVSpaceInfoEnum, Op::KORVFlashCacheConfigGet}) {
        SCOPED_TRACE(std::string(korvstandin::OpName(op)) + " failing with a list");
        Describe();
        korvstandin::SetFault(op, Fault::FailLeavingList);
        EXPECT_EQ(Run(), FailedCallOutcome(op, Entry(op, 1)));
        EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
    }
    EXPECT_GT(cases, 50);
}

TEST_F(FaultSweep, EveryAllocationFailedInTurn)
{
    Describe();
    std::optional<korvtest::AllocationCount> count;
    EXPECT_EQ(Run(&count), baseline_);
    const long allocations = count->Count();
    const Outcome eboxWrapper = {Result::True, kAllMembers, {"fill_in_current_disk_io Failed to allocate ebox wrapper"}};
    const Outcome deviceBlock = {Result::False, kUpToDisk, {"fill_in_current_disk_io KORVExternalDevEnum error: Out of Memory"}};
    int eboxWrappers = 0, deviceBlocks = 0, platformCalls = 0, thrown = 0;
    for (long nth = 1; nth <= allocations; ++nth) {
        SCOPED_TRACE("allocation " + std::to_string(nth) + " of " + std::to_string(allocations));
        Describe();
        std::optional<korvtest::AllocationFailure> failure;
        const Outcome outcome = Run(&failure, nth);
        ASSERT_TRUE(failure->Failed());
        EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
        const std::vector<korvstandin::CallRef> &platform = korvstandin::OutOfMemoryCalls();
        if (!platform.empty()) {  // inside the platform: that call fails
            ASSERT_EQ(platform.size(), 1u);
            EXPECT_EQ(outcome, FailedCallOutcome(platform[0].op, Entry(platform[0].op, platform[0].call)));
            ++platformCalls;
        } else if (failure->FailedNothrow()) {  // the library's own non-throwing allocations
            EXPECT_TRUE(outcome == eboxWrapper || outcome == deviceBlock) << outcome;
            eboxWrappers += outcome == eboxWrapper;
            deviceBlocks += outcome == deviceBlock;
        } else {
            EXPECT_EQ(outcome.result, Result::Threw) << outcome;
            EXPECT_THAT(outcome.messages, ::testing::IsEmpty());
            ++thrown;
        }
    }
    EXPECT_EQ(eboxWrappers, korvexample::SmallAppliance().expansionUnits);
    EXPECT_EQ(deviceBlocks, 2);  // USB, then eSATA
    EXPECT_GT(platformCalls, 0);
    EXPECT_GT(thrown, 0);
}

void AddTraffic(korvstandin::HostDescription &host, Json::Value &data, const std::string &device)
{
    host.interfaces.push_back({device});
    data["Network"].append(korvtest::ParseJson(R"({"device": ")" + device + R"(", "rx": 1})"));
}

using Host = korvstandin::HostDescription;

// Each malformed answer: what it gives, and (where not null) a check of the result.
const struct { const char *name; void (*arrange)(Host &host, Json::Value &data); Outcome expected;
               void (*check)(const Json::Value &result); } kMalformed[] = {
    {"NameFillsItsFieldWithoutNul",
     [](Host &host, Json::Value &data) { host.unterminatedFields = true; AddTraffic(host, data, "abcdefghijklmnop"); },
     kClean, [](const Json::Value &r) {
         EXPECT_THAT(korvtest::JsonText(r["network"]), ::testing::HasSubstr(R"("abcdefghijklmnop")")); }},
    {"MoreThan32Interfaces", [](Host &host, Json::Value &data) {
         for (int i = 0; i < 40; ++i) AddTraffic(host, data, "x" + std::to_string(100 + i));
         host.interfaceCountClaim = static_cast<int>(host.interfaces.size()); },
     kClean, [](const Json::Value &r) { EXPECT_LE(r["network"].size(), 1u + 32u + 1u + 1u); }},
    {"DeviceCountBeyondItsBlock", [](Host &host, Json::Value &) { host.usb.countClaim = 1000; }, kClean, nullptr},
    {"FlashCacheWithoutSpacePath", [](Host &h, Json::Value &) { h.flashCaches[0].spacePath.reset(); }, kClean, nullptr},
    {"FlashCacheWithoutVolumePath", [](Host &h, Json::Value &) { h.flashCaches[0].volumePath.reset(); }, kClean, nullptr},
    {"NullErrorFile", [](Host &host, Json::Value &) { host.nullErrorFile = true;
         korvstandin::SetFault(Op::KLIBCSzHashSetValue, Fault::Fail, 0x0042, korvstandin::Calls::Only(1)); },
     {Result::True, kAllMembers, {"fill_in_current_disk_io KLIBCSzHashSetValue failed[0x0042 :4]"}}, nullptr},
};

TEST_F(FaultSweep, MalformedPlatformAnswers)
{
    const korvexample::Appliance wellFormed = appliance_;
    for (const auto &c : kMalformed) {
        SCOPED_TRACE(c.name);
        appliance_ = wellFormed;
        Describe();
        c.arrange(korvstandin::Host(), appliance_.reply["data"]);
        const Outcome outcome = Run();
        EXPECT_EQ(outcome, c.expected);
        if (c.check != nullptr) c.check(outcome.value);
        EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
    }
}

}  // namespace
