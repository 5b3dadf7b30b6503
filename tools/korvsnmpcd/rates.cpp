#include "rates.h"

#include <algorithm>
#include <iterator>
#include <limits>

namespace korvsnmpcd {
namespace {

constexpr uint64_t kMsPerSecond = 1000;
constexpr uint64_t kPercent = 100;
constexpr uint64_t kMebibyte = 1048576;
constexpr uint64_t kRateMax = std::numeric_limits<uint32_t>::max();

uint64_t Increase(uint64_t before, uint64_t after)
{
    return after >= before ? after - before : 0;
}

uint64_t Increase(const Counter &before, const Counter &after)
{
    return before && after ? Increase(*before, *after) : 0;
}

uint32_t Clamp(uint64_t value)
{
    return static_cast<uint32_t>(std::min(value, kRateMax));
}

uint32_t RatePerSecond(uint64_t increase, uint64_t elapsedMs)
{
    if (elapsedMs == 0 || increase == 0)
        return 0;
    // Anything this large is beyond 32 bits per second over any interval of a millisecond or more.
    if (increase > std::numeric_limits<uint64_t>::max() / (kMsPerSecond * 2))
        return static_cast<uint32_t>(kRateMax);
    return Clamp((increase * kMsPerSecond + elapsedMs / 2) / elapsedMs);
}

// The rate of a counter of `unit`-byte units, in bytes per second.
uint32_t ByteRate(const Counter &before, const Counter &after, uint64_t unit, uint64_t elapsedMs)
{
    const uint64_t limit = std::numeric_limits<uint64_t>::max() / unit;
    return RatePerSecond(std::min(Increase(before, after), limit) * unit, elapsedMs);
}

uint32_t SaturatingAdd(uint32_t a, uint32_t b)
{
    return Clamp(uint64_t{a} + b);
}

BlockRates BlockRatesBetween(const BlockCounters &before, const BlockCounters &after,
                             uint64_t elapsedMs)
{
    BlockRates rates;
    if (before.ioTicksMs && after.ioTicksMs)
        rates.utilization = BusyPercent(*before.ioTicksMs, *after.ioTicksMs, elapsedMs);
    rates.readAccess = CounterRate(before.reads, after.reads, elapsedMs);
    rates.writeAccess = CounterRate(before.writes, after.writes, elapsedMs);
    rates.readByte = ByteRate(before.sectorsRead, after.sectorsRead, kDiskStatsSectorBytes, elapsedMs);
    rates.writeByte = ByteRate(before.sectorsWritten, after.sectorsWritten, kDiskStatsSectorBytes, elapsedMs);
    return rates;
}

// Rates of the named devices of `after`, zero for those new since `before`.
std::map<std::string, BlockRates> BlockRatesOf(const std::set<std::string> &names,
                                               const Snapshot &before, const Snapshot &after,
                                               uint64_t elapsedMs)
{
    std::map<std::string, BlockRates> rates;
    for (const std::string &name : names) {
        auto now = after.blocks.find(name);
        if (now == after.blocks.end())
            continue;
        auto then = before.blocks.find(name);
        bool sameDevice = then != before.blocks.end() && then->second.major == now->second.major &&
                          then->second.minor == now->second.minor;
        rates[name] = sameDevice ? BlockRatesBetween(then->second, now->second, elapsedMs)
                                 : BlockRates{};
    }
    return rates;
}

}  // namespace

uint32_t CounterRate(uint64_t before, uint64_t after, uint64_t elapsedMs)
{
    return RatePerSecond(Increase(before, after), elapsedMs);
}

uint32_t CounterRate(const Counter &before, const Counter &after, uint64_t elapsedMs)
{
    return RatePerSecond(Increase(before, after), elapsedMs);
}

uint32_t BusyPercent(uint64_t beforeMs, uint64_t afterMs, uint64_t elapsedMs)
{
    if (elapsedMs == 0)
        return 0;
    uint64_t busy = std::min(Increase(beforeMs, afterMs), elapsedMs);
    return static_cast<uint32_t>((busy * kPercent + elapsedMs / 2) / elapsedMs);
}

CpuUsage CpuPercentages(const CpuTimes &before, const CpuTimes &after)
{
    Counter CpuTimes::*const states[] = {&CpuTimes::user,   &CpuTimes::nice,    &CpuTimes::system,
                                          &CpuTimes::idle,   &CpuTimes::iowait,  &CpuTimes::irq,
                                          &CpuTimes::softirq, &CpuTimes::steal};
    uint32_t CpuUsage::*const shares[] = {&CpuUsage::user,   &CpuUsage::nice,    &CpuUsage::system,
                                          &CpuUsage::idle,   &CpuUsage::iowait,  &CpuUsage::irq,
                                          &CpuUsage::softirq, &CpuUsage::steal};
    uint64_t ticks[std::size(states)] = {};
    uint64_t total = 0;
    for (size_t i = 0; i < std::size(states); ++i) {
        ticks[i] = Increase(before.*states[i], after.*states[i]);
        total += ticks[i];
    }
    CpuUsage usage;
    if (total == 0) {
        usage.idle = kPercent;
        return usage;
    }
    for (size_t i = 0; i < std::size(states); ++i)
        usage.*shares[i] = static_cast<uint32_t>((ticks[i] * kPercent + total / 2) / total);
    return usage;
}

Rates ComputeRates(const Snapshot &before, const Snapshot &after)
{
    uint64_t elapsedMs = Increase(before.monotonicMs, after.monotonicMs);
    Rates rates;
    if (before.hasCpu && after.hasCpu)
        rates.cpu = CpuPercentages(before.cpu, after.cpu);
    else
        rates.cpu.idle = kPercent;

    for (const auto &[name, now] : after.interfaces) {
        auto then = before.interfaces.find(name);
        InterfaceRates &interface = rates.interfaces[name];
        if (then == before.interfaces.end())
            continue;
        interface.rx = CounterRate(then->second.rxBytes, now.rxBytes, elapsedMs);
        interface.tx = CounterRate(then->second.txBytes, now.txBytes, elapsedMs);
    }

    rates.disks = BlockRatesOf(after.disks, before, after, elapsedMs);
    rates.spaces = BlockRatesOf(after.mounted, before, after, elapsedMs);
    uint64_t utilizationSum = 0;
    for (const auto &[name, space] : rates.spaces) {
        utilizationSum += space.utilization;
        rates.spaceTotal.readAccess = SaturatingAdd(rates.spaceTotal.readAccess, space.readAccess);
        rates.spaceTotal.readByte = SaturatingAdd(rates.spaceTotal.readByte, space.readByte);
        rates.spaceTotal.writeAccess =
            SaturatingAdd(rates.spaceTotal.writeAccess, space.writeAccess);
        rates.spaceTotal.writeByte = SaturatingAdd(rates.spaceTotal.writeByte, space.writeByte);
    }
    if (!rates.spaces.empty())
        rates.spaceTotal.utilization = static_cast<uint32_t>(utilizationSum / rates.spaces.size());

    rates.nfs.readByte = CounterRate(before.nfs.readBytes, after.nfs.readBytes, elapsedMs);
    rates.nfs.writeByte = CounterRate(before.nfs.writtenBytes, after.nfs.writtenBytes, elapsedMs);
    rates.nfs.calls = CounterRate(before.nfs.rpcCalls, after.nfs.rpcCalls, elapsedMs);

    for (const auto &[uuid, now] : after.luns) {
        auto then = before.luns.find(uuid);
        LunRates &lun = rates.luns[uuid];
        if (then == before.luns.end())
            continue;
        lun.readByte = ByteRate(then->second.readMbytes, now.readMbytes, kMebibyte, elapsedMs);
        lun.writeByte = ByteRate(then->second.writeMbytes, now.writeMbytes, kMebibyte, elapsedMs);
    }
    return rates;
}

}  // namespace korvsnmpcd
