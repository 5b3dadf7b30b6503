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

using korvtest::LoggedMessages;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
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
    EXPECT_EQ(MembersOf(result), kEverySection);
    EXPECT_EQ(result["cpu"], Parse(R"({"user": 3, "idle": 90})"));
    EXPECT_EQ(result["memory"]["memory_size"].asUInt(), 2048u);
    EXPECT_EQ(korvtest::JsonText(result["network"][0]),
              korvtest::Canonical(R"({"device": "total", "rx": 1, "tx": 2})"));
    EXPECT_EQ(result["disk"]["total"]["device"].asString(), "total");
    EXPECT_EQ(result["space"]["volume"], Json::Value(Json::arrayValue));
    EXPECT_EQ(result["lun"], Json::Value(Json::arrayValue));
    EXPECT_EQ(result["nfs"], Parse(R"({"read": 7})"));
    EXPECT_EQ(result["time"].asUInt(), 1700000000u);
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

TEST_F(ParseDataTest, RequestSelectsTheSections)
{
    const struct {
        const char *request;
        const char *dropped;  // a section the reply lacks, or ""
        Members members;
    } cases[] = {
        {"{}", "", kEverySection},
        {"null", "", kEverySection},
        {R"({"resource": []})", "", kEverySection},
        {R"({"resource": ["disk", "all"]})", "", kEverySection},
        {R"({"resource": ["memory"]})", "System", {"memory", "time"}},  // memory needs no cpu
        {R"({"resource": ["nfs", "cpu"]})", "", {"cpu", "nfs", "time"}},
        {R"({"resource": ["bogus"]})", "", {"time"}},
        {R"({"resource": "cpu"})", "", kEverySection},
        {R"({"resource": {"a": "cpu"}})", "", {"time"}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.request);
        Json::Value reply = FullReply(), result;
        reply["data"].removeMember(c.dropped);
        EXPECT_TRUE(SNMPParseReplyData(Parse(c.request), reply, result));
        EXPECT_EQ(MembersOf(result), c.members);
    }
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

// The result is never cleared; a fill-in's member is created, null, before
// the call that fails.
TEST_F(ParseDataTest, FirstBadSectionEndsTheAssembly)
{
    const struct {
        const char *request;
        const char *member;   // the reply's data member to replace (or drop)
        const char *value;    // its new value; "" drops it
        const char *message;  // "" when the section's fill-in fails silently
        Members members;
    } cases[] = {
        {"{}", "NFS", "", "Failed to get NFS data", {"cpu", "memory", "network", "disk", "space", "lun"}},
        {R"({"resource": ["nfs", "cpu"]})", "NFS", "", "Failed to get NFS data", {"cpu"}},
        {"{}", "System", "[{}, {}]", "Failed to get CPU data", {}},
        {"{}", "Memory", "[]", "Failed to get Memory data", {"cpu"}},
        {"{}", "Network", "[]", "Failed to get Network data", {"cpu", "memory"}},
        {"{}", "Network", R"({"device": "eth0"})", "Failed to get Network data", {"cpu", "memory"}},
        {"{}", "DiskIO", "\"x\"", "", {"cpu", "memory", "network", "disk"}},
        {"{}", "SpaceIO", "", "Failed to get SpaceIO data", {"cpu", "memory", "network", "disk"}},
        {R"({"resource": ["lun"]})", "iSCSI", "", "Failed to get ISCSI data", {}},
        {"{}", "time", "", "Failed to get time data", {"cpu", "memory", "network", "disk", "space", "lun", "nfs"}},
        {R"({"resource": ["bogus"]})", "time", "", "Failed to get time data", {}},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(std::string(c.member) + " " + c.value + " asked by " + c.request);
        korvtest::ClearLog();
        Json::Value reply = FullReply();
        if (*c.value == '\0')
            reply["data"].removeMember(c.member);
        else
            reply["data"][c.member] = Parse(c.value);
        Json::Value result = Parse(R"({"kept": true})");
        EXPECT_FALSE(SNMPParseReplyData(Parse(c.request), reply, result));
        Members expected = c.members;
        expected.insert("kept");
        EXPECT_EQ(MembersOf(result), expected);
        if (*c.message == '\0')
            EXPECT_THAT(LoggedMessages(), IsEmpty());
        else
            EXPECT_THAT(LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, "parse_data", c.message)));
    }
}

TEST_F(ParseDataTest, ValuesOfTheWrongTypeFailWithAMessage)
{
    const Json::Value array(Json::arrayValue);
    Json::Value dataArray = FullReply();
    dataArray["data"] = array;
    const struct {
        Json::Value request, reply, result;
        const char *message;
    } cases[] = {
        {array, FullReply(), Json::Value(), "Request, reply and result must be JSON objects (types 6, 7, 0)"},
        {Json::Value(), Json::Value("reply"), Json::Value(),
         "Request, reply and result must be JSON objects (types 0, 4, 0)"},
        {Json::Value(), dataArray, Json::Value(), "Reply data is not a JSON object (type 6)"},
        {Json::Value(), FullReply(), Json::Value(7),
         "Request, reply and result must be JSON objects (types 0, 7, 1)"},
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
