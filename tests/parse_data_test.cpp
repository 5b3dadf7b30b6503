// Assembly of the result: which sections a request selects, the order in
// which they are taken over, and where a missing or malformed section stops.
#include <syslog.h>

#include <set>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "json_text.h"
#include "korv_standin.h"
#include "platform_test.h"
#include "korvsnmp/parse_data.h"
#include "syslog_capture.h"

namespace {

using korvtest::Logged;
using korvtest::LoggedMessages;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

const char kUnit[] = "parse_data";

const auto Parse = korvtest::ParseJson;

// A reply with every section, small enough that each fill-in succeeds.
Json::Value FullReply()
{
    return Parse(R"({"data": {
        "System": [{"user": 3, "idle": 90}],
        "Memory": [{"total_real": 2048}],
        "Network": [{"device": "eth0", "rx": 1, "tx": 2}],
        "DiskIO": [],
        "SpaceIO": [],
        "iSCSI": [],
        "NFS": {"read": 7},
        "time": 1700000000}})");
}

std::set<std::string> Members(const Json::Value &result)
{
    std::set<std::string> names;
    for (const std::string &name : result.getMemberNames())
        names.insert(name);
    return names;
}

const std::set<std::string> kEverySection = {"cpu", "disk", "lun", "memory", "network",
                                             "nfs", "space", "time"};

class ParseDataTest : public korvtest::PlatformTest {
protected:
    void SetUp() override
    {
        PlatformTest::SetUp();
        korvstandin::Host().interfaces = {{"eth0"}};
    }
};

TEST_F(ParseDataTest, EverySectionIsTakenOverWithTime)
{
    Json::Value result;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue), FullReply(), result));

    EXPECT_EQ(Members(result), kEverySection);
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

struct SelectionCase {
    const char *name;
    const char *request;
    const char *dropped;  // a section the reply lacks, or ""
    std::set<std::string> members;
};

class ParseDataSelectionTest : public ParseDataTest,
                               public ::testing::WithParamInterface<SelectionCase> {};

TEST_P(ParseDataSelectionTest, RequestSelectsTheSections)
{
    Json::Value reply = FullReply();
    reply["data"].removeMember(GetParam().dropped);
    Json::Value result;

    EXPECT_TRUE(SNMPParseReplyData(Parse(GetParam().request), reply, result));

    EXPECT_EQ(Members(result), GetParam().members);
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

INSTANTIATE_TEST_SUITE_P(
    Resources, ParseDataSelectionTest,
    ::testing::Values(
        SelectionCase{"NoList", "{}", "", kEverySection},
        SelectionCase{"NullRequest", "null", "", kEverySection},
        SelectionCase{"EmptyList", R"({"resource": []})", "", kEverySection},
        SelectionCase{"All", R"({"resource": ["disk", "all"]})", "", kEverySection},
        SelectionCase{"MemoryOnlyNeedsNoCpu", R"({"resource": ["memory"]})", "System",
                      {"memory", "time"}},
        SelectionCase{"TwoInAnyOrder", R"({"resource": ["nfs", "cpu"]})", "", {"cpu", "nfs", "time"}},
        SelectionCase{"UnknownName", R"({"resource": ["bogus"]})", "", {"time"}},
        SelectionCase{"ListIsAString", R"({"resource": "cpu"})", "", kEverySection},
        SelectionCase{"ListIsAnObject", R"({"resource": {"a": "cpu"}})", "", {"time"}}),
    [](const auto &info) { return std::string(info.param.name); });

struct FailureCase {
    const char *name;
    const char *request;
    const char *member;    // the reply's data member to replace (or drop)
    const char *value;     // its new value; "" drops it
    const char *message;   // "" when the section's fill-in function fails silently
    std::set<std::string> members;
};

class ParseDataFailureTest : public ParseDataTest,
                             public ::testing::WithParamInterface<FailureCase> {};

TEST_P(ParseDataFailureTest, FirstBadSectionEndsTheAssembly)
{
    Json::Value reply = FullReply();
    if (*GetParam().value == '\0')
        reply["data"].removeMember(GetParam().member);
    else
        reply["data"][GetParam().member] = Parse(GetParam().value);
    Json::Value result(Json::objectValue);
    result["kept"] = true;

    EXPECT_FALSE(SNMPParseReplyData(Parse(GetParam().request), reply, result));

    std::set<std::string> expected = GetParam().members;
    expected.insert("kept");  // the result is never cleared
    EXPECT_EQ(Members(result), expected);
    if (*GetParam().message == '\0')
        EXPECT_THAT(LoggedMessages(), IsEmpty());
    else
        EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, GetParam().message)));
}

INSTANTIATE_TEST_SUITE_P(
    Sections, ParseDataFailureTest,
    ::testing::Values(
        FailureCase{"NfsMissing", "{}", "NFS", "", "Failed to get NFS data",
                    {"cpu", "memory", "network", "disk", "space", "lun"}},
        FailureCase{"NfsMissingAskedBeforeCpu", R"({"resource": ["nfs", "cpu"]})", "NFS", "",
                    "Failed to get NFS data", {"cpu"}},
        FailureCase{"TwoCpuRecords", "{}", "System", "[{}, {}]", "Failed to get CPU data", {}},
        FailureCase{"NoMemoryRecord", "{}", "Memory", "[]", "Failed to get Memory data", {"cpu"}},
        FailureCase{"EmptyNetwork", "{}", "Network", "[]", "Failed to get Network data",
                    {"cpu", "memory"}},
        FailureCase{"NetworkObject", "{}", "Network", R"({"device": "eth0"})",
                    "Failed to get Network data", {"cpu", "memory"}},
        // The fill-in's member is created, null, before the call that fails.
        FailureCase{"DiskIONotAnArray", "{}", "DiskIO", "\"x\"", "", {"cpu", "memory", "network", "disk"}},
        FailureCase{"SpaceIOMissing", "{}", "SpaceIO", "", "Failed to get SpaceIO data",
                    {"cpu", "memory", "network", "disk"}},
        FailureCase{"ISCSIMissing", R"({"resource": ["lun"]})", "iSCSI", "",
                    "Failed to get ISCSI data", {}},
        FailureCase{"NoTime", "{}", "time", "", "Failed to get time data",
                    {"cpu", "memory", "network", "disk", "space", "lun", "nfs"}},
        FailureCase{"NoTimeNothingAsked", R"({"resource": ["bogus"]})", "time", "",
                    "Failed to get time data", {}}),
    [](const auto &info) { return std::string(info.param.name); });

TEST_F(ParseDataTest, ReplyWithoutDataFailsAtTheFirstSelectedSection)
{
    Json::Value result;
    EXPECT_FALSE(SNMPParseReplyData(Parse(R"({"resource": ["disk", "space"]})"),
                                    Parse(R"({"error": 1})"), result));
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "Failed to get DiskIO data")));
}

TEST_F(ParseDataTest, ValuesOfTheWrongTypeFailWithAMessage)
{
    const Json::Value array(Json::arrayValue);
    Json::Value dataArray = FullReply();
    dataArray["data"] = array;
    struct {
        Json::Value request, reply, result;
    } cases[] = {
        {array, FullReply(), Json::Value()},
        {Json::Value(), Json::Value("reply"), Json::Value()},
        {Json::Value(), dataArray, Json::Value()},
        {Json::Value(), FullReply(), Json::Value(7)},
    };
    for (auto &bad : cases) {
        korvtest::ClearLog();
        EXPECT_FALSE(SNMPParseReplyData(bad.request, bad.reply, bad.result));
        ASSERT_EQ(LoggedMessages().size(), 1u);
        EXPECT_EQ(LoggedMessages()[0].priority, LOG_ERR);
    }
}

}  // namespace
