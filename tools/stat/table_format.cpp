#include "table_format.h"

#include <algorithm>
#include <string>
#include <vector>

#include "protocol/collector_protocol.h"

namespace korvstat {
namespace {

constexpr char kMissing[] = "-";
constexpr char kColumnGap[] = "  ";

std::string CellText(const Json::Value &value)
{
    if (value.isNull())
        return kMissing;
    if (value.isString())
        return value.asString();
    return korvproto::CompactJson(value);
}

using Row = std::vector<std::string>;

// Prints `rows` under `header`, columns padded to their widest cell; columns
// whose cells are all numbers are aligned right.
void PrintGrid(const std::string &title, const Row &header, const std::vector<Row> &rows,
               const std::vector<bool> &numeric, std::ostream &out)
{
    std::vector<size_t> widths(header.size());
    for (size_t c = 0; c < header.size(); ++c) {
        widths[c] = header[c].size();
        for (const Row &row : rows)
            widths[c] = std::max(widths[c], row[c].size());
    }
    auto printRow = [&](const Row &row) {
        std::string line;
        for (size_t c = 0; c < row.size(); ++c) {
            std::string padding(widths[c] - row[c].size(), ' ');
            line += c == 0 ? "" : kColumnGap;
            line += numeric[c] ? padding + row[c] : row[c] + padding;
        }
        line.erase(line.find_last_not_of(' ') + 1);
        out << line << '\n';
    };
    out << title << '\n';
    printRow(header);
    for (const Row &row : rows)
        printRow(row);
    out << '\n';
}

// A table of records (objects): the `preferred` columns first, where any
// record has them, then every other member in name order.
void PrintRecords(const std::string &title, const std::vector<const Json::Value *> &records,
                  const std::vector<std::string> &preferred, std::ostream &out)
{
    if (records.empty()) {
        out << title << "\n(none)\n\n";
        return;
    }
    std::vector<std::string> others;
    std::vector<bool> hasPreferred(preferred.size(), false);
    for (const Json::Value *record : records) {
        if (!record->isObject())
            continue;
        for (const std::string &name : record->getMemberNames()) {
            auto known = std::find(preferred.begin(), preferred.end(), name);
            if (known != preferred.end())
                hasPreferred[known - preferred.begin()] = true;
            else if (std::find(others.begin(), others.end(), name) == others.end())
                others.push_back(name);
        }
    }
    std::sort(others.begin(), others.end());
    Row header;
    for (size_t i = 0; i < preferred.size(); ++i)
        if (hasPreferred[i])
            header.push_back(preferred[i]);
    header.insert(header.end(), others.begin(), others.end());
    if (header.empty())
        header.push_back("value");

    std::vector<Row> rows;
    std::vector<bool> numeric(header.size(), !records.empty());
    for (const Json::Value *record : records) {
        Row row;
        for (size_t c = 0; c < header.size(); ++c) {
            const Json::Value *cell = record;
            if (record->isObject())
                cell = &(*record)[header[c]];
            else if (c != 0)
                cell = nullptr;
            row.push_back(cell ? CellText(*cell) : kMissing);
            if (cell && !cell->isNumeric())
                numeric[c] = false;
        }
        rows.push_back(std::move(row));
    }
    PrintGrid(title, header, rows, numeric, out);
}

// One record shown as member / value lines.
void PrintRecord(const std::string &title, const Json::Value &record, std::ostream &out)
{
    std::vector<Row> rows;
    if (record.isObject()) {
        for (const std::string &name : record.getMemberNames())
            rows.push_back({name, CellText(record[name])});
    } else {
        rows.push_back({"value", CellText(record)});
    }
    PrintGrid(title, {"member", "value"}, rows, {false, false}, out);
}

std::vector<const Json::Value *> Elements(const Json::Value &array)
{
    std::vector<const Json::Value *> elements;
    if (array.isArray())
        for (const Json::Value &element : array)
            elements.push_back(&element);
    return elements;
}

// Sections that hold a list of records and a "total" object.
std::vector<const Json::Value *> ListWithTotal(const Json::Value &section, const char *list)
{
    if (!section.isObject())
        return {&section};
    std::vector<const Json::Value *> rows = Elements(section[list]);
    if (section.isMember("total"))
        rows.push_back(&section["total"]);
    return rows;
}

}  // namespace

void WriteTables(const Json::Value &result, std::ostream &out)
{
    if (!result.isObject()) {
        out << CellText(result) << '\n';
        return;
    }
    if (result.isMember("cpu"))
        PrintRecord("CPU", result["cpu"], out);
    if (result.isMember("memory"))
        PrintRecord("Memory", result["memory"], out);
    if (result.isMember("network"))
        PrintRecords("Network interfaces", Elements(result["network"]), {"device", "rx", "tx"}, out);
    if (result.isMember("disk"))
        PrintRecords("Disks", ListWithTotal(result["disk"], "disk"),
                     {"display_name", "type", "device", "utilization", "read_access", "read_byte",
                      "write_access", "write_byte"},
                     out);
    if (result.isMember("space"))
        PrintRecords("Volumes", ListWithTotal(result["space"], "volume"), {"display_name", "device"},
                     out);
    if (result.isMember("lun"))
        PrintRecords("iSCSI LUNs", Elements(result["lun"]), {"lun_name", "uuid"}, out);
    if (result.isMember("nfs"))
        PrintRecord("NFS", result["nfs"], out);
    if (result.isMember("time"))
        out << "Time" << kColumnGap << CellText(result["time"]) << '\n';
}

}  // namespace korvstat
