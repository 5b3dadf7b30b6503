// The moving SNMPParseReplyData against the copying one: for every reply of
// the fuzzing corpus and several requests, the same result, return value and
// messages.
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <json/reader.h>

#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/parse_data.h"
#include "syslog_capture.h"

namespace {

using korvstandin::NetRole;

// A host that names some of each section's devices, so that records are
// kept, renamed and dropped.
void DescribeHost()
{
    using namespace korvstandin;
    Reset();
    HostDescription &host = Host();
    host.physMemSize = 8388608;
    host.supportsEBox = true;
    host.disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                  {2, DISK_CONTAINER_EBOX, 0, "/dev/sdb"},
                  {12, DISK_CONTAINER_SSD_CACHE, 1, "/dev/nvme0n1"}};
    host.expansionUnits = {{1, {"/dev/sdb"}, std::string("Korvel-X5"), true}};
    host.usb.devices = {{"sdu", "USB Disk 1"}};
    host.esata.devices = {{"sde", "eSATA Disk 1"}};
    host.interfaces = {{"eth0"}, {"eth1"}, {"eth0.5", NetRole::Vlan, "eth0", "eth0.5"},
                       {"bond0", NetRole::Aggregation, "", "", {"eth0", "eth1"}}};
    host.pppoeInterface = "ppp0";
    host.spaces = {{"/dev/null", "volume1"}};
    host.luns = {{Json::Value("uuid-1"), Json::Value("LUN-1")}};
    host.files[kStringsFilePath]["volume"] = {{"volume_disk", "Disk"},
                                              {"volume_expansion", "Expansion Unit"},
                                              {"dedicated_ssd_cache", "SSD Cache"}};
}

struct Outcome {
    bool returned;
    Json::Value result;
    std::vector<korvtest::LogEntry> messages;
};

Outcome Assemble(const Json::Value &request, const Json::Value &reply, bool moving)
{
    korvtest::ClearLog();
    Outcome outcome{false, Json::Value(Json::objectValue), {}};
    Json::Value taken = reply;
    outcome.returned = moving ? SNMPParseReplyData(request, std::move(taken), outcome.result)
                              : SNMPParseReplyData(request, taken, outcome.result);
    outcome.messages = korvtest::LoggedMessages();
    return outcome;
}

// Runs both forms on `reply` for each request; `label` names the reply.
void ExpectSameOutcome(const Json::Value &reply, const std::string &label)
{
    const char *const kRequests[] = {
        R"({"resource": ["all"]})", R"({})", R"({"resource": ["nfs", "cpu"]})",
        R"({"resource": ["disk", "space", "lun"]})", R"({"resource": "all"})", R"([])"};
    for (const char *requestText : kRequests) {
        const Json::Value request = korvtest::ParseJson(requestText);
        const Outcome copied = Assemble(request, reply, false);
        const Outcome moved = Assemble(request, reply, true);
        SCOPED_TRACE(label + " with request " + requestText);
        EXPECT_EQ(moved.returned, copied.returned);
        EXPECT_EQ(korvtest::JsonText(moved.result), korvtest::JsonText(copied.result));
        EXPECT_TRUE(moved.result == copied.result) << "member types differ";
        ASSERT_EQ(moved.messages.size(), copied.messages.size());
        for (size_t i = 0; i < moved.messages.size(); ++i) {
            EXPECT_EQ(moved.messages[i].priority, copied.messages[i].priority);
            EXPECT_EQ(moved.messages[i].text, copied.messages[i].text);
        }
    }
}

std::string ReadFile(const std::filesystem::path &path)
{
    std::ifstream in(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

TEST(ReplyOverloadsTest, MovingAndCopyingAgreeOnTheFuzzingCorpus)
{
    DescribeHost();
    int parsed = 0;
    for (const auto &entry : std::filesystem::directory_iterator(KORVSNMP_FUZZ_CORPUS)) {
        const std::string text = ReadFile(entry.path());
        Json::Value reply;
        try {
            if (!Json::Reader().parse(text, reply, true))
                continue;
        } catch (const Json::Exception &) {
            continue;  // nesting too deep for the reader
        }
        ++parsed;
        ExpectSameOutcome(reply, entry.path().filename().string());
    }
    // The corpus must still reach the assembly, or this compares nothing.
    EXPECT_GE(parsed, 50);
    EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
}

}  // namespace
