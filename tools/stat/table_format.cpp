#include "table_format.h"

#include <time.h>

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

#include "counters.h"
#include "protocol/collector_protocol.h"

namespace korvstat {
namespace {

constexpr char kMissing[] = "-";
constexpr char kColumnGap[] = "  ";
constexpr char kTotal[] = "total";

std::string CellText(const Json::Value &value)
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

Cell CounterCell(const Json::Value &value, Unit unit, bool rawNumbers)
{
    double shown = 0;
    if (!ShownValue(value, unit, shown))
        return {CellText(value), false};
    const bool bytes = unit == Unit::BytesPerSecond || unit == Unit::KiB;
    return {bytes && !rawNumbers ? HumanBytes(shown) : ExactText(value, unit), true};
}

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

std::string Header(const Counter &counter)
{
    return std::string(counter.member) + " (" + HeaderUnit(counter.unit) + ")";
}

bool IsKnown(const std::string &name, const std::vector<std::string> &names,
             const std::vector<Counter> &counters)
{
    return std::find(names.begin(), names.end(), name) != names.end() ||
           std::any_of(counters.begin(), counters.end(),
                       [&](const Counter &c) { return name == c.member; });
}

// A table of records: the `names` columns, every one of `counters`, then the
// other members that any record has, by name.
void PrintCounterTable(const std::string &title, const std::vector<const Json::Value *> &records,
                       const std::vector<std::string> &names, const std::vector<Counter> &counters,
                       bool rawNumbers, std::ostream &out)
{
    if (records.empty()) {
        out << title << "\n(none)\n\n";
        return;
    }
    std::vector<std::string> others;
    for (const Json::Value *record : records) {
        if (!record->isObject())
            continue;
        for (const std::string &name : record->getMemberNames())
            if (!IsKnown(name, names, counters) &&
                std::find(others.begin(), others.end(), name) == others.end())
                others.push_back(name);
    }
    std::sort(others.begin(), others.end());

    std::vector<std::string> header = names;
    for (const Counter &counter : counters)
        header.push_back(Header(counter));
    header.insert(header.end(), others.begin(), others.end());

    std::vector<Row> rows;
    for (const Json::Value *record : records) {
        Row row;
        if (!record->isObject()) {
            row.push_back({CellText(*record), false});
            row.resize(header.size(), Cell{kMissing, false});
            rows.push_back(std::move(row));
            continue;
        }
        for (const std::string &name : names)
            row.push_back({CellText((*record)[name]), false});
        for (const Counter &counter : counters)
            row.push_back(CounterCell((*record)[counter.member], counter.unit, rawNumbers));
        for (const std::string &name : others) {
            const Json::Value &value = (*record)[name];
            row.push_back({CellText(value), value.isNumeric()});
        }
        rows.push_back(std::move(row));
    }
    PrintGrid(title, header, rows, out);
}

// One record shown as one line per member: the known `counters` present,
// in their order, then the others by name, their values as they are.
void PrintMemberTable(const std::string &title, const std::string &nameHeader,
                      const std::string &valueHeader, const Json::Value &record,
                      const std::vector<Counter> &counters, bool rawNumbers, std::ostream &out)
{
    std::vector<Row> rows;
    if (record.isObject()) {
        for (const Counter &counter : counters)
            if (record.isMember(counter.member))
                rows.push_back({{counter.member, false},
                                CounterCell(record[counter.member], counter.unit, rawNumbers)});
        for (const std::string &name : record.getMemberNames())
            if (!IsKnown(name, {}, counters))
                rows.push_back({{name, false}, {CellText(record[name]), record[name].isNumeric()}});
    } else {
        rows.push_back({{"value", false}, {CellText(record), false}});
    }
    PrintGrid(title, {nameHeader, valueHeader}, rows, out);
}

std::vector<const Json::Value *> Elements(const Json::Value &array)
{
    std::vector<const Json::Value *> elements;
    if (array.isArray())
        for (const Json::Value &element : array)
            elements.push_back(&element);
    return elements;
}

// The records of `section` with the "total" ones last: the member "total" of
// an object that holds its records under `list`, or the records of an array
// whose "device" is "total". Another value is one record of its own.
std::vector<const Json::Value *> TotalLast(const Json::Value &section, const char *list)
{
    if (!section.isArray() && !(section.isObject() && *list != '\0'))
        return {&section};
    std::vector<const Json::Value *> rows = Elements(section.isObject() ? section[list] : section);
    std::stable_partition(rows.begin(), rows.end(), [](const Json::Value *record) {
        return !(record->isObject() && (*record)["device"] == kTotal);
    });
    if (section.isObject() && section.isMember(kTotal))
        rows.push_back(&section[kTotal]);
    return rows;
}

// Seconds since the epoch as local ISO 8601 with the offset from UTC:
// 2026-11-23T21:04:05+01:00. Other values as they are.
std::string LocalTime(const Json::Value &time)
{
    if (!time.isIntegral() || !time.isInt64())
        return CellText(time);
    const time_t seconds = static_cast<time_t>(time.asInt64());
    struct tm local {};
    char text[64];
    if (localtime_r(&seconds, &local) == nullptr ||
        strftime(text, sizeof text, "%Y-%m-%dT%H:%M:%S%z", &local) == 0)
        return CellText(time);
    std::string iso = text;
    iso.insert(iso.size() - 2, ":");  // +0100 -> +01:00
    return iso;
}

}  // namespace

void WriteTables(const Json::Value &result, bool rawNumbers, std::ostream &out)
{
    if (!result.isObject()) {
        out << CellText(result) << '\n';
        return;
    }
    if (result.isMember("time"))
        out << "Sample time" << kColumnGap << LocalTime(result["time"]) << "\n\n";
    if (result.isMember("cpu"))
        PrintMemberTable("CPU", "state", "share (%)", result["cpu"], CpuCounters(), rawNumbers, out);
    if (result.isMember("memory"))
        PrintMemberTable("Memory", "member", "size (B)", result["memory"], MemoryCounters(),
                         rawNumbers, out);
    if (result.isMember("network"))
        PrintCounterTable("Network interfaces", TotalLast(result["network"], ""), {"device"},
                          NetworkCounters(), rawNumbers, out);
    if (result.isMember("disk"))
        PrintCounterTable("Disks", TotalLast(result["disk"], "disk"),
                          {"device", "display_name", "type"}, DeviceCounters(), rawNumbers, out);
    if (result.isMember("space"))
        PrintCounterTable("Volumes", TotalLast(result["space"], "volume"),
                          {"device", "display_name"}, DeviceCounters(), rawNumbers, out);
    if (result.isMember("lun"))
        PrintCounterTable("iSCSI LUNs", Elements(result["lun"]), {"uuid", "lun_name"},
                          DeviceCounters(), rawNumbers, out);
    if (result.isMember("nfs")) {
        const Json::Value &nfs = result["nfs"];
        PrintCounterTable("NFS", {&nfs}, {}, NfsCounters(), rawNumbers, out);
    }
}

}  // namespace korvstat
