// The result of SNMPParseReplyData as KORVSNMP-MIB's objects.
#include "snapshot.h"

#include <algorithm>
#include <iterator>
#include <optional>

#include "mib_layout.h"

namespace korvagentx {

namespace {

constexpr uint64_t kMax32 = 0xFFFFFFFFull;
constexpr size_t kDisplayStringSize = 255;  // DisplayString's SIZE (0..255)

// A member of an object, or nullptr (for a missing member or a non-object:
// jsoncpp's lookups throw on arrays and scalars).
const Json::Value *Member(const Json::Value &value, const char *name)
{
    if (!value.isObject())
        return nullptr;
    return value.find(name, name + std::char_traits<char>::length(name));
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

struct Column {
    uint32_t number;
    const char *member;
    ValueType type;
};

class Builder {
public:
    explicit Builder(std::vector<Entry> &entries) : entries_(entries) {}

    Oid Under(std::initializer_list<uint32_t> tail) const
    {
        Oid oid(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
        oid.push_back(kObjects);
        oid.insert(oid.end(), tail);
        return oid;
    }

    void Add(Oid oid, Value value) { entries_.push_back({std::move(oid), std::move(value)}); }

    // A counter, clamped to 32 bits unless it is a Counter64.
    void AddNumber(Oid oid, ValueType type, const Json::Value *member)
    {
        std::optional<uint64_t> number = Number(member);
        if (!number)
            return;
        uint64_t value = type == ValueType::Counter64 ? *number : std::min(*number, kMax32);
        Add(std::move(oid), {type, value, {}});
    }

    void AddText(Oid oid, const Json::Value *member)
    {
        if (std::optional<std::string> text = Text(member))
            Add(std::move(oid), {ValueType::Text, 0, text->substr(0, kDisplayStringSize)});
    }

    void AddColumns(uint32_t group, const Json::Value *record, std::initializer_list<Column> columns)
    {
        if (record == nullptr)
            return;
        for (const Column &column : columns)
            AddNumber(Under({group, column.number, 0}), column.type, Member(*record, column.member));
    }

    void AddRowColumns(uint32_t table, uint32_t index, const Json::Value &record,
                       std::initializer_list<Column> columns)
    {
        for (const Column &column : columns) {
            Oid oid = Under({table, 1, column.number, index});
            if (column.type == ValueType::Text)
                AddText(std::move(oid), Member(record, column.member));
            else
                AddNumber(std::move(oid), column.type, Member(record, column.member));
        }
    }

private:
    std::vector<Entry> &entries_;
};

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

// Row keys: the device (with its kind, for interfaces), numbered when it
// occurs more than once in one sample.
std::vector<std::string> Keys(const std::vector<std::string> &names)
{
    std::map<std::string, unsigned> seen;
    std::vector<std::string> keys;
    for (const std::string &name : names)
        keys.push_back(name + '\x1f' + std::to_string(seen[name]++));
    return keys;
}

std::string DeviceOf(const Json::Value &record, const char *member)
{
    return Text(Member(record, member)).value_or("");
}


DiskType DiskTypeOf(const Json::Value &record)
{
    static const std::pair<const char *, DiskType> kTypes[] = {
        {"internal", DiskType::Internal}, {"ebox", DiskType::Ebox},
        {"usb", DiskType::Usb},           {"eSATA", DiskType::Esata}};
    const std::string type = DeviceOf(record, "type");
    for (const auto &[name, value] : kTypes)
        if (type == name)
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

void AddDisks(Builder &builder, const Json::Value &result, RowIndexes &indexes)
{
    const Json::Value *disk = Member(result, "disk");
    const Json::Value *total = disk ? Member(*disk, "total") : nullptr;
    if (total != nullptr)
        builder.AddColumns(kDiskTotalGroup, total,
                           {{1, "utilization", ValueType::Gauge32},
                            {2, "read_access", ValueType::Counter64},
                            {3, "read_byte", ValueType::Counter64},
                            {4, "write_access", ValueType::Counter64},
                            {5, "write_byte", ValueType::Counter64}});
    std::vector<const Json::Value *> rows = Records(disk ? Member(*disk, "disk") : nullptr);
    std::vector<std::string> names;
    for (const Json::Value *row : rows)
        names.push_back(DeviceOf(*row, "device"));
    std::vector<uint32_t> index = indexes.Assign(Keys(names));
    for (size_t i = 0; i < rows.size(); ++i) {
        builder.AddRowColumns(kDiskTable, index[i], *rows[i],
                              {{2, "device", ValueType::Text},
                               {3, "display_name", ValueType::Text},
                               {5, "utilization", ValueType::Gauge32},
                               {6, "read_access", ValueType::Gauge32},
                               {7, "read_byte", ValueType::Gauge32},
                               {8, "write_access", ValueType::Gauge32},
                               {9, "write_byte", ValueType::Gauge32}});
        builder.Add(builder.Under({kDiskTable, 1, 4, index[i]}),
                    {ValueType::Integer, static_cast<uint64_t>(DiskTypeOf(*rows[i])), {}});
    }
}

void AddInterfaces(Builder &builder, const Json::Value &result, const NetworkKinds &kinds,
                   RowIndexes &indexes)
{
    std::vector<const Json::Value *> rows = Records(Member(result, "network"));
    std::vector<std::string> keys;
    std::vector<IfKind> rowKinds;
    for (size_t i = 0; i < rows.size(); ++i) {
        const std::string device = DeviceOf(*rows[i], "device");
        rowKinds.push_back(IfKindOf(i, device, kinds));
        keys.push_back(std::to_string(static_cast<uint32_t>(rowKinds.back())) + ':' + device);
    }
    std::vector<uint32_t> index = indexes.Assign(Keys(keys));
    for (size_t i = 0; i < rows.size(); ++i) {
        builder.AddRowColumns(kIfTable, index[i], *rows[i],
                              {{2, "device", ValueType::Text},
                               {4, "rx", ValueType::Gauge32},
                               {5, "tx", ValueType::Gauge32}});
        builder.Add(builder.Under({kIfTable, 1, 3, index[i]}),
                    {ValueType::Integer, static_cast<uint64_t>(rowKinds[i]), {}});
    }
}

void AddVolumes(Builder &builder, const Json::Value &result, RowIndexes &indexes)
{
    const Json::Value *space = Member(result, "space");
    const Json::Value *total = space ? Member(*space, "total") : nullptr;
    if (total != nullptr)
        builder.AddColumns(kVolumeTotalGroup, total,
                           {{1, "utilization", ValueType::Gauge32},
                            {2, "read_access", ValueType::Counter64},
                            {3, "read_byte", ValueType::Counter64},
                            {4, "write_access", ValueType::Counter64},
                            {5, "write_byte", ValueType::Counter64}});
    std::vector<const Json::Value *> rows = Records(space ? Member(*space, "volume") : nullptr);
    std::vector<std::string> names;
    for (const Json::Value *row : rows)
        names.push_back(DeviceOf(*row, "device"));
    std::vector<uint32_t> index = indexes.Assign(Keys(names));
    for (size_t i = 0; i < rows.size(); ++i)
        builder.AddRowColumns(kVolumeTable, index[i], *rows[i],
                              {{2, "device", ValueType::Text},
                               {3, "display_name", ValueType::Text},
                               {4, "utilization", ValueType::Gauge32},
                               {5, "read_access", ValueType::Gauge32},
                               {6, "read_byte", ValueType::Gauge32},
                               {7, "write_access", ValueType::Gauge32},
                               {8, "write_byte", ValueType::Gauge32}});
}

void AddLuns(Builder &builder, const Json::Value &result, RowIndexes &indexes)
{
    std::vector<const Json::Value *> rows = Records(Member(result, "lun"));
    std::vector<std::string> uuids;
    for (const Json::Value *row : rows)
        uuids.push_back(DeviceOf(*row, "uuid"));
    std::vector<uint32_t> index = indexes.Assign(Keys(uuids));
    for (size_t i = 0; i < rows.size(); ++i)
        builder.AddRowColumns(kLunTable, index[i], *rows[i],
                              {{2, "uuid", ValueType::Text},
                               {3, "lun_name", ValueType::Text},
                               {4, "utilization", ValueType::Gauge32},
                               {5, "read_access", ValueType::Gauge32},
                               {6, "read_byte", ValueType::Gauge32},
                               {7, "write_access", ValueType::Gauge32},
                               {8, "write_byte", ValueType::Gauge32}});
}

bool StartsWith(const Oid &oid, const Oid &prefix)
{
    return oid.size() >= prefix.size() && std::equal(prefix.begin(), prefix.end(), oid.begin());
}

}  // namespace

std::vector<uint32_t> RowIndexes::Assign(const std::vector<std::string> &keys)
{
    std::map<std::string, uint32_t> kept;
    std::vector<uint32_t> result;
    for (const std::string &key : keys) {
        auto found = indexes_.find(key);
        uint32_t index = found != indexes_.end() ? found->second : next_++;
        if (next_ == 0)  // after 2^32 - 1 devices: start over
            next_ = 1;
        kept[key] = index;
        result.push_back(index);
    }
    indexes_ = std::move(kept);
    return result;
}

const Entry *Snapshot::Find(const Oid &oid) const
{
    auto found = std::lower_bound(entries.begin(), entries.end(), oid,
                                  [](const Entry &entry, const Oid &key) { return entry.oid < key; });
    return found != entries.end() && found->oid == oid ? &*found : nullptr;
}

const Entry *Snapshot::FindNext(const Oid &oid) const
{
    auto found = std::upper_bound(entries.begin(), entries.end(), oid,
                                  [](const Oid &key, const Entry &entry) { return key < entry.oid; });
    return found != entries.end() ? &*found : nullptr;
}

bool IsInstanceOfKnownObject(const Oid &oid)
{
    struct Group {
        uint32_t number;
        uint32_t objects;  // scalars 1..objects, or columns 2..objects of a table
        bool table;
    };
    static const Group kGroups[] = {
        {kAgentGroup, 4, false},       {kCpuGroup, 8, false},  {kMemoryGroup, 8, false},
        {kNfsGroup, 3, false},         {kDiskTotalGroup, 5, false}, {kDiskTable, 9, true},
        {kIfTable, 5, true},           {kVolumeTotalGroup, 5, false}, {kVolumeTable, 8, true},
        {kLunTable, 8, true},
    };
    Oid objects(std::begin(kKorvsnmpArc), std::end(kKorvsnmpArc));
    objects.push_back(kObjects);
    if (!StartsWith(oid, objects))
        return false;
    const size_t at = objects.size();
    for (const Group &group : kGroups) {
        if (oid.size() <= at || oid[at] != group.number)
            continue;
        if (!group.table)  // group.N.0
            return oid.size() == at + 3 && oid[at + 1] >= 1 && oid[at + 1] <= group.objects &&
                   oid[at + 2] == 0;
        // table.1.column.index
        return oid.size() == at + 4 && oid[at + 1] == 1 && oid[at + 2] >= 2 &&
               oid[at + 2] <= group.objects;
    }
    return false;
}

Snapshot BuildSnapshot(const Json::Value &result, const NetworkKinds &kinds, TableIndexes &indexes,
                       uint32_t intervalSeconds, std::chrono::steady_clock::time_point taken)
{
    Snapshot snapshot;
    snapshot.taken = taken;
    Builder builder(snapshot.entries);

    builder.AddNumber(builder.Under({kAgentGroup, kSampleTime, 0}), ValueType::Unsigned32,
                      Member(result, "time"));
    builder.Add(builder.Under({kAgentGroup, kSnapshotAge, 0}), {ValueType::SnapshotAge, 0, {}});
    builder.Add(builder.Under({kAgentGroup, kFailedSamples, 0}), {ValueType::FailedSamples, 0, {}});
    builder.Add(builder.Under({kAgentGroup, kSampleInterval, 0}),
                {ValueType::Unsigned32, intervalSeconds, {}});

    builder.AddColumns(kCpuGroup, Member(result, "cpu"),
                       {{1, "user", ValueType::Gauge32}, {2, "nice", ValueType::Gauge32},
                        {3, "system", ValueType::Gauge32}, {4, "idle", ValueType::Gauge32},
                        {5, "iowait", ValueType::Gauge32}, {6, "irq", ValueType::Gauge32},
                        {7, "softirq", ValueType::Gauge32}, {8, "steal", ValueType::Gauge32}});
    builder.AddColumns(kMemoryGroup, Member(result, "memory"),
                       {{1, "memory_size", ValueType::Gauge32}, {2, "total_real", ValueType::Gauge32},
                        {3, "avail_real", ValueType::Gauge32}, {4, "free_real", ValueType::Gauge32},
                        {5, "cached", ValueType::Gauge32}, {6, "buffer", ValueType::Gauge32},
                        {7, "total_swap", ValueType::Gauge32}, {8, "avail_swap", ValueType::Gauge32}});
    builder.AddColumns(kNfsGroup, Member(result, "nfs"),
                       {{1, "calls", ValueType::Gauge32}, {2, "read_byte", ValueType::Gauge32},
                        {3, "write_byte", ValueType::Gauge32}});
    AddDisks(builder, result, indexes.disk);
    AddInterfaces(builder, result, kinds, indexes.interface);
    AddVolumes(builder, result, indexes.volume);
    AddLuns(builder, result, indexes.lun);

    std::sort(snapshot.entries.begin(), snapshot.entries.end(),
              [](const Entry &a, const Entry &b) { return a.oid < b.oid; });
    return snapshot;
}

}  // namespace korvagentx
