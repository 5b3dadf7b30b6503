#include "table_format.h"

#include <time.h>

#include <algorithm>
#include <string>
#include <vector>

#include "catalogue/statistics_catalogue.h"
#include "counters.h"
#include "protocol/collector_protocol.h"

namespace korvstat {
namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;

constexpr char kMissing[] = "-";
constexpr char kColumnGap[] = "  ";
constexpr char kTotal[] = "total";

// The sections that have tables, and where the result holds a list of
// records (under the member `list` of the section's object, or the section's
// array itself when `list` is "") and its total.
struct TableSection {
    Section section;
    const char *list;
};
constexpr TableSection kTables[] = {{Section::Cpu, nullptr},    {Section::Memory, nullptr},
                                    {Section::Nfs, nullptr},    {Section::Disk, "disk"},
                                    {Section::Interface, ""},   {Section::Volume, "volume"},
                                    {Section::Lun, ""}};

std::string ValueText(const Json::Value &value)
{
    if (value.isNull())
        return kMissing;
    if (value.isString())
        return value.asString();
    return korvproto::CompactJson(value);
}

struct Cell {
    std::string text;
    bool numeric = false;
};

using Row = std::vector<Cell>;

// Prints `rows` under `header`, columns padded to their widest cell; a
// column whose cells are numbers (or missing) is aligned right.
void PrintGrid(const std::string &title, const std::vector<std::string> &header,
               const std::vector<Row> &rows, std::ostream &out)
{
    std::vector<size_t> widths(header.size());
    std::vector<bool> right(header.size(), !rows.empty());
    for (size_t c = 0; c < header.size(); ++c) {
        widths[c] = header[c].size();
        for (const Row &row : rows) {
            widths[c] = std::max(widths[c], row[c].text.size());
            if (!row[c].numeric && row[c].text != kMissing)
                right[c] = false;
        }
    }
    auto printRow = [&](const std::vector<std::string> &cells) {
        std::string line;
        for (size_t c = 0; c < cells.size(); ++c) {
            std::string padding(widths[c] - cells[c].size(), ' ');
            line += c == 0 ? "" : kColumnGap;
            line += right[c] ? padding + cells[c] : cells[c] + padding;
        }
        line.erase(line.find_last_not_of(' ') + 1);
        out << line << '\n';
    };
    out << title << '\n';
    printRow(header);
    for (const Row &row : rows) {
        std::vector<std::string> cells;
        for (const Cell &cell : row)
            cells.push_back(cell.text);
        printRow(cells);
    }
    out << '\n';
}

bool IsName(const Statistic &statistic)
{
    return statistic.kind == Kind::Name || statistic.kind == Kind::Enumeration;
}

// The records of one section's table, a "total" last.
std::vector<const Json::Value *> RecordsOf(const Json::Value &section, const char *list)
{
    if (list == nullptr || !(section.isArray() || (section.isObject() && *list != '\0')))
        return {&section};
    std::vector<const Json::Value *> rows;
    const Json::Value &array = section.isObject() ? section[list] : section;
    if (array.isArray())
        for (const Json::Value &element : array)
            rows.push_back(&element);
    std::stable_partition(rows.begin(), rows.end(), [](const Json::Value *record) {
        return !(record->isObject() && (*record)["device"] == kTotal);
    });
    if (section.isObject() && section.isMember(kTotal))
        rows.push_back(&section[kTotal]);
    return rows;
}

// One section's table: its name columns, the statistics that any record
// has, then the other members of any record, by name.
void PrintTable(Section section, const std::vector<const Json::Value *> &records, bool rawNumbers,
                std::ostream &out)
{
    const std::string title = korvcatalogue::TitleOf(section);
    if (records.empty()) {
        out << title << "\n(none)\n\n";
        return;
    }
    const auto has = [&](const std::string &member) {
        return std::any_of(records.begin(), records.end(), [&](const Json::Value *record) {
            return record->isObject() && record->isMember(member);
        });
    };
    std::vector<const Statistic *> columns;
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(section))
        if (!statistic->member.empty() && (IsName(*statistic) || has(statistic->member)))
            columns.push_back(statistic);
    std::vector<std::string> others;
    for (const Json::Value *record : records) {
        if (!record->isObject())
            continue;
        for (const std::string &name : record->getMemberNames())
            if (korvcatalogue::Find(section, name) == nullptr &&
                std::find(others.begin(), others.end(), name) == others.end())
                others.push_back(name);
    }
    std::sort(others.begin(), others.end());

    std::vector<std::string> header;
    for (const Statistic *column : columns)
        header.push_back(column->title);
    header.insert(header.end(), others.begin(), others.end());

    std::vector<Row> rows;
    for (const Json::Value *record : records) {
        Row row;
        if (!record->isObject()) {
            row.push_back({ValueText(*record), false});
            row.resize(header.size(), Cell{kMissing, false});
            rows.push_back(std::move(row));
            continue;
        }
        for (const Statistic *column : columns) {
            const Json::Value &value = (*record)[column->member];
            const std::string shown = IsName(*column) ? "" : CellText(value, *column, rawNumbers);
            row.push_back(shown.empty() ? Cell{ValueText(value), false} : Cell{shown, true});
        }
        for (const std::string &name : others) {
            const Json::Value &value = (*record)[name];
            row.push_back({ValueText(value), value.isNumeric()});
        }
        rows.push_back(std::move(row));
    }
    PrintGrid(title, header, rows, out);
}

// Seconds since the epoch as local ISO 8601 with the offset from UTC:
// 2026-11-23T21:04:05+01:00. Other values as they are.
std::string LocalTime(const Json::Value &time)
{
    if (!time.isIntegral() || !time.isInt64())
        return ValueText(time);
    const time_t seconds = static_cast<time_t>(time.asInt64());
    struct tm local {};
    char text[64];
    if (localtime_r(&seconds, &local) == nullptr ||
        strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%S%z", &local) == 0)
        return ValueText(time);
    std::string iso = text;
    iso.insert(iso.size() - 2, ":");  // +0100 -> +01:00
    return iso;
}

}  // namespace

void WriteTables(const Json::Value &result, bool rawNumbers, std::ostream &out)
{
    if (!result.isObject()) {
        out << ValueText(result) << '\n';
        return;
    }
    const std::string &time = korvcatalogue::AgentStatistic(korvcatalogue::AgentValue::SampleTime).member;
    if (result.isMember(time))
        out << "Sample time" << kColumnGap << LocalTime(result[time]) << "\n\n";
    for (const TableSection &table : kTables) {
        const char *member = korvcatalogue::ResultMemberOf(table.section);
        if (result.isMember(member))
            PrintTable(table.section, RecordsOf(result[member], table.list), rawNumbers, out);
    }
}

}  // namespace korvstat
