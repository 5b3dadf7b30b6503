#include "reply.h"

#include <algorithm>
#include <initializer_list>
#include <memory>

#include "catalogue/statistics_catalogue.h"
#include "protocol/collector_protocol.h"
#include "protocol/unit_log.h"

namespace korvsnmpcd {
namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvcatalogue::Statistic;

constexpr char kLogUnit[] = "reply";
constexpr char kReloadRequest[] = "reload";
constexpr char kHistoryModeRequest[] = "history_mode";
constexpr char kDeviceMember[] = "device";
constexpr char kSpaceTotalDevice[] = "total";

// A record's values in the catalogue's order of their statistics; an empty
// one leaves its member out.
using Values = std::initializer_list<Counter>;

// What the collector sends of a section's statistics: the values of the
// last interval and the sizes at the sample, or the cumulative counters.
enum class Sent { kIntervalValues, kCounters };

bool IsSent(const Statistic &statistic, Sent sent)
{
    if (sent == Sent::kCounters)
        return statistic.kind == Kind::Counter;
    return statistic.kind == Kind::Rate || statistic.kind == Kind::Share || statistic.kind == Kind::Gauge;
}

// Sets the members of `section`'s statistics of the kind `sent` to `values`,
// matched in the catalogue's order; values beyond the catalogue's are dropped.
void SetMembers(Json::Value &record, Section section, Sent sent, Values values)
{
    const Counter *value = values.begin();
    for (const Statistic *statistic : korvcatalogue::StatisticsOf(section)) {
        if (value == values.end())
            break;
        if (!IsSent(*statistic, sent))
            continue;
        if (*value)
            record[statistic->member] = Json::UInt64(**value);
        ++value;
    }
}

Json::Value DeviceRecord(const std::string &device)
{
    Json::Value record(Json::objectValue);
    record[kDeviceMember] = device;
    return record;
}

Json::Value BlockRecord(Section section, const std::string &device, const BlockRates &rates)
{
    Json::Value record = DeviceRecord(device);
    SetMembers(record, section, Sent::kIntervalValues,
               {rates.utilization, rates.readAccess, rates.readByte, rates.writeAccess, rates.writeByte});
    return record;
}

// The kernel's counters of a block device: bytes from 512-byte sectors, left
// out when that would pass 64 bits.
void SetBlockCounters(Json::Value &record, Section section, const BlockCounters &counters)
{
    const auto bytes = [](const Counter &sectors) -> Counter {
        if (!sectors || *sectors > UINT64_MAX / kDiskStatsSectorBytes)
            return std::nullopt;
        return *sectors * kDiskStatsSectorBytes;
    };
    SetMembers(record, section, Sent::kCounters,
               {counters.reads, bytes(counters.sectorsRead), counters.writes,
                bytes(counters.sectorsWritten), counters.ioTicksMs});
}

// Adds, for each device of `rates`, its record with the counters that
// `sample` holds for it.
void AddBlockRecords(Json::Value &section, Section statistics, const std::map<std::string, BlockRates> &rates,
                     const Snapshot &sample)
{
    for (const auto &[device, deviceRates] : rates) {
        Json::Value record = BlockRecord(statistics, device, deviceRates);
        auto counters = sample.blocks.find(device);
        if (counters != sample.blocks.end())
            SetBlockCounters(record, statistics, counters->second);
        section.append(std::move(record));
    }
}

Counter KiB(uint64_t value)
{
    return std::min<uint64_t>(value, UINT32_MAX);
}

Json::Value CpuRecord(const CpuUsage &cpu, const Snapshot &sample)
{
    Json::Value record(Json::objectValue);
    SetMembers(record, Section::Cpu, Sent::kIntervalValues,
               {cpu.user, cpu.nice, cpu.system, cpu.idle, cpu.iowait, cpu.irq, cpu.softirq, cpu.steal});
    if (sample.hasCpu) {
        const CpuTimes &t = sample.cpu;
        SetMembers(record, Section::Cpu, Sent::kCounters,
                   {t.user, t.nice, t.system, t.idle, t.iowait, t.irq, t.softirq, t.steal});
    }
    return record;
}

// The memory statistics but the physical memory size, which the library adds.
Json::Value MemoryRecord(const MemoryInfo &memory)
{
    Json::Value record(Json::objectValue);
    SetMembers(record, Section::Memory, Sent::kIntervalValues,
               {std::nullopt, KiB(memory.totalKiB), KiB(memory.availableKiB), KiB(memory.freeKiB),
                KiB(memory.cachedKiB), KiB(memory.buffersKiB), KiB(memory.swapTotalKiB),
                KiB(memory.swapFreeKiB)});
    return record;
}

Json::Value Refusal(const char *error)
{
    Json::Value reply(Json::objectValue);
    reply["success"] = false;
    reply["error"] = error;
    return reply;
}

}  // namespace

Json::Value StatisticsReply(const Rates &rates, const Snapshot &sample)
{
    Json::Value data(Json::objectValue);
    data["System"].append(CpuRecord(rates.cpu, sample));
    data["Memory"].append(MemoryRecord(sample.memory));

    Json::Value &network = data["Network"] = Json::Value(Json::arrayValue);
    for (const auto &[device, interface] : rates.interfaces) {
        Json::Value record = DeviceRecord(device);
        SetMembers(record, Section::Interface, Sent::kIntervalValues, {interface.rx, interface.tx});
        auto counters = sample.interfaces.find(device);
        if (counters != sample.interfaces.end()) {
            const InterfaceCounters &c = counters->second;
            SetMembers(record, Section::Interface, Sent::kCounters,
                       {c.rxBytes, c.rxPackets, c.rxErrors, c.rxDrops, c.txBytes, c.txPackets, c.txErrors,
                        c.txDrops});
        }
        network.append(std::move(record));
    }

    AddBlockRecords(data["DiskIO"] = Json::Value(Json::arrayValue), Section::Disk, rates.disks, sample);
    Json::Value &spaces = data["SpaceIO"] = Json::Value(Json::arrayValue);
    AddBlockRecords(spaces, Section::Volume, rates.spaces, sample);
    // The collector's own total carries rates only: the rows' counters sum
    // to the total's, and the rows are what a consumer follows.
    spaces.append(BlockRecord(Section::VolumeTotal, kSpaceTotalDevice, rates.spaceTotal));

    Json::Value &luns = data["iSCSI"] = Json::Value(Json::arrayValue);
    for (const auto &[uuid, lunRates] : rates.luns) {
        Json::Value record = DeviceRecord(uuid);
        // LIO counts neither busy time nor reads and writes apart.
        SetMembers(record, Section::Lun, Sent::kIntervalValues,
                   {std::nullopt, std::nullopt, lunRates.readByte, std::nullopt, lunRates.writeByte});
        auto counters = sample.luns.find(uuid);
        if (counters != sample.luns.end()) {
            const LunCounters &c = counters->second;
            SetMembers(record, Section::Lun, Sent::kCounters, {c.commands, c.readMbytes, c.writeMbytes});
        }
        luns.append(std::move(record));
    }

    Json::Value &nfs = data["NFS"] = Json::Value(Json::objectValue);
    SetMembers(nfs, Section::Nfs, Sent::kIntervalValues,
               {rates.nfs.calls, rates.nfs.readByte, rates.nfs.writeByte});
    SetMembers(nfs, Section::Nfs, Sent::kCounters,
               {sample.nfs.rpcCalls, sample.nfs.readBytes, sample.nfs.writtenBytes});

    data["time"] = Json::Int64(sample.epochSeconds);

    Json::Value reply(Json::objectValue);
    reply["data"] = std::move(data);
    return reply;
}

std::string StatisticsReplyText(const Rates &rates, const Snapshot &sample)
{
    return korvproto::CompactJson(StatisticsReply(rates, sample));
}

RequestKind ReadRequest(std::string_view body, bool mayControl)
{
    while (!body.empty() && body.back() == '\0')
        body.remove_suffix(1);

    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value request;
    bool parsed = false;
    try {
        parsed = reader->parse(body.data(), body.data() + body.size(), &request, nullptr);
    } catch (const Json::Exception &) {
        // The reader gives up on very deep nesting by throwing: not an object either.
    }
    if (!parsed || !request.isObject())
        return RequestKind::kNotAnObject;

    const Json::Value &object = request;
    const Json::Value &kind = object["request"];
    const bool control = kind.isString() && (kind.asString() == kReloadRequest ||
                                             kind.asString() == kHistoryModeRequest);
    if (control && !mayControl)
        return RequestKind::kForbiddenControl;
    if (kind.isString() && kind.asString() == kReloadRequest) {
        KORVSNMP_LOG(LOG_NOTICE, "Reload requested; nothing to reload, sampling goes on");
        return RequestKind::kControl;
    }
    if (kind.isString() && kind.asString() == kHistoryModeRequest) {
        const Json::Value &reason = object["reason"];
        std::string text = reason.isString() ? reason.asString()
                           : reason.isNull() ? std::string()
                                             : korvproto::CompactJson(reason);
        KORVSNMP_LOG(LOG_NOTICE, "History mode requested, reason: [%s]", text.c_str());
        return RequestKind::kControl;
    }
    return RequestKind::kStatistics;
}

std::string ControlReply(RequestKind kind)
{
    if (kind == RequestKind::kNotAnObject)
        return korvproto::CompactJson(Refusal("the request is not a JSON object"));
    if (kind == RequestKind::kForbiddenControl)
        return korvproto::CompactJson(
            Refusal("control requests need root or the collector's own user"));
    Json::Value success(Json::objectValue);
    success["success"] = true;
    return korvproto::CompactJson(success);
}

}  // namespace korvsnmpcd
