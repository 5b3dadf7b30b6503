// Assembly of the result: which sections a request selects, the order in
// which they are taken over, and where a missing or malformed section stops.
#include <syslog.h>

#include <set>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/parse_data.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using korvtest::LoggedMessages, ::testing::ElementsAre, ::testing::IsEmpty;
using Members = std::set<std::string>;

const auto Parse = korvtest::ParseJson;

// A reply with every section, small enough that each fill-in succeeds on
// the host that this describes (one interface, eth0).
Json::Value FullReply()
{
    korvstandin::Host().interfaces = {{"eth0"}};
    return Parse(R"({"data": {"System": [{"user": 3, "idle": 90}], "Memory": [{"total_real": 2048}],
        "Network": [{"device": "eth0", "rx": 1, "tx": 2}], "DiskIO": [], "SpaceIO": [], "iSCSI": [],
        "NFS": {"read": 7}, "time": 1700000000}})");
}

Members MembersOf(const Json::Value &result)
{
    const std::vector<std::string> names = result.getMemberNames();
    return {names.begin(), names.end()};
}

const Members kEverySection = {"cpu", "disk", "lun", "memory", "network", "nfs", "space", "time"};

using ParseDataTest = korvtest::PlatformTest;

TEST_F(ParseDataTest, EverySectionIsTakenOverWithTime)
{
    Json::Value result;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue), FullReply(), result));
    EXPECT_EQ(korvtest::JsonText(result), korvtest::Canonical(R"({"cpu": {"user": 3, "idle": 90},
        "memory": {"total_real": 2048, "memory_size": 2048},
        "network": [{"device": "total", "rx": 1, "tx": 2}, {"device": "eth0", "rx": 1, "tx": 2}],
        "disk": {"disk": [], "total": {"device": "total", "utilization": 0, "read_access": 0, "read_byte": 0,
                                       "write_access": 0, "write_byte": 0}},
        "space": {"volume": []}, "lun": [], "nfs": {"read": 7}, "time": 1700000000})"));
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

// A request selects sections; the first bad one ends the assembly. The
// result is never cleared, and a fill-in's member is created, null, before
// the call that fails.
TEST_F(ParseDataTest, RequestSelectsTheSectionsAndTheFirstBadOneEndsTheAssembly)
{
    // `member`: the reply's data member to replace with `value` ("" drops it);
    // `message`: "" when nothing is logged.
    const struct { const char *request, *member, *value, *message; bool succeeds; Members members; } cases[] = {
        {"{}", "", "", "", true, kEverySection}, {"null", "", "", "", true, kEverySection},
        {R"({"resource": []})", "", "", "", true, kEverySection},
        {R"({"resource": ["disk", "all"]})", "", "", "", true, kEverySection},
        {R"({"resource": ["memory"]})", "System", "", "", true, {"memory", "time"}},  // memory needs no cpu
        {R"({"resource": ["nfs", "cpu"]})", "", "", "", true, {"cpu", "nfs", "time"}},
        {R"({"resource": ["bogus"]})", "", "", "", true, {"time"}},
        {R"({"resource": "cpu"})", "", "", "", true, kEverySection},
        {R"({"resource": {"a": "cpu"}})", "", "", "", true, {"time"}},
        {"{}", "NFS", "", "Failed to get NFS data", false, {"cpu", "memory", "network", "disk", "space", "lun"}},
        {R"({"resource": ["nfs", "cpu"]})", "NFS", "", "Failed to get NFS data", false, {"cpu"}},
        {"{}", "System", "[{}, {}]", "Failed to get CPU data", false, {}},
        {"{}", "Memory", "[]", "Failed to get Memory data", false, {"cpu"}},
        {"{}", "Network", "[]", "Failed to get Network data", false, {"cpu", "memory"}},
        {"{}", "Network", R"({"device": "eth0"})", "Failed to get Network data", false, {"cpu", "memory"}},
        {"{}", "DiskIO", "\"x\"", "", false, {"cpu", "memory", "network", "disk"}},
        {"{}", "SpaceIO", "", "Failed to get SpaceIO data", false, {"cpu", "memory", "network", "disk"}},
        {R"({"resource": ["lun"]})", "iSCSI", "", "Failed to get ISCSI data", false, {}},
        {"{}", "time", "", "Failed to get time data", false, {"cpu", "memory", "network", "disk", "space", "lun", "nfs"}},
        {R"({"resource": ["bogus"]})", "time", "", "Failed to get time data", false, {}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(std::string(c.member) + " " + c.value + " asked by " + c.request);
        korvtest::ClearLog();
        Json::Value reply = FullReply();
        if (*c.value == '\0') reply["data"].removeMember(c.member);
        else reply["data"][c.member] = Parse(c.value);
        Json::Value result = Parse(R"({"kept": true})");
        EXPECT_EQ(SNMPParseReplyData(Parse(c.request), reply, result), c.succeeds);
        EXPECT_TRUE(result.removeMember("kept", nullptr));
        EXPECT_EQ(MembersOf(result), c.members);
        if (*c.message == '\0') EXPECT_THAT(LoggedMessages(), IsEmpty());
        else EXPECT_THAT(LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, "parse_data", c.message)));
    }
}

TEST_F(ParseDataTest, ValuesOfTheWrongTypeFailWithAMessage)
{
    const Json::Value array(Json::arrayValue);
    const auto types = [](std::string t) {
        return "Request, reply and result must be JSON objects (types " + t + ")"; };
    Json::Value dataArray = FullReply();
    dataArray["data"] = array;
    const struct { Json::Value request, reply, result; std::string message; } cases[] = {
        {array, FullReply(), Json::Value(), types("6, 7, 0")},
        {Json::Value(), Json::Value("reply"), Json::Value(), types("0, 4, 0")},
        {Json::Value(), dataArray, Json::Value(), "Reply data is not a JSON object (type 6)"},
        {Json::Value(), FullReply(), Json::Value(7), types("0, 7, 1")},
        {Parse(R"({"resource": ["disk", "space"]})"), Parse(R"({"error": 1})"), Json::Value(),
         "Failed to get DiskIO data"},
    };
    for (const auto &bad : cases) {
        korvtest::ClearLog();
        Json::Value result = bad.result;
        EXPECT_FALSE(SNMPParseReplyData(bad.request, bad.reply, result));
        EXPECT_THAT(LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, "parse_data", bad.message)));
    }
}

}  // namespace
