// Parsers of the kernel's statistics files. Each takes the whole text of one
// file, so that it works on any fixed text as well as on the live file; none
// throws on malformed input: a line that cannot be read is skipped, a number
// that cannot be read counts as 0.
#ifndef KORVSNMPCD_PROC_PARSERS_H
#define KORVSNMPCD_PROC_PARSERS_H

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace korvsnmpcd {

// Cumulative CPU time of all processors, in clock ticks ("cpu" line of /proc/stat).
struct CpuTimes {
    uint64_t user = 0;
    uint64_t nice = 0;
    uint64_t system = 0;
    uint64_t idle = 0;
    uint64_t iowait = 0;
    uint64_t irq = 0;
    uint64_t softirq = 0;
    uint64_t steal = 0;
};

// Sizes from /proc/meminfo, in KiB; a member the file lacks stays 0.
struct MemoryInfo {
    uint64_t totalKiB = 0;
    uint64_t freeKiB = 0;
    uint64_t availableKiB = 0;
    uint64_t buffersKiB = 0;
    uint64_t cachedKiB = 0;
    uint64_t swapTotalKiB = 0;
    uint64_t swapFreeKiB = 0;
};

// Cumulative byte counts of one network interface (/proc/net/dev).
struct InterfaceCounters {
    uint64_t rxBytes = 0;
    uint64_t txBytes = 0;
};

// Cumulative counters of one block device (/proc/diskstats).
struct BlockCounters {
    unsigned major = 0;
    unsigned minor = 0;
    uint64_t reads = 0;           // read operations completed
    uint64_t sectorsRead = 0;     // 512-byte sectors
    uint64_t writes = 0;          // write operations completed
    uint64_t sectorsWritten = 0;  // 512-byte sectors
    uint64_t ioTicksMs = 0;       // milliseconds with I/O in flight
};

// Cumulative counters of the NFS server (/proc/net/rpc/nfsd).
struct NfsServerCounters {
    uint64_t readBytes = 0;
    uint64_t writtenBytes = 0;
    uint64_t rpcCalls = 0;
};

// False when the text has no complete "cpu" line; `times` is then untouched.
bool ParseCpuTimes(std::string_view text, CpuTimes &times);

// False when the text has no "MemTotal:" line.
bool ParseMemoryInfo(std::string_view text, MemoryInfo &memory);

// Keyed by interface name.
std::map<std::string, InterfaceCounters> ParseNetDev(std::string_view text);

// Keyed by the kernel's device name.
std::map<std::string, BlockCounters> ParseDiskStats(std::string_view text);

NfsServerCounters ParseNfsServer(std::string_view text);

// The source (first field) of every mount line, octal escapes ("\040")
// decoded, in file order.
std::vector<std::string> ParseMountSources(std::string_view text);

}  // namespace korvsnmpcd

#endif
