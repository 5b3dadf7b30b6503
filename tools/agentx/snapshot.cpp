// The result of SNMPParseReplyData as KORVSNMP-MIB's objects, cell by cell
// as the statistics catalogue lists them.
#include "snapshot.h"

#include <algorithm>
#include <iterator>
#include <optional>
#include <set>

#include "catalogue/statistics_catalogue.h"
#include "catalogue/utf8_text.h"
#include "mib_layout.h"
#include "protocol/unit_log.h"

namespace korvagentx {

namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;
using korvcatalogue::Syntax;

constexpr char kLogUnit[] = "snapshot";
constexpr uint64_t kMax32 = 0xFFFFFFFFull;
constexpr uint32_t kEntry = 1;  // a table's entry: table.1.column.index

// A member of an object, or nullptr (for a missing member or a non-object:
// jsoncpp's lookups throw on arrays and scalars).
const Json::Value *Member(const Json::Value *value, const std::string &name)
{
    if (value == nullptr || !value->isObject() || name.empty())
        return nullptr;
    return value->find(name.data(), name.data() + name.size());
}

std::optional<uint64_t> Number(const Json::Value *value)
{
    if (value == nullptr || !value->isUInt64())
        return std::nullopt;
    return value->asUInt64();
}

std::optional<std::string> Text(const Json::Value *value)
{
    if (value == nullptr || !value->isString())
        return std::nullopt;
    return value->asString();
}

// The objects (records) of an array, or none.
std::vector<const Json::Value *> Records(const Json::Value *array)
{
    std::vector<const Json::Value *> records;
    if (array == nullptr || !array->isArray())
        return records;
    for (const Json::Value &record : *array)
        if (record.isObject())
            records.push_back(&record);
    return records;
}

Oid ObjectsOid()
{
    Oid oid(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
    oid.push_back(kObjects);
    return oid;
}

bool IsTable(Section section)
{
    const auto statistics = korvcatalogue::StatisticsOf(section);
    return std::any_of(statistics.begin(), statistics.end(),
                       [](const Statistic *statistic) { return statistic->kind == Kind::Index; });
}

// The member of a row that names its device: the section's first name.
std::string IdentityMember(Section section)
{
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(section))
        if (statistic->kind == Kind::Name)
            return statistic->member;
    return "";
}

DiskType DiskTypeOf(const Json::Value *type)
{
    static const std::pair<const char *, DiskType> kTypes[] = {
        {"internal", DiskType::Internal}, {"ebox", DiskType::Ebox},
        {"usb", DiskType::Usb},           {"eSATA", DiskType::Esata}};
    const std::string text = Text(type).value_or("");
    for (const auto &[name, value] : kTypes)
        if (text == name)
            return value;
    return DiskType::Other;
}

IfKind IfKindOf(size_t position, const std::string &device, const NetworkKinds &kinds)
{
    switch (korvexposition::KindOf(position, device, kinds)) {
    case korvexposition::InterfaceKind::Total: return IfKind::Total;
    case korvexposition::InterfaceKind::Aggregation: return IfKind::Aggregation;
    case korvexposition::InterfaceKind::Pppoe: return IfKind::Pppoe;
    case korvexposition::InterfaceKind::Interface: break;
    }
    return IfKind::Interface;
}

// Counters summed over rows, by member; a sum counts only where every row
// has the counter.
struct Sums {
    size_t rows = 0;
    std::map<std::string, std::pair<uint64_t, size_t>> byMember;  // sum mod 2^64, rows with it

    void Add(const std::map<std::string, uint64_t> &counters)
    {
        ++rows;
        for (const auto &[member, value] : counters) {
            auto &[sum, count] = byMember[member];
            sum += value;
            ++count;
        }
    }

    std::optional<uint64_t> Of(const std::string &member) const
    {
        const auto found = byMember.find(member);
        if (rows == 0 || found == byMember.end() || found->second.second != rows)
            return std::nullopt;
        return found->second.first;
    }
};

// Where a row's counters come from.
enum class Counters { FromRecord, FromSums, None };

class Builder {
public:
    Builder(std::vector<Entry> &entries, SampleMemory &memory, uint32_t upTime)
        : entries_(entries), memory_(memory), upTime_(upTime)
    {
    }

    void Add(Oid oid, Value value) { entries_.push_back({std::move(oid), std::move(value)}); }

    // The cells of a group's scalars (index 0) or of a table's row.
    // `counters` says where the counters come from; returns those found, by member.
    std::map<std::string, uint64_t> AddCells(Section section, uint32_t index, const Json::Value *record,
                                             Counters counters, const Sums *sums = nullptr)
    {
        const uint32_t group = korvcatalogue::SnmpGroupOf(section);
        seen_.insert({group, index});  // a row without counters now keeps those last seen
        std::map<std::string, uint64_t> found;
        std::map<uint32_t, uint64_t> byNumber;
        const Statistic *discontinuity = nullptr;
        for (const Statistic *statistic : korvcatalogue::StatisticsOf(section)) {
            const Statistic &s = *statistic;
            const Json::Value *member = Member(record, s.member);
            Oid oid = Cell(group, s.snmpNumber, index);
            switch (s.kind) {
            case Kind::Index:
            case Kind::Enumeration:  // the caller's
                break;
            case Kind::Discontinuity:
                discontinuity = statistic;
                break;
            case Kind::Name:
                if (std::optional<std::string> text = Text(member))
                    Add(std::move(oid), {ValueType::Text, 0,
                                         korvcatalogue::ValidUtf8(*text, korvcatalogue::kAdminStringSize)});
                break;
            case Kind::Counter:
                if (s.syntax == Syntax::Counter64) {
                    std::optional<uint64_t> value;
                    if (counters == Counters::FromRecord)
                        value = Counter(member, s, index);
                    else if (counters == Counters::FromSums && sums != nullptr)
                        value = sums->Of(s.member);
                    if (value) {
                        found[s.member] = *value;
                        byNumber[s.snmpNumber] = *value;
                        Add(std::move(oid), {ValueType::Counter64, *value, {}});
                    }
                    break;
                }
                [[fallthrough]];
            default:
                if (std::optional<uint64_t> number = Number(member)) {
                    const bool wide = s.syntax == Syntax::CounterBasedGauge64 || s.syntax == Syntax::Counter64;
                    Add(std::move(oid), {TypeOf(s.syntax), wide ? *number : std::min(*number, kMax32), {}});
                }
                break;
            }
        }
        if (discontinuity != nullptr && !byNumber.empty())
            Add(Cell(group, discontinuity->snmpNumber, index),
                {ValueType::TimeStamp, Discontinuity(group, index, byNumber), {}});
        return found;
    }

    // A group's scalar (index 0: group.number.0) or a table's cell (table.1.column.index).
    static Oid Cell(uint32_t group, uint32_t number, uint32_t index)
    {
        Oid oid = ObjectsOid();
        if (index == 0)
            oid.insert(oid.end(), {group, number, 0});
        else
            oid.insert(oid.end(), {group, kEntry, number, index});
        return oid;
    }

    // Forgets the rows that this sample did not have, and logs a change in
    // the number of bad counter values.
    void Finish()
    {
        for (auto row = memory_.rows.begin(); row != memory_.rows.end();)
            row = row->first.second != 0 && seen_.count(row->first) == 0 ? memory_.rows.erase(row)
                                                                           : std::next(row);
        if (bad_ != 0 && bad_ != memory_.badCounters)
            KORVSNMP_LOG(LOG_WARNING,
                         "Counter values that are not integers from 0 to 2^64 - 1 are left out: "
                         "%zu in this sample, the first %s",
                         bad_, firstBad_.c_str());
        memory_.badCounters = bad_;
    }

private:
    static ValueType TypeOf(Syntax syntax)
    {
        switch (syntax) {
        case Syntax::Unsigned32: return ValueType::Unsigned32;
        case Syntax::Counter32: return ValueType::Counter32;
        case Syntax::CounterBasedGauge64:
        case Syntax::Counter64: return ValueType::Counter64;
        case Syntax::Integer: return ValueType::Integer;
        default: return ValueType::Gauge32;
        }
    }

    // A counter member: an integer from 0 to 2^64 - 1 as JSON writes it.
    // Anything else but a missing member counts as bad.
    std::optional<uint64_t> Counter(const Json::Value *member, const Statistic &statistic, uint32_t index)
    {
        if (member == nullptr)
            return std::nullopt;
        if (member->type() == Json::uintValue || (member->type() == Json::intValue && member->asInt64() >= 0))
            return member->asUInt64();
        if (bad_++ == 0)
            firstBad_ = statistic.snmpObject + "." + std::to_string(index);
        return std::nullopt;
    }

    uint32_t Discontinuity(uint32_t group, uint32_t index, const std::map<uint32_t, uint64_t> &counters)
    {
        const std::pair<uint32_t, uint32_t> key{group, index};
        auto found = memory_.rows.find(key);
        if (found == memory_.rows.end()) {
            found = memory_.rows.emplace(key, SampleMemory::Counters{}).first;
            found->second.discontinuity = upTime_;
        }
        SampleMemory::Counters &row = found->second;
        for (const auto &[number, value] : counters) {
            const auto last = row.last.find(number);
            if (last != row.last.end() && value < last->second)
                row.discontinuity = upTime_;
            row.last[number] = value;
        }
        return row.discontinuity;
    }

    std::vector<Entry> &entries_;
    SampleMemory &memory_;
    const uint32_t upTime_;
    std::set<std::pair<uint32_t, uint32_t>> seen_;
    size_t bad_ = 0;
    std::string firstBad_;
};

// The rows of a table and the identity of each.
struct Rows {
    std::vector<const Json::Value *> records;
    std::vector<std::string> identities;
};

Rows RowsOf(Section section, const Json::Value *array)
{
    Rows rows;
    rows.records = Records(array);
    const std::string member = IdentityMember(section);
    for (const Json::Value *record : rows.records)
        rows.identities.push_back(Text(Member(record, member)).value_or(""));
    return rows;
}

const Statistic *EnumerationOf(Section section)
{
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(section))
        if (statistic->kind == Kind::Enumeration)
            return statistic;
    return nullptr;
}

void AddAgent(Builder &builder, const Json::Value &result, uint32_t intervalSeconds)
{
    const uint32_t group = korvcatalogue::SnmpGroupOf(Section::Agent);
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(Section::Agent)) {
        Oid oid = Builder::Cell(group, statistic->snmpNumber, 0);
        if (statistic->snmpNumber == kSnapshotAge)
            builder.Add(std::move(oid), {ValueType::SnapshotAge, 0, {}});
        else if (statistic->snmpNumber == kFailedSamples)
            builder.Add(std::move(oid), {ValueType::FailedSamples, 0, {}});
        else if (statistic->snmpNumber == kSampleInterval)
            builder.Add(std::move(oid), {ValueType::Unsigned32, intervalSeconds, {}});
    }
    builder.AddCells(Section::Agent, 0, &result, Counters::FromRecord);
}

// A table of block devices (disks or volumes) and its total group: the
// total's record gives its rates, the rows' sums its counters.
void AddBlockTable(Builder &builder, Section table, Section total, const Json::Value *section,
                   const char *rowsMember, RowIndexes &indexes)
{
    const Rows rows = RowsOf(table, Member(section, rowsMember));
    const std::vector<uint32_t> index = indexes.Assign(rows.identities);
    const Statistic *enumeration = EnumerationOf(table);
    Sums sums;
    for (size_t i = 0; i < rows.records.size(); ++i) {
        sums.Add(builder.AddCells(table, index[i], rows.records[i], Counters::FromRecord));
        if (enumeration != nullptr)
            builder.Add(Builder::Cell(korvcatalogue::SnmpGroupOf(table), enumeration->snmpNumber, index[i]),
                        {ValueType::Integer,
                         static_cast<uint64_t>(DiskTypeOf(Member(rows.records[i], enumeration->member))),
                         {}});
    }
    const Json::Value *totalRecord = Member(section, "total");
    if (totalRecord != nullptr && totalRecord->isObject())
        builder.AddCells(total, 0, totalRecord, Counters::None);
    if (sums.rows != 0)
        builder.AddCells(total, 0, nullptr, Counters::FromSums, &sums);
}

// The interface table: the library's total row takes its counters from the
// rows of kind interface; aggregation rows have none.
void AddInterfaces(Builder &builder, const Json::Value &result, const NetworkKinds &kinds, RowIndexes &indexes)
{
    const Section section = Section::Interface;
    Rows rows = RowsOf(section, Member(&result, korvcatalogue::ResultMemberOf(section)));
    std::vector<IfKind> rowKinds;
    for (size_t i = 0; i < rows.records.size(); ++i) {
        rowKinds.push_back(IfKindOf(i, rows.identities[i], kinds));
        rows.identities[i] = std::to_string(static_cast<uint32_t>(rowKinds[i])) + ':' + rows.identities[i];
    }
    const std::vector<uint32_t> index = indexes.Assign(rows.identities);
    const Statistic *enumeration = EnumerationOf(section);
    Sums interfaces;
    std::vector<size_t> totals;
    for (size_t i = 0; i < rows.records.size(); ++i) {
        if (enumeration != nullptr)
            builder.Add(Builder::Cell(korvcatalogue::SnmpGroupOf(section), enumeration->snmpNumber, index[i]),
                        {ValueType::Integer, static_cast<uint64_t>(rowKinds[i]), {}});
        if (rowKinds[i] == IfKind::Total) {
            totals.push_back(i);  // after the sums
            continue;
        }
        const auto counters = rowKinds[i] == IfKind::Aggregation ? Counters::None : Counters::FromRecord;
        const auto found = builder.AddCells(section, index[i], rows.records[i], counters);
        if (rowKinds[i] == IfKind::Interface)
            interfaces.Add(found);
    }
    for (size_t i : totals)
        builder.AddCells(section, index[i], rows.records[i], Counters::FromSums, &interfaces);
}

bool StartsWith(const Oid &oid, const Oid &prefix)
{
    return oid.size() >= prefix.size() && std::equal(prefix.begin(), prefix.end(), oid.begin());
}

}  // namespace

bool IsInstanceOfKnownObject(const Oid &oid)
{
    // The objects' OIDs below korvObjects without their instance: group.number or table.1.column.
    static const std::set<Oid> kObjectsBelow = [] {
        std::set<Oid> objects;
        for (const Statistic &statistic : korvcatalogue::Statistics()) {
            const uint32_t group = korvcatalogue::SnmpGroupOf(statistic.section);
            if (statistic.syntax == Syntax::None || statistic.kind == Kind::Index)
                continue;
            if (IsTable(statistic.section))
                objects.insert({group, kEntry, statistic.snmpNumber});
            else
                objects.insert({group, statistic.snmpNumber});
        }
        return objects;
    }();
    const Oid objects = ObjectsOid();
    const size_t at = objects.size();
    if (!StartsWith(oid, objects) || oid.size() <= at + 2)
        return false;
    const Oid below(oid.begin() + static_cast<std::ptrdiff_t>(at), oid.end() - 1);  // the instance: one arc
    if (kObjectsBelow.count(below) == 0)
        return false;
    return below.size() == 3 || oid.back() == 0;
}

Snapshot BuildSnapshot(const Json::Value &result, const NetworkKinds &kinds, SampleMemory &memory,
                       uint32_t intervalSeconds, uint32_t upTime, std::chrono::steady_clock::time_point taken)
{
    Snapshot snapshot;
    snapshot.taken = taken;
    Builder builder(snapshot.entries, memory, upTime);
    AddAgent(builder, result, intervalSeconds);
    for (Section section : {Section::Cpu, Section::Memory, Section::Nfs}) {
        const Json::Value *record = Member(&result, korvcatalogue::ResultMemberOf(section));
        if (record != nullptr && record->isObject())
            builder.AddCells(section, 0, record, Counters::FromRecord);
    }
    AddBlockTable(builder, Section::Disk, Section::DiskTotal,
                  Member(&result, korvcatalogue::ResultMemberOf(Section::Disk)), "disk", memory.indexes.disk);
    AddInterfaces(builder, result, kinds, memory.indexes.interface);
    AddBlockTable(builder, Section::Volume, Section::VolumeTotal,
                  Member(&result, korvcatalogue::ResultMemberOf(Section::Volume)), "volume",
                  memory.indexes.volume);
    const Rows luns = RowsOf(Section::Lun, Member(&result, korvcatalogue::ResultMemberOf(Section::Lun)));
    const std::vector<uint32_t> lunIndex = memory.indexes.lun.Assign(luns.identities);
    for (size_t i = 0; i < luns.records.size(); ++i)
        builder.AddCells(Section::Lun, lunIndex[i], luns.records[i], Counters::FromRecord);
    builder.Finish();

    std::sort(snapshot.entries.begin(), snapshot.entries.end(),
              [](const Entry &a, const Entry &b) { return a.oid < b.oid; });
    return snapshot;
}

}  // namespace korvagentx
