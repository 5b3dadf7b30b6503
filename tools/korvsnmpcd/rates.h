// Per-second rates between two samples of the kernel's counters.
//
// Rules, for every counter: the rate is the increase over the elapsed time,
// rounded to the nearest integer and clamped to 4294967295 so that it fits an
// unsigned 32-bit field. A counter that is unreadable in either sample gives
// 0. A counter that went backwards (device reset or
// replaced, a 32-bit kernel counter wrapping) gives 0 for that interval. A
// device that is new in the later sample (or whose major:minor changed) is
// reported with zero rates; a device missing from the later sample is not
// reported. No elapsed time gives zero rates.
#ifndef KORVSNMPCD_RATES_H
#define KORVSNMPCD_RATES_H

#include <cstdint>
#include <map>
#include <set>
#include <string>

#include "proc_parsers.h"

namespace korvsnmpcd {

// One reading of every source.
struct Snapshot {
    uint64_t monotonicMs = 0;  // when it was taken, on the monotonic clock
    int64_t epochSeconds = 0;  // when it was taken, seconds since the epoch
    bool hasCpu = false;
    CpuTimes cpu;
    bool hasMemory = false;
    MemoryInfo memory;
    std::map<std::string, InterfaceCounters> interfaces;
    std::map<std::string, BlockCounters> blocks;
    std::set<std::string> disks;    // names of `blocks` that are whole disks
    std::set<std::string> mounted;  // names of `blocks` that carry a mounted filesystem
    NfsServerCounters nfs;          // all empty when the host serves no NFS
    std::map<std::string, LunCounters> luns;  // by UUID
};

// Share of the interval spent in each state, percent (0-100).
struct CpuUsage {
    uint32_t user = 0;
    uint32_t nice = 0;
    uint32_t system = 0;
    uint32_t idle = 0;
    uint32_t iowait = 0;
    uint32_t irq = 0;
    uint32_t softirq = 0;
    uint32_t steal = 0;
};

struct InterfaceRates {
    uint32_t rx = 0;  // bytes per second
    uint32_t tx = 0;
};

struct BlockRates {
    uint32_t utilization = 0;  // percent of the interval with I/O in flight, 0-100
    uint32_t readAccess = 0;   // operations per second
    uint32_t readByte = 0;     // bytes per second
    uint32_t writeAccess = 0;
    uint32_t writeByte = 0;
};

struct NfsRates {
    uint32_t readByte = 0;   // bytes per second
    uint32_t writeByte = 0;
    uint32_t calls = 0;      // RPC calls per second
};

// LIO counts whole mebibytes: these rates move in steps of 1048576 bytes
// over the interval.
struct LunRates {
    uint32_t readByte = 0;   // bytes per second
    uint32_t writeByte = 0;
};

struct Rates {
    CpuUsage cpu;
    std::map<std::string, InterfaceRates> interfaces;
    std::map<std::string, BlockRates> disks;   // the whole disks
    std::map<std::string, BlockRates> spaces;  // the devices with a mounted filesystem
    BlockRates spaceTotal;  // sums over `spaces` (clamped), utilization their mean
    NfsRates nfs;
    std::map<std::string, LunRates> luns;  // by UUID
};

uint32_t CounterRate(uint64_t before, uint64_t after, uint64_t elapsedMs);
uint32_t CounterRate(const Counter &before, const Counter &after, uint64_t elapsedMs);

// Busy share of the interval from the milliseconds-with-I/O counter, 0-100.
uint32_t BusyPercent(uint64_t beforeMs, uint64_t afterMs, uint64_t elapsedMs);

// Without any tick elapsed, the processor counts as idle.
CpuUsage CpuPercentages(const CpuTimes &before, const CpuTimes &after);

Rates ComputeRates(const Snapshot &before, const Snapshot &after);

}  // namespace korvsnmpcd

#endif
