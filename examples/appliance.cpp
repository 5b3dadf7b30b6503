#include "appliance.h"

#include <algorithm>

#include "catalogue/statistics_catalogue.h"

namespace korvexample {
namespace {

using korvstandin::ExpansionUnit;
using korvstandin::HostDescription;
using korvstandin::NetInterface;
using korvstandin::NetRole;

constexpr unsigned int kMemorySize = 16777216;
constexpr unsigned int kSampleTime = 1795000000;
constexpr unsigned int kRx = 123456;
constexpr unsigned int kTx = 654321;
constexpr unsigned int kPercent = 100;
constexpr int kFirstVlanId = 10;
constexpr uint64_t kUptimeSeconds = 864000;  // ten days since boot
constexpr uint64_t kMsPerPercent = 10;        // busy milliseconds a second per percent
constexpr uint64_t kBytesPerMiB = 1048576;
constexpr uint64_t kBytesPerPacket = 1024;
constexpr uint64_t kRarerBy = 1000;           // each later count of a direction: errors, drops
constexpr char kTotalSuffix[] = "_total";

// sda ... sdz, sdaa ...
std::string DiskName(int index)
{
    std::string name = "sd";
    if (index >= 26)
        name += static_cast<char>('a' + index / 26 - 1);
    return name + static_cast<char>('a' + index % 26);
}

Json::Value Device(const std::string &name)
{
    Json::Value record(Json::objectValue);
    record["device"] = name;
    return record;
}

Json::Value Counters(Json::Value record, unsigned int seed)
{
    record["utilization"] = seed % kPercent;
    record["read_access"] = seed * 3;
    record["read_byte"] = seed * 4096;
    record["write_access"] = seed * 5;
    record["write_byte"] = seed * 8192;
    return record;
}

Json::Value Traffic(const std::string &name)
{
    Json::Value record = Device(name);
    record["rx"] = kRx;
    record["tx"] = kTx;
    return record;
}

void AddDisks(const ApplianceShape &shape, HostDescription &host, Json::Value &diskIO)
{
    int index = 0;
    for (int bay = 0; bay < shape.internalDisks; ++bay, ++index)
        host.disks.push_back({bay + 1, DISK_CONTAINER_INTERNAL, 0, "/dev/" + DiskName(index)});
    for (int cache = 0; cache < shape.ssdCacheDisks; ++cache, ++index)
        host.disks.push_back(
            {shape.internalDisks + cache + 1, DISK_CONTAINER_SSD_CACHE, 0, "/dev/" + DiskName(index)});
    host.supportsEBox = shape.expansionUnits > 0;
    for (int unit = 0; unit < shape.expansionUnits; ++unit) {
        ExpansionUnit expansion{static_cast<unsigned int>(unit + 1), {}, std::string("Korvel-X5"), true};
        for (int slot = 0; slot < shape.disksPerUnit; ++slot, ++index) {
            host.disks.push_back({slot + 1, DISK_CONTAINER_EBOX, 0, "/dev/" + DiskName(index)});
            expansion.diskPaths.push_back("/dev/" + DiskName(index));
        }
        host.expansionUnits.push_back(expansion);
    }
    for (int i = 0; i < shape.usbDevices; ++i, ++index)
        host.usb.devices.push_back({DiskName(index), "USB Disk " + std::to_string(i + 1)});
    for (int i = 0; i < shape.esataDevices; ++i, ++index)
        host.esata.devices.push_back({DiskName(index), "eSATA Disk " + std::to_string(i + 1)});
    for (int i = 0; i < index; ++i)
        diskIO.append(Counters(Device(DiskName(i)), static_cast<unsigned int>(i + 1)));
}

void AddInterfaces(const ApplianceShape &shape, HostDescription &host, Json::Value &network)
{
    for (int i = 0; i < shape.plainInterfaces; ++i)
        host.interfaces.push_back({"eth" + std::to_string(i)});
    for (int i = 0; i < shape.vlans; ++i) {
        const std::string name = "eth0." + std::to_string(i + kFirstVlanId);
        host.interfaces.push_back({name, NetRole::Vlan, "eth0", name});
    }
    for (int i = 0; i < shape.aggregations; ++i) {
        const int first = std::max(0, shape.plainInterfaces - 2 * (shape.aggregations - i));
        host.interfaces.push_back({"bond" + std::to_string(i), NetRole::Aggregation, "", "",
                                   {"eth" + std::to_string(first), "eth" + std::to_string(first + 1)}});
    }
    for (int i = 0; i < shape.ovsMasters; ++i)
        host.interfaces.push_back({"ovs-br" + std::to_string(i), NetRole::OvsMaster});
    for (const NetInterface &entry : host.interfaces)
        network.append(Traffic(entry.role == NetRole::OvsMaster ? entry.name.substr(4) : entry.name));
    if (shape.pppoe) {
        host.pppoeInterface = "ppp0";
        network.append(Traffic("ppp0"));
    }
}

void AddSpaces(const ApplianceShape &shape, const std::vector<SpaceDevice> &devices,
               HostDescription &host, Json::Value &spaceIO)
{
    const size_t spaces = std::min(devices.size(), static_cast<size_t>(std::max(shape.spaces, 0)));
    for (size_t i = 0; i < spaces; ++i) {
        host.spaces.push_back({devices[i].path, "volume" + std::to_string(i + 1)});
        spaceIO.append(Counters(Device(devices[i].kernelName), static_cast<unsigned int>(i + 7)));
    }
    const size_t caches = std::min({devices.size() - spaces, spaces, static_cast<size_t>(std::max(shape.flashCaches, 0))});
    for (size_t i = 0; i < caches; ++i) {
        const SpaceDevice &layer = devices[spaces + i];
        host.flashCaches.push_back({devices[i].path, "/volume" + std::to_string(i + 1), layer.path});
        spaceIO.append(Counters(Device(layer.kernelName), static_cast<unsigned int>(spaces + i + 7)));
    }
    spaceIO.append(Counters(Device("total"), 99));
}

void AddLuns(const ApplianceShape &shape, HostDescription &host, Json::Value &iscsi)
{
    for (int i = 0; i < shape.luns; ++i) {
        const std::string uuid = "6001405f-0000-4000-8000-" + std::to_string(100000000000 + i);
        host.luns.push_back({Json::Value(uuid), Json::Value("LUN-" + std::to_string(i + 1))});
        iscsi.append(Counters(Device(uuid), static_cast<unsigned int>(i + 3)));
    }
}


using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;
using korvcatalogue::Unit;

std::string FirstWord(const std::string &member) { return member.substr(0, member.find('_')); }

uint64_t Number(const Json::Value &record, const std::string &member)
{
    const Json::Value *value = record.find(member.data(), member.data() + member.size());
    return value != nullptr && value->isUInt64() ? value->asUInt64() : 0;
}

// What a counter would read had the record's rates held since boot. A rate's
// counter bears its name ("read_byte" counts on as "read_byte_total"). The
// others follow the statistics before them in the catalogue: CPU ticks and
// interface bytes the rate of their first word ("user", "rx"), busy time the
// share of time, mebibytes the byte rate of their first word, and a count
// without a rate the record's operation rates together (a LUN's commands)
// or else the byte counter of its first word, each later count rarer
// (packets, errors, drops).
uint64_t SinceBoot(const Statistic &counter, const Json::Value &record)
{
    const std::string base = counter.member.substr(0, counter.member.size() - sizeof kTotalSuffix + 1);
    if (korvcatalogue::Find(counter.section, base) != nullptr)
        return Number(record, base) * kUptimeSeconds;
    uint64_t perSecond = 0;
    uint64_t bytes = 0;
    uint64_t rarer = 1;
    for (const Statistic *other : korvcatalogue::StatisticsOf(counter.section)) {
        if (other == &counter)
            break;
        const bool sameWord = FirstWord(other->member) == FirstWord(counter.member);
        const uint64_t value = Number(record, other->member);
        if (counter.unit == Unit::Milliseconds && other->kind == Kind::Share)
            perSecond = value * kMsPerPercent;
        else if (counter.unit != Unit::Operations && sameWord && other->kind != Kind::Counter &&
                 (counter.unit != Unit::MiB || other->unit == Unit::BytesPerSecond))
            perSecond = value;
        else if (counter.unit == Unit::Operations && other->unit == Unit::PerSecond)
            perSecond += value;
        else if (counter.unit == Unit::Operations && sameWord && other->unit == Unit::Bytes)
            bytes = value;
        else if (counter.unit == Unit::Operations && sameWord && other->unit == Unit::Operations)
            rarer *= kRarerBy;
    }
    if (counter.unit == Unit::MiB)
        return perSecond * kUptimeSeconds / kBytesPerMiB;
    if (counter.unit == Unit::Operations && perSecond == 0)
        return bytes / kBytesPerPacket / rarer;
    return perSecond * kUptimeSeconds;
}

// Adds the cumulative counters of `section` to `record`, in the catalogue's order.
void AddCounters(Section section, Json::Value &record)
{
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(section))
        if (statistic->kind == Kind::Counter)
            record[statistic->member] = Json::UInt64(SinceBoot(*statistic, record));
}

// The same for each record of `records` but the collector's own "total",
// whose counters a consumer sums from the rows.
void AddCountersToEach(Section section, Json::Value &records)
{
    for (Json::Value &record : records)
        if (record["device"] != "total")
            AddCounters(section, record);
}

}  // namespace

ApplianceShape LargeAppliance() { return ApplianceShape{}; }

ApplianceShape SmallAppliance()
{
    ApplianceShape shape;
    shape.internalDisks = 2;
    shape.ssdCacheDisks = 1;
    shape.expansionUnits = 1;
    shape.disksPerUnit = 2;
    shape.usbDevices = 1;
    shape.esataDevices = 1;
    shape.plainInterfaces = 4;
    shape.vlans = 1;
    shape.aggregations = 1;
    shape.ovsMasters = 1;
    shape.spaces = 3;
    shape.flashCaches = 1;
    shape.luns = 2;
    return shape;
}

int SpaceDeviceCount(const ApplianceShape &shape)
{
    return std::max(shape.spaces, 0) + std::clamp(shape.flashCaches, 0, std::max(shape.spaces, 0));
}

std::vector<SpaceDevice> ApplianceSpaceDevices(const ApplianceShape &shape)
{
    std::vector<SpaceDevice> devices;
    for (int i = 0; i < shape.spaces; ++i)
        devices.push_back({"/dev/mapper/vg" + std::to_string(i + 1) + "-volume_" + std::to_string(i + 1),
                           "dm-" + std::to_string(i)});
    for (int i = 0; i < SpaceDeviceCount(shape) - shape.spaces; ++i)
        devices.push_back({"/dev/mapper/cachedev_" + std::to_string(i + 1),
                           "dm-" + std::to_string(shape.spaces + i)});
    return devices;
}

Appliance MakeAppliance(const ApplianceShape &shape, const std::vector<SpaceDevice> &spaceDevices)
{
    Appliance appliance;
    HostDescription &host = appliance.host;
    host.physMemSize = kMemorySize;
    host.files[korvstandin::kStringsFilePath]["volume"] = {{"volume_disk", "Disk"},
                                                          {"volume_expansion", "Expansion Unit"},
                                                          {"dedicated_ssd_cache", "SSD Cache"}};
    Json::Value &data = appliance.reply["data"] = Json::Value(Json::objectValue);
    Json::Value cpu(Json::objectValue);
    cpu["user"] = 12;
    cpu["system"] = 5;
    cpu["idle"] = 83;
    data["System"].append(cpu);
    Json::Value memory(Json::objectValue);
    memory["total_real"] = kMemorySize;
    memory["avail_real"] = 9000000;
    data["Memory"].append(memory);
    AddInterfaces(shape, host, data["Network"] = Json::Value(Json::arrayValue));
    AddDisks(shape, host, data["DiskIO"] = Json::Value(Json::arrayValue));
    AddSpaces(shape, spaceDevices, host, data["SpaceIO"] = Json::Value(Json::arrayValue));
    AddLuns(shape, host, data["iSCSI"] = Json::Value(Json::arrayValue));
    data["NFS"]["calls"] = 30;
    data["NFS"]["read_byte"] = 1048576;
    data["NFS"]["write_byte"] = 524288;
    data["time"] = kSampleTime;
    AddCounters(Section::Cpu, data["System"][0]);
    AddCountersToEach(Section::Interface, data["Network"]);
    AddCountersToEach(Section::Disk, data["DiskIO"]);
    AddCountersToEach(Section::Volume, data["SpaceIO"]);
    AddCountersToEach(Section::Lun, data["iSCSI"]);
    AddCounters(Section::Nfs, data["NFS"]);
    return appliance;
}

}  // namespace korvexample
