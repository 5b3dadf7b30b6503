#include "top_layout.h"

#include <time.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <limits>

#include "catalogue/utf8_text.h"

namespace korvstat {
namespace top {
namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;
using korvcatalogue::Unit;
using Columns = std::vector<const Statistic *>;

constexpr double kNone = std::numeric_limits<double>::quiet_NaN();
constexpr double kBytesPerKilobyte = 1024;  // the titles' kB, as iostat's
constexpr double kWholeFrom = 1e6;          // numbers from here on lose their decimal
constexpr char kTotal[] = "total";
constexpr char kDeviceMember[] = "device";
constexpr char kShortened[] = "+";
constexpr size_t kNameMax = 40;
constexpr size_t kGap = 1;
constexpr char kTimeFormat[] = "%Y-%m-%d %H:%M:%S";
constexpr char kKeys[] = "Tab/1-4 section  </> sort  q quit";

const Json::Value &Member(const Json::Value &value, const char *name)
{
    static const Json::Value null;
    return value.isObject() && value.isMember(name) ? value[name] : null;
}

// Where a view's records sit in the result: "disk"."disk", "network",
// "space"."volume", "lun".
const Json::Value &RecordsOf(const Json::Value &result, View view)
{
    const Json::Value &section = Member(result, korvcatalogue::ResultMemberOf(SectionOf(view)));
    switch (view) {
    case View::Disks: return Member(section, "disk");
    case View::Volumes: return Member(section, "volume");
    case View::Interfaces:
    case View::Luns: break;
    }
    return section;
}

bool Numeric(const Statistic &statistic)
{
    return statistic.kind == Kind::Share || statistic.kind == Kind::Rate;
}

// Names come from the appliance: valid UTF-8 without control characters,
// which would move the cursor.
std::string Printable(const std::string &text)
{
    std::string printable = korvcatalogue::ValidUtf8(text);
    for (char &c : printable)
        if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f)
            c = '?';
    return printable;
}

std::string NumberText(double value)
{
    char text[64];
    std::snprintf(text, sizeof text, std::fabs(value) >= kWholeFrom ? "%.0f" : "%.1f", value);
    return text;
}

std::string LocalTime(const Json::Value &time)
{
    if (!time.isIntegral() || !time.isInt64())
        return "-";
    const time_t seconds = static_cast<time_t>(time.asInt64());
    struct tm local {};
    char text[64];
    if (localtime_r(&seconds, &local) == nullptr || strftime(text, sizeof text, kTimeFormat, &local) == 0)
        return "-";
    return text;
}

// Whether `a` sorts before `b` when larger numbers come first and NaN last.
bool Higher(double a, double b)
{
    if (std::isnan(b))
        return !std::isnan(a);
    return !std::isnan(a) && a > b;
}

size_t FirstOfKind(const Columns &columns, Kind kind)
{
    for (size_t c = 0; c < columns.size(); ++c)
        if (columns[c]->kind == kind)
            return c;
    return columns.size();
}

// The section's main name: its last name column.
size_t MainName(const Columns &columns)
{
    size_t main = columns.size();
    for (size_t c = 0; c < columns.size(); ++c)
        if (columns[c]->kind == Kind::Name)
            main = c;
    return main;
}

double Bytes(const Row &row, const Columns &columns)
{
    double bytes = 0;
    for (size_t c = 0; c < columns.size(); ++c)
        if (columns[c]->unit == Unit::BytesPerSecond && !std::isnan(row.values[c]))
            bytes += row.values[c];
    return bytes;
}

std::string Repeat(char c, size_t count) { return std::string(count, c); }

std::string Pad(const std::string &text, size_t width, bool right)
{
    const std::string cut = Shorten(text, width);
    const std::string padding(width - Width(cut), ' ');
    return right ? padding + cut : cut + padding;
}

std::string Join(const std::vector<std::string> &cells, size_t width)
{
    std::string line;
    for (const std::string &cell : cells)
        line += (line.empty() ? "" : std::string(kGap, ' ')) + cell;
    line.erase(line.find_last_not_of(' ') + 1);
    return Shorten(line, width);
}

size_t TotalWidth(const std::vector<Placed> &placed)
{
    size_t total = 0;
    for (const Placed &p : placed)
        total += p.width;
    return placed.empty() ? 0 : total + kGap * (placed.size() - 1);
}

std::string SortTitle(const Columns &columns, int sortKey)
{
    if (sortKey == kBusiest || static_cast<size_t>(sortKey) >= columns.size())
        return "busiest";
    return columns[static_cast<size_t>(sortKey)]->title;
}

}  // namespace

Section SectionOf(View view)
{
    switch (view) {
    case View::Disks: return Section::Disk;
    case View::Interfaces: return Section::Interface;
    case View::Volumes: return Section::Volume;
    case View::Luns: return Section::Lun;
    }
    return Section::Disk;
}

const char *TitleOf(View view)
{
    switch (view) {
    case View::Disks: return "Disks";
    case View::Interfaces: return "Interfaces";
    case View::Volumes: return "Volumes";
    case View::Luns: return "LUNs";
    }
    return "";
}

std::vector<std::string> Resources()
{
    std::vector<std::string> resources;
    for (View view : kViews)
        resources.push_back(korvcatalogue::ResultMemberOf(SectionOf(view)));
    return resources;
}

Columns ColumnsOf(View view)
{
    Columns columns;
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(SectionOf(view))) {
        const bool named = statistic->kind == Kind::Name ||
                           (statistic->kind == Kind::Enumeration && !statistic->member.empty());
        if (named || Numeric(*statistic))
            columns.push_back(statistic);
    }
    return columns;
}

std::vector<Row> RowsOf(const Json::Value &result, View view)
{
    const Columns columns = ColumnsOf(view);
    const Json::Value &records = RecordsOf(result, view);
    std::vector<Row> rows;
    if (!records.isArray())
        return rows;
    for (const Json::Value &record : records) {
        const Json::Value &device = Member(record, kDeviceMember);
        if (device.isString() && device.asString() == kTotal)
            continue;
        Row row;
        for (const Statistic *statistic : columns) {
            const Json::Value &value = Member(record, statistic->member.c_str());
            double number = kNone;
            std::string text;
            if (value.isNumeric() && !value.isBool()) {
                number = value.asDouble();
                if (statistic->unit == Unit::BytesPerSecond)
                    number /= kBytesPerKilobyte;
                text = Numeric(*statistic) ? NumberText(number) : value.asString();
                if (!Numeric(*statistic))
                    number = kNone;
            } else if (value.isString() && !Numeric(*statistic)) {
                text = Printable(value.asString());
            }
            row.cells.push_back(std::move(text));
            row.values.push_back(number);
        }
        rows.push_back(std::move(row));
    }
    return rows;
}

void SortRows(std::vector<Row> &rows, const Columns &columns, int sortKey)
{
    if (sortKey == kBusiest) {
        const size_t share = FirstOfKind(columns, Kind::Share);
        std::stable_sort(rows.begin(), rows.end(), [&](const Row &a, const Row &b) {
            if (share < columns.size() && a.values[share] != b.values[share] &&
                !(std::isnan(a.values[share]) && std::isnan(b.values[share])))
                return Higher(a.values[share], b.values[share]);
            return Bytes(a, columns) > Bytes(b, columns);
        });
        return;
    }
    if (sortKey < 0 || static_cast<size_t>(sortKey) >= columns.size())
        return;
    const size_t key = static_cast<size_t>(sortKey);
    if (Numeric(*columns[key])) {
        std::stable_sort(rows.begin(), rows.end(),
                         [&](const Row &a, const Row &b) { return Higher(a.values[key], b.values[key]); });
        return;
    }
    std::stable_sort(rows.begin(), rows.end(), [&](const Row &a, const Row &b) {
        if (a.cells[key].empty() != b.cells[key].empty())
            return b.cells[key].empty();
        return a.cells[key] < b.cells[key];
    });
}

std::vector<Placed> Fit(const Columns &columns, const std::vector<Row> &rows, size_t width)
{
    const size_t main = MainName(columns);
    std::vector<Placed> placed;
    size_t natural = 0;  // of the main name
    for (size_t c = 0; c < columns.size(); ++c) {
        size_t widest = Width(columns[c]->title);
        for (const Row &row : rows)
            widest = std::max(widest, Width(row.cells[c]));
        if (columns[c]->kind == Kind::Name)
            widest = std::min(widest, kNameMax);
        if (c == main)
            natural = widest;
        placed.push_back({c, widest});
        if (columns[c]->kind == Kind::Share)
            placed.push_back({kBar, kBarMin});
    }

    const auto find = [&](size_t column) {
        return std::find_if(placed.begin(), placed.end(), [&](const Placed &p) { return p.column == column; });
    };
    // Drops, from the right, the columns that `which` picks while they do not fit.
    const auto dropWhile = [&](auto which) {
        for (size_t i = placed.size(); i-- > 0 && TotalWidth(placed) > width;)
            if (placed[i].column != main && which(placed[i].column))
                placed.erase(placed.begin() + static_cast<std::ptrdiff_t>(i));
    };
    const auto shrinkMain = [&](size_t floor) {
        auto name = find(main);
        const size_t total = TotalWidth(placed);
        if (name != placed.end() && total > width && name->width > floor)
            name->width = std::max(floor, name->width - std::min(name->width - floor, total - width));
    };
    const auto kindIs = [&](size_t column, Kind kind) {
        return column != kBar && columns[column]->kind == kind;
    };
    const auto unitIs = [&](size_t column, Unit unit) {
        return kindIs(column, Kind::Rate) && columns[column]->unit == unit;
    };

    dropWhile([&](size_t c) { return kindIs(c, Kind::Enumeration); });
    dropWhile([&](size_t c) { return kindIs(c, Kind::Name); });
    shrinkMain(kNameFloor);
    dropWhile([&](size_t c) { return kindIs(c, Kind::Rate) && !unitIs(c, Unit::BytesPerSecond); });
    dropWhile([&](size_t c) { return unitIs(c, Unit::BytesPerSecond); });
    dropWhile([&](size_t c) { return c == kBar; });
    dropWhile([&](size_t) { return true; });
    shrinkMain(0);

    // Room to spare: the name back to its natural width, then the bar.
    auto name = find(main);
    if (name != placed.end() && TotalWidth(placed) < width)
        name->width = std::min(natural, name->width + width - TotalWidth(placed));
    auto bar = find(kBar);
    if (bar != placed.end() && TotalWidth(placed) < width)
        bar->width = std::min(kBarMax, bar->width + width - TotalWidth(placed));
    return placed;
}

std::string Bar(double percent, size_t width)
{
    if (width < 3)
        return "";
    const size_t inside = width - 2;
    size_t filled = 0;
    if (!std::isnan(percent)) {
        const double share = std::clamp(percent, 0.0, 100.0) / 100.0;
        filled = static_cast<size_t>(std::lround(share * static_cast<double>(inside)));
    }
    return "[" + Repeat('#', filled) + Repeat(' ', inside - filled) + "]";
}

size_t Width(const std::string &text)
{
    size_t characters = 0;
    for (unsigned char c : text)
        if ((c & 0xc0) != 0x80)
            ++characters;
    return characters;
}

std::string Shorten(const std::string &text, size_t width)
{
    if (Width(text) <= width)
        return text;
    if (width == 0)
        return "";
    // The byte where character `width - 1` starts.
    size_t kept = 0;
    size_t at = 0;
    for (; at < text.size(); ++at)
        if ((static_cast<unsigned char>(text[at]) & 0xc0) != 0x80 && kept++ == width - 1)
            break;
    return text.substr(0, at) + kShortened;
}

bool Apply(Command command, size_t pageRows, State &state)
{
    const auto show = [&](View view) {
        state.view = view;
        state.sortKey = kBusiest;
        state.firstRow = 0;
    };
    const size_t views = std::size(kViews);
    const size_t current = static_cast<size_t>(state.view);
    // The sort keys in order: kBusiest, then each column.
    const int keys = static_cast<int>(ColumnsOf(state.view).size()) + 1;
    const int position = state.sortKey + 1;
    switch (command) {
    case Command::Quit: return false;
    case Command::NextView: show(kViews[(current + 1) % views]); break;
    case Command::PreviousView: show(kViews[(current + views - 1) % views]); break;
    case Command::ShowDisks: show(View::Disks); break;
    case Command::ShowInterfaces: show(View::Interfaces); break;
    case Command::ShowVolumes: show(View::Volumes); break;
    case Command::ShowLuns: show(View::Luns); break;
    case Command::SortLeft: state.sortKey = (position + keys - 1) % keys - 1; break;
    case Command::SortRight: state.sortKey = (position + 1) % keys - 1; break;
    case Command::SortBusiest: state.sortKey = kBusiest; break;
    case Command::LineUp: state.firstRow -= std::min<size_t>(state.firstRow, 1); break;
    case Command::LineDown: ++state.firstRow; break;
    case Command::PageUp: state.firstRow -= std::min(state.firstRow, pageRows); break;
    case Command::PageDown: state.firstRow += pageRows; break;
    case Command::Top: state.firstRow = 0; break;
    }
    return true;
}

std::vector<std::string> Screen(const Json::Value &result, State &state, const std::string &status,
                                size_t width, size_t height)
{
    const Columns columns = ColumnsOf(state.view);
    std::vector<Row> rows = RowsOf(result, state.view);
    SortRows(rows, columns, state.sortKey);
    const size_t pageRows = height > kTitleLine + 1 ? height - kTitleLine - 1 : 0;
    state.firstRow = std::min(state.firstRow, rows.size() > pageRows ? rows.size() - pageRows : 0);

    std::vector<std::string> lines;
    std::string first = "korvsnmp-stat --top  " + LocalTime(Member(result, "time"));
    if (!status.empty())
        first += "  " + status;
    lines.push_back(first + "  " + kKeys);
    std::string second;
    for (size_t v = 0; v < std::size(kViews); ++v) {
        const std::string name = std::to_string(v + 1) + " " + TitleOf(kViews[v]);
        second += kViews[v] == state.view ? "[" + name + "]" : " " + name + " ";
    }
    const size_t last = std::min(rows.size(), state.firstRow + pageRows);
    second += "  rows " + (rows.empty() ? std::string("0") : std::to_string(state.firstRow + 1) + "-" +
                                                               std::to_string(last)) +
              " of " + std::to_string(rows.size()) + "  sort " + SortTitle(columns, state.sortKey);
    lines.push_back(second);

    const std::vector<Placed> placed = Fit(columns, rows, width);
    const size_t share = FirstOfKind(columns, Kind::Share);
    const auto right = [&](size_t c) { return c != kBar && Numeric(*columns[c]); };
    std::vector<std::string> titles;
    for (const Placed &p : placed)
        titles.push_back(Pad(p.column == kBar ? "" : columns[p.column]->title, p.width, right(p.column)));
    lines.push_back(Join(titles, width));
    for (size_t r = state.firstRow; r < last; ++r) {
        std::vector<std::string> cells;
        for (const Placed &p : placed)
            cells.push_back(p.column == kBar ? Bar(share < columns.size() ? rows[r].values[share] : kNone, p.width)
                                             : Pad(rows[r].cells[p.column], p.width, right(p.column)));
        lines.push_back(Join(cells, width));
    }
    for (std::string &line : lines)
        line = Shorten(line, width);
    lines.resize(std::min(lines.size(), height));
    return lines;
}

}  // namespace top
}  // namespace korvstat
