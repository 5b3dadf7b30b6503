// The LUN names held over a long LUN list: the names by UUID must survive
// the list's growth, duplicates included (the later LUN's name counts).
#include <string>

#include <gtest/gtest.h>

#include "korv_standin.h"
#include "korvsnmp/fill_in_current_lun_io.h"

namespace {

TEST(LunNameMapTest, EveryRecordOfALongListGetsItsOwnName)
{
    constexpr int kLuns = 700;  // many times what any container grows by at once
    korvstandin::Reset();
    auto &luns = korvstandin::Host().luns;
    for (int i = 0; i < kLuns; ++i)
        luns.push_back({Json::Value("uuid-" + std::to_string(i)), Json::Value("early-" + std::to_string(i))});
    for (int i = 0; i < kLuns; i += 7)  // later duplicates rename every seventh LUN
        luns.push_back({Json::Value("uuid-" + std::to_string(i)), Json::Value("late-" + std::to_string(i))});

    Json::Value records(Json::arrayValue);
    for (int i = kLuns; i-- > 0;)  // the collector's order differs from the list's
        records.append(Json::Value(Json::objectValue))["device"] = "uuid-" + std::to_string(i);
    records.append(Json::Value(Json::objectValue))["device"] = "uuid-unlisted";

    ASSERT_TRUE(KORVSNMP::FillInCurrentLunIO(records));
    for (int i = 0; i < kLuns; ++i) {
        const Json::Value &record = records[kLuns - 1 - i];
        const std::string expected = (i % 7 == 0 ? "late-" : "early-") + std::to_string(i);
        ASSERT_EQ(record["lun_name"].asString(), expected) << "record of uuid-" << i;
        ASSERT_EQ(record["uuid"].asString(), "uuid-" + std::to_string(i));
        ASSERT_FALSE(record.isMember("device"));
    }
    EXPECT_EQ(records[kLuns]["lun_name"].asString(), "uuid-unlisted");
}

// An array with a hole (index 1 never set): the records on either side get
// their own names, and the hole stays as it was.
TEST(LunNameMapTest, ARecordAfterAHoleGetsItsOwnName)
{
    korvstandin::Reset();
    korvstandin::Host().luns = {{Json::Value("u-0"), Json::Value("zero")},
                                {Json::Value("u-2"), Json::Value("two")}};
    Json::Value records(Json::arrayValue);
    records[0]["device"] = "u-0";
    records[2]["device"] = "u-2";

    ASSERT_TRUE(KORVSNMP::FillInCurrentLunIO(records));
    EXPECT_EQ(records[0]["lun_name"].asString(), "zero");
    EXPECT_EQ(records[2]["lun_name"].asString(), "two");
    EXPECT_EQ(records[2]["uuid"].asString(), "u-2");
    EXPECT_TRUE(std::as_const(records)[1].isNull());
}

}  // namespace
