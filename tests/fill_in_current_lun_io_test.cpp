// The iSCSI LUN section: records renamed from "device" to "uuid" and
// "lun_name", with names from the web API's LUN list. A failing list call
// is also covered by the fault sweep.
#include <syslog.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/writer.h>  // prints a Json::Value in a failure

#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/fill_in_current_lun_io.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using korvstandin::LunAnswer, korvstandin::Op, korvtest::ParseJson, ::testing::ElementsAre;

constexpr char kUnit[] = "fill_in_current_lun_io";

// Runs the rewrite on `lunIO` and expects it to succeed with `expected`.
void ExpectRewritten(const char *lunIO, const char *expected)
{
    Json::Value records = ParseJson(lunIO);
    EXPECT_TRUE(KORVSNMP::FillInCurrentLunIO(records));
    EXPECT_EQ(records, ParseJson(expected));
}

using LunIOTest = korvtest::PlatformTest;

TEST_F(LunIOTest, RecordsAreNamedFromTheLunList)
{
    korvstandin::SetJournal(true);
    korvstandin::Host().luns = {{"u-1", "first"}, {"u-2", "old"},         {"u-2", "second"},        {"u-3", 7},
                                {5, "five"},      {"u-4", Json::Value()}, {Json::Value(), "orphan"}};
    ExpectRewritten(R"([{"device": "u-2", "read": 1, "uuid": "stale", "lun_name": "stale"},
                        {"device": "u-1", "write": 2}, {"device": "u-3"}, {"device": "5"}, {"device": "u-4"},
                        {"device": "unknown"}])",
                    R"([{"uuid": "u-2", "lun_name": "second", "read": 1}, {"uuid": "u-1", "lun_name": "first", "write": 2},
                        {"uuid": "u-3", "lun_name": "u-3"}, {"uuid": "5", "lun_name": "5"},
                        {"uuid": "u-4", "lun_name": "u-4"}, {"uuid": "unknown", "lun_name": "unknown"}])");
    EXPECT_THAT(korvstandin::Journal(), ElementsAre("KORV::APIRunner::Exec(KORV.Core.ISCSI.LUN, 1, list, null, admin)"));
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());
}

TEST_F(LunIOTest, RecordWithoutDeviceGetsTheEmptyText)
{
    ExpectRewritten(R"([{"read": 1}, null, {"device": null}])",
                    R"([{"uuid": "", "lun_name": "", "read": 1}, {"uuid": "", "lun_name": ""}, {"uuid": "", "lun_name": ""}])");
    korvstandin::Host().luns = {{"", "nameless"}};
    ExpectRewritten(R"([{"read": 1}])", R"([{"uuid": "", "lun_name": "nameless", "read": 1}])");
}

TEST_F(LunIOTest, UnusableAnswerLeavesTheUuidAsName)
{
    const struct { LunAnswer answer; const char *message; } cases[] = {
        {LunAnswer::Unsuccessful, "Failed to list LUNs"},    {LunAnswer::SuccessNotBoolean, "Failed to list LUNs"},
        {LunAnswer::WithoutData, "LUNs json data not found"}, {LunAnswer::WithoutLuns, "LUNs json data not found"},
        {LunAnswer::LunsNotArray, "LUNs json data not found"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.message + std::string(" for answer ") + std::to_string(static_cast<int>(c.answer)));
        korvtest::FreshPlatform();
        korvstandin::Host().luns = {{"u-1", "first"}};
        korvstandin::Host().lunAnswer = c.answer;
        ExpectRewritten(R"([{"device": "u-1", "read": 3}])", R"([{"uuid": "u-1", "lun_name": "u-1", "read": 3}])");
        EXPECT_EQ(korvstandin::CallCount(Op::APIRunnerExec), 1);
        EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, kUnit, c.message)));
    }
}

TEST_F(LunIOTest, UnreadableInputFailsUntouchedAndEmptyInputAsksNothing)
{
    const struct { const char *lunIO; const char *message; } cases[] = {
        {R"({"device": "u-1"})", "LunIO is not array."},
        {R"([{"device": "u-1"}, "u-2"])", "LunIO element 1 is not an object"},
        {R"([{"device": "u-1"}, {"device": 7}])", R"(LunIO element 1: "device" is not a string)"},
        {R"([{"device": {"uuid": "u-1"}}])", R"(LunIO element 0: "device" is not a string)"},
        {R"([{"device": null}, {"device": false}])", R"(LunIO element 1: "device" is not a string)"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.lunIO);
        korvtest::ClearLog();
        Json::Value lunIO = ParseJson(c.lunIO);
        EXPECT_FALSE(KORVSNMP::FillInCurrentLunIO(lunIO));
        EXPECT_EQ(lunIO, ParseJson(c.lunIO));
        EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, kUnit, c.message)));
    }
    korvtest::FreshPlatform();
    ExpectRewritten("[]", "[]");
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());
    EXPECT_EQ(korvstandin::CallCount(Op::APIRunnerExec), 0);
}

}  // namespace
