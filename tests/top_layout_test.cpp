// The live view's text: the columns it takes from the catalogue, its rows,
// their order, what fits a width, the bar, the keys and the whole screen.
#include <cmath>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "json_text.h"
#include "top_layout.h"

namespace {

using namespace korvstat::top;
using ::testing::ElementsAre;
using ::testing::ElementsAreArray;
using ::testing::HasSubstr;
using ::testing::StartsWith;

std::vector<std::string> Titles(View view)
{
    std::vector<std::string> titles;
    for (const auto *column : ColumnsOf(view))
        titles.push_back(column->title);
    return titles;
}

// The titles of the columns that Fit() keeps, "bar" for the bar.
std::vector<std::string> Kept(View view, const std::vector<Row> &rows, size_t width)
{
    const auto columns = ColumnsOf(view);
    std::vector<std::string> kept;
    for (const Placed &placed : Fit(columns, rows, width))
        kept.push_back(placed.column == kBar ? "bar" : columns[placed.column]->title);
    return kept;
}

// Disks as the library names them: `utilization` and `readByte` per disk.
Json::Value Disks(const std::vector<std::tuple<std::string, double, double>> &disks)
{
    Json::Value result(Json::objectValue);
    result["disk"]["total"]["utilization"] = 99;
    for (const auto &[name, utilization, readByte] : disks) {
        Json::Value disk(Json::objectValue);
        disk["device"] = "sd" + std::to_string(result["disk"]["disk"].size() + 1);
        disk["display_name"] = name;
        disk["type"] = "internal";
        disk["utilization"] = utilization;
        disk["read_byte"] = readByte;
        disk["write_byte"] = 0;
        disk["read_access"] = 1;
        disk["write_access"] = 2;
        result["disk"]["disk"].append(disk);
    }
    return result;
}

std::vector<std::string> FirstCells(std::vector<Row> rows, View view, int sortKey, size_t cell)
{
    SortRows(rows, ColumnsOf(view), sortKey);
    std::vector<std::string> cells;
    for (const Row &row : rows)
        cells.push_back(row.cells[cell]);
    return cells;
}

TEST(TopLayout, ColumnsAreTheCataloguesNamesSharesAndRatesWithTheirShortTitles)
{
    EXPECT_THAT(Titles(View::Disks), ElementsAre("device", "name", "type", "%util", "r/s", "rkB/s", "w/s", "wkB/s"));
    EXPECT_THAT(Titles(View::Interfaces), ElementsAre("device", "rxkB/s", "txkB/s"));
    EXPECT_THAT(Titles(View::Volumes), ElementsAre("device", "name", "%util", "r/s", "rkB/s", "w/s", "wkB/s"));
    EXPECT_THAT(Titles(View::Luns), ElementsAre("uuid", "name", "%util", "r/s", "rkB/s", "w/s", "wkB/s"));
    EXPECT_THAT(Resources(), ElementsAre("disk", "network", "space", "lun"));
}

TEST(TopLayout, RowsLeaveTotalsOutShowKilobytesAndSurviveAnyShape)
{
    const Json::Value result = korvtest::ParseJson(R"({"network": [
        {"device": "total", "rx": 1, "tx": 1}, {"device": "eth0", "rx": 1536, "tx": 2097152000},
        {"device": "e\u001b[2Jvil\u00e9", "rx": "fast", "tx": true}, 7]})");
    const std::vector<Row> rows = RowsOf(result, View::Interfaces);
    ASSERT_EQ(rows.size(), 3u);
    EXPECT_THAT(rows[0].cells, ElementsAre("eth0", "1.5", "2048000"));
    EXPECT_THAT(rows[1].cells, ElementsAre("e?[2Jvil\u00e9", "", ""));
    EXPECT_TRUE(std::isnan(rows[1].values[1]));
    EXPECT_THAT(rows[2].cells, ElementsAre("", "", ""));

    const Json::Value shapes[] = {korvtest::ParseJson("[]"), korvtest::ParseJson(R"({"disk": []})"),
                                  korvtest::ParseJson(R"({"disk": {"disk": {"a": 1}}})"), Json::Value("x")};
    for (const Json::Value &shape : shapes)
        for (View view : kViews)
            EXPECT_TRUE(RowsOf(shape, view).empty()) << korvtest::JsonText(shape);
}

TEST(TopLayout, BusiestFirstThenBytesAndOtherKeys)
{
    const std::vector<Row> rows = RowsOf(Disks({{"a", 10, 5}, {"b", 90, 1}, {"c", 10, 9}, {"d", NAN, 99},
                                               {"e", 90, 1}}), View::Disks);
    // Equal shares: the bytes decide, then the appliance's order stays.
    EXPECT_THAT(FirstCells(rows, View::Disks, kBusiest, 1), ElementsAre("b", "e", "c", "a", "d"));
    // By name; by read bytes, highest first.
    EXPECT_THAT(FirstCells(rows, View::Disks, 1, 1), ElementsAre("a", "b", "c", "d", "e"));
    EXPECT_THAT(FirstCells(rows, View::Disks, 5, 1), ElementsAre("d", "c", "a", "b", "e"));
    // Interfaces have no share: the busiest move the most bytes.
    const Json::Value network = korvtest::ParseJson(R"({"network": [{"device": "eth0", "rx": 10, "tx": 10},
        {"device": "eth1", "rx": 5, "tx": 50}, {"device": "eth2", "rx": 30}]})");
    EXPECT_THAT(FirstCells(RowsOf(network, View::Interfaces), View::Interfaces, kBusiest, 0),
                ElementsAre("eth1", "eth2", "eth0"));
}

TEST(TopLayout, ColumnsDropByPriorityAndTheBarTakesWhatIsLeft)
{
    const std::vector<Row> rows =
        RowsOf(Disks({{"Expansion Unit 1 Disk 12", 50, 123456789}, {"Disk 1", 3, 0}}), View::Disks);
    const std::pair<size_t, std::vector<std::string>> widths[] = {
        {200, {"device", "name", "type", "%util", "bar", "r/s", "rkB/s", "w/s", "wkB/s"}},
        {80, {"device", "name", "type", "%util", "bar", "r/s", "rkB/s", "w/s", "wkB/s"}},
        {60, {"name", "%util", "bar", "r/s", "rkB/s", "w/s", "wkB/s"}},
        {45, {"name", "%util", "bar", "r/s", "rkB/s", "wkB/s"}},
        {28, {"name", "%util", "bar"}},
        {18, {"name", "%util"}},
        {10, {"name"}},
        {0, {"name"}}};
    for (const auto &[width, kept] : widths)
        EXPECT_THAT(Kept(View::Disks, rows, width), ElementsAreArray(kept)) << width;
    // At 200 the bar is as wide as it gets; at 45 the name has been shortened.
    EXPECT_EQ(Fit(ColumnsOf(View::Disks), rows, 200)[4].width, kBarMax);
    EXPECT_EQ(Fit(ColumnsOf(View::Disks), rows, 45)[0].width, kNameFloor);
}

TEST(TopLayout, NoScreenLineIsWiderThanTheTerminal)
{
    Json::Value result = Disks({{"Expansion Unit 1 Disk 12", 50, 123456789}, {"Disk 1", 3, 0}});
    result["disk"]["disk"][1]["display_name"] = std::string(300, 'x') + "\u00e9\u00e9";
    for (View view : kViews)
        for (size_t width = 0; width <= 260; ++width) {
            State state{view, kBusiest, 0};
            for (const std::string &line : Screen(result, state, "a long status message", width, 24))
                ASSERT_LE(Width(line), width) << line;
        }
}

TEST(TopLayout, BarsShortenedTextAndWidths)
{
    const std::tuple<double, size_t, std::string> bars[] = {
        {0, 10, "[        ]"}, {50, 10, "[####    ]"}, {100, 10, "[########]"}, {250, 6, "[####]"},
        {-3, 6, "[    ]"},     {NAN, 5, "[   ]"},      {6, 10, "[        ]"}, {7, 10, "[#       ]"},
        {50, 3, "[#]"},        {99, 2, ""}};
    for (const auto &[percent, width, text] : bars)
        EXPECT_EQ(Bar(percent, width), text) << percent << " " << width;
    EXPECT_EQ(Shorten("Disk 12", 7), "Disk 12");
    EXPECT_EQ(Shorten("Disk 12", 6), "Disk +");
    EXPECT_EQ(Shorten("\u00e9t\u00e9 2", 3), "\u00e9t+");
    EXPECT_EQ(Shorten("abc", 0), "");
    EXPECT_EQ(Width("\u00e9t\u00e9"), 3u);
}

TEST(TopLayout, KeysSwitchSectionsCycleTheSortKeyAndScrollWithinBounds)
{
    State state;
    EXPECT_TRUE(Apply(Command::SortLeft, 20, state));
    EXPECT_EQ(state.sortKey, static_cast<int>(ColumnsOf(View::Disks).size()) - 1);
    EXPECT_TRUE(Apply(Command::SortRight, 20, state));
    EXPECT_EQ(state.sortKey, kBusiest);
    EXPECT_TRUE(Apply(Command::SortRight, 20, state));
    EXPECT_EQ(state.sortKey, 0);
    EXPECT_TRUE(Apply(Command::PageDown, 20, state));
    EXPECT_TRUE(Apply(Command::LineUp, 20, state));
    EXPECT_EQ(state.firstRow, 19u);
    EXPECT_TRUE(Apply(Command::PageUp, 20, state));
    EXPECT_TRUE(Apply(Command::LineUp, 20, state));
    EXPECT_EQ(state.firstRow, 0u);
    EXPECT_TRUE(Apply(Command::PreviousView, 20, state));
    EXPECT_EQ(state.view, View::Luns);
    EXPECT_TRUE(Apply(Command::NextView, 20, state));
    EXPECT_EQ(state.view, View::Disks);
    EXPECT_EQ(state.sortKey, kBusiest);
    EXPECT_FALSE(Apply(Command::Quit, 20, state));
}

TEST(TopLayout, TheScreenHoldsTheHeaderTitlesAndAPageOfTheBusiest)
{
    std::vector<std::tuple<std::string, double, double>> disks;
    for (int n = 1; n <= 30; ++n)
        disks.emplace_back("Disk " + std::to_string(n), n, 0);
    Json::Value result = Disks(disks);
    result["time"] = 0;
    State state{View::Disks, kBusiest, 100};  // scrolled too far: back to the last page
    const std::vector<std::string> lines = Screen(result, state, "", 80, 24);
    ASSERT_EQ(lines.size(), 24u);
    EXPECT_THAT(lines[1], StartsWith("[1 Disks] 2 Interfaces  3 Volumes  4 LUNs   rows 10-30 of 30  sort busiest"));
    EXPECT_THAT(lines[kTitleLine], StartsWith("device name    type     %util "));
    EXPECT_THAT(lines[kTitleLine], HasSubstr(" r/s rkB/s w/s wkB/s"));
    EXPECT_THAT(lines[kTitleLine + 1], StartsWith("sd21   Disk 21 internal  21.0 [######     "));
    EXPECT_THAT(lines.back(), StartsWith("sd1    Disk 1  internal   1.0 [        "));
    EXPECT_EQ(state.firstRow, 9u);

    State empty;
    EXPECT_THAT(Screen(Json::Value(), empty, "waiting for the first sample", 80, 24),
                ElementsAre(StartsWith("korvsnmp-stat --top  -  waiting for the first sample  Tab/1-4"),
                            HasSubstr("rows 0 of 0"), StartsWith("device name type %util ")));
    EXPECT_THAT(Screen(result, empty, "", 80, 2), ElementsAre(StartsWith("korvsnmp-stat"), StartsWith("[1 Disks]")));
}

}  // namespace
