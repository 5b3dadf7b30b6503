// What the live view (korvsnmp-stat --top) shows, as text: the rows of one
// section sorted, the columns that fit the terminal's width, the
// utilization bar and the whole screen. No terminal is involved here: the
// view draws the lines that Screen() returns.
//
// Columns come from the statistics catalogue: for a section its names,
// its enumerations that the result carries, its shares and its rates, in
// the catalogue's order, titled with the catalogue's short titles (iostat's
// "r/s", "rkB/s", "%util"); a share is followed by its bar. Widths are
// counted in characters (UTF-8 code points).
#ifndef KORVSNMP_STAT_TOP_LAYOUT_H
#define KORVSNMP_STAT_TOP_LAYOUT_H

#include <cstddef>
#include <string>
#include <vector>

#include <json/value.h>

#include "catalogue/statistics_catalogue.h"

namespace korvstat {
namespace top {

// The sections that the view switches between, in the order of its keys 1-4.
enum class View { Disks, Interfaces, Volumes, Luns };
inline constexpr View kViews[] = {View::Disks, View::Interfaces, View::Volumes, View::Luns};

korvcatalogue::Section SectionOf(View view);
const char *TitleOf(View view);  // "Disks", "Interfaces", "Volumes", "LUNs"

// The resources that a request names to get every view's records.
std::vector<std::string> Resources();

// The catalogue's entries that the view shows as columns for `view`.
std::vector<const korvcatalogue::Statistic *> ColumnsOf(View view);

// A record of the section: one cell text per column, and the number behind
// each numeric cell (NaN where the record has none).
struct Row {
    std::vector<std::string> cells;
    std::vector<double> values;
};

// The records of `view` in `result` (as SNMPParseReplyData fills it), the
// "total" ones left out. Values of unexpected shapes give empty cells and
// NaN; a result of any shape gives no row rather than throwing.
std::vector<Row> RowsOf(const Json::Value &result, View view);

// The sort keys: kBusiest, or the index of a column in ColumnsOf().
inline constexpr int kBusiest = -1;

// Sorts `rows` (stable): kBusiest puts the highest share first, then the
// most bytes per second (all byte rates added); a numeric column sorts
// from the highest, a name column alphabetically. NaN sorts last.
void SortRows(std::vector<Row> &rows, const std::vector<const korvcatalogue::Statistic *> &columns,
              int sortKey);

// One shown column: the index into ColumnsOf(), or kBar for the bar after
// the share, and its width.
inline constexpr size_t kBar = static_cast<size_t>(-1);
struct Placed {
    size_t column;
    size_t width;
};

// The columns that fit `width` characters with one space between them.
// While they do not fit, enumerations and the secondary names are dropped
// first, then the main name (the section's last name: a display name) is
// shortened to kNameFloor, then the operation rates, the byte rates, the
// bar and the share are dropped, and the name is cut to the width left.
// Room to spare widens a shortened name back, then the bar (to kBarMax).
inline constexpr size_t kNameFloor = 12;
inline constexpr size_t kBarMin = 7;
inline constexpr size_t kBarMax = 42;
std::vector<Placed> Fit(const std::vector<const korvcatalogue::Statistic *> &columns,
                        const std::vector<Row> &rows, size_t width);

// The bar of `percent` (clamped to 0-100) in `width` characters:
// "[####    ]"; blanks between the brackets for NaN; "" below 3 characters.
std::string Bar(double percent, size_t width);

// `text` cut to `width` characters, a cut one ending in '+' as in top.
std::string Shorten(const std::string &text, size_t width);

// Characters (UTF-8 code points) in `text`.
size_t Width(const std::string &text);

// What the keys ask for.
enum class Command {
    Quit,
    NextView,
    PreviousView,
    ShowDisks,
    ShowInterfaces,
    ShowVolumes,
    ShowLuns,
    SortLeft,   // the sort key moves one column to the left
    SortRight,
    SortBusiest,
    LineUp,
    LineDown,
    PageUp,
    PageDown,
    Top,
};

struct State {
    View view = View::Disks;
    int sortKey = kBusiest;
    size_t firstRow = 0;  // scrolled past
};

// `state` after `command`, for a page of `pageRows` rows; false for Quit.
// Moving the sort key runs through kBusiest and the numeric and name
// columns of the view; a new view sorts by kBusiest from its first row.
bool Apply(Command command, size_t pageRows, State &state);

// Lines of the header above the column titles, and the line of the titles.
inline constexpr size_t kHeaderLines = 2;
inline constexpr size_t kTitleLine = kHeaderLines;

// The whole screen, `height` lines of at most `width` characters: the
// header (the sample's time, `status`, the sections and the sort key, the
// keys), the column titles, then the rows from state.firstRow on (kept
// within the rows). `status` says how sampling goes ("" when all is well).
std::vector<std::string> Screen(const Json::Value &result, State &state, const std::string &status,
                                size_t width, size_t height);

}  // namespace top
}  // namespace korvstat

#endif
