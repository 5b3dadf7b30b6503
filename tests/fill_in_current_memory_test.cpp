// The memory section: the collector's record passed through, with the
// platform's physical memory size as "memory_size".
#include <syslog.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korv_standin.h"
#include "json_text.h"
#include "platform_test.h"
#include "korvsnmp/fill_in_current_memory.h"
#include "syslog_capture.h"

namespace {

using korvtest::ParseJson;

using ::testing::ElementsAre;

constexpr char kUnit[] = "fill_in_current_memory";

using MemoryTest = korvtest::PlatformTest;

TEST_F(MemoryTest, MemorySizeComesFromThePlatformElseFromTotalReal)
{
    struct Case { unsigned int platform; const char *record; unsigned int expected; } cases[] = {
        {0, R"({"total_real": 2048000})", 2048000},
        {8388608, R"({"total_real": 2048000, "memory_size": 7})", 8388608},
        {16, R"({"total_real": 1, "memory_size": "x", "unknown": {"a": [1, "b"]}, "s": "t"})", 16},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.record);
        korvstandin::Host().physMemSize = c.platform;
        Json::Value memory = ParseJson(R"({"stale": true})");
        ASSERT_TRUE(KORVSNMP::FillInCurrentMemory(ParseJson(c.record), memory));
        Json::Value expected = ParseJson(c.record);
        expected["memory_size"] = c.expected;
        EXPECT_EQ(memory, expected) << memory.toStyledString();
    }
    EXPECT_EQ(korvstandin::CallCount(korvstandin::Op::KLIBSystemPhysMemSizeGet), 3);
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());
}

TEST_F(MemoryTest, RecordWithoutTotalRealIsCopiedAndFails)
{
    korvstandin::Host().physMemSize = 16;
    const Json::Value record = ParseJson(R"({"avail_real": 2, "memory_size": 3})");
    Json::Value memory;
    EXPECT_FALSE(KORVSNMP::FillInCurrentMemory(record, memory));
    EXPECT_EQ(memory, record);
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(korvtest::Logged(LOG_ERR, kUnit, "Memory TotalReal not exist.")));
}

TEST_F(MemoryTest, UnreadableInputFailsAndLeavesTheOutputUntouched)
{
    struct Case { const char *record; const char *message; } cases[] = {
        {R"([{"total_real": 1}])", "Memory record is not an object"},
        {R"({"total_real": "2048"})", R"(Memory: "total_real" is not an unsigned 32-bit number)"},
        {R"({"total_real": -1})", R"(Memory: "total_real" is not an unsigned 32-bit number)"},
        {R"({"total_real": 4294967296})", R"(Memory: "total_real" is not an unsigned 32-bit number)"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.record);
        korvtest::ClearLog();
        Json::Value memory = ParseJson(R"({"earlier": 1})");
        EXPECT_FALSE(KORVSNMP::FillInCurrentMemory(ParseJson(c.record), memory));
        EXPECT_EQ(memory, ParseJson(R"({"earlier": 1})"));
        EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(korvtest::Logged(LOG_ERR, kUnit, c.message)));
    }
}

}  // namespace
