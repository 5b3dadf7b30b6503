#include "reply.h"

#include <algorithm>
#include <memory>

#include "protocol/collector_protocol.h"
#include "protocol/unit_log.h"

namespace korvsnmpcd {
namespace {

constexpr char kLogUnit[] = "reply";
constexpr char kReloadRequest[] = "reload";
constexpr char kHistoryModeRequest[] = "history_mode";
constexpr char kSpaceTotalDevice[] = "total";

Json::Value BlockRecord(const std::string &device, const BlockRates &rates)
{
    Json::Value record(Json::objectValue);
    record["device"] = device;
    record["utilization"] = Json::UInt(rates.utilization);
    record["read_access"] = Json::UInt(rates.readAccess);
    record["read_byte"] = Json::UInt(rates.readByte);
    record["write_access"] = Json::UInt(rates.writeAccess);
    record["write_byte"] = Json::UInt(rates.writeByte);
    return record;
}

Json::UInt KiB(uint64_t value)
{
    return static_cast<Json::UInt>(std::min<uint64_t>(value, UINT32_MAX));
}

Json::Value CpuRecord(const CpuUsage &cpu)
{
    Json::Value record(Json::objectValue);
    record["user"] = Json::UInt(cpu.user);
    record["nice"] = Json::UInt(cpu.nice);
    record["system"] = Json::UInt(cpu.system);
    record["idle"] = Json::UInt(cpu.idle);
    record["iowait"] = Json::UInt(cpu.iowait);
    record["irq"] = Json::UInt(cpu.irq);
    record["softirq"] = Json::UInt(cpu.softirq);
    record["steal"] = Json::UInt(cpu.steal);
    return record;
}

Json::Value MemoryRecord(const MemoryInfo &memory)
{
    Json::Value record(Json::objectValue);
    record["total_real"] = KiB(memory.totalKiB);
    record["avail_real"] = KiB(memory.availableKiB);
    record["free_real"] = KiB(memory.freeKiB);
    record["buffer"] = KiB(memory.buffersKiB);
    record["cached"] = KiB(memory.cachedKiB);
    record["total_swap"] = KiB(memory.swapTotalKiB);
    record["avail_swap"] = KiB(memory.swapFreeKiB);
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
    data["System"].append(CpuRecord(rates.cpu));
    data["Memory"].append(MemoryRecord(sample.memory));

    Json::Value &network = data["Network"] = Json::Value(Json::arrayValue);
    for (const auto &[device, interface] : rates.interfaces) {
        Json::Value record(Json::objectValue);
        record["device"] = device;
        record["rx"] = Json::UInt(interface.rx);
        record["tx"] = Json::UInt(interface.tx);
        network.append(std::move(record));
    }

    Json::Value &disks = data["DiskIO"] = Json::Value(Json::arrayValue);
    for (const auto &[device, disk] : rates.disks)
        disks.append(BlockRecord(device, disk));

    Json::Value &spaces = data["SpaceIO"] = Json::Value(Json::arrayValue);
    for (const auto &[device, space] : rates.spaces)
        spaces.append(BlockRecord(device, space));
    spaces.append(BlockRecord(kSpaceTotalDevice, rates.spaceTotal));

    data["iSCSI"] = Json::Value(Json::arrayValue);

    Json::Value &nfs = data["NFS"] = Json::Value(Json::objectValue);
    nfs["read_byte"] = Json::UInt(rates.nfs.readByte);
    nfs["write_byte"] = Json::UInt(rates.nfs.writeByte);
    nfs["calls"] = Json::UInt(rates.nfs.calls);

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
