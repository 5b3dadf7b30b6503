// Parsers of the kernel's statistics files. Each takes the whole text of one
// file, so that it works on any fixed text as well as on the live file; none
// throws on malformed input: a line that cannot be read is skipped, and a
// counter field that is no unsigned 64-bit decimal number (a sign, letters,
// a fraction, more than 64 bits) is left empty and noted in `unreadable`
// when one is given.
#ifndef KORVSNMPCD_PROC_PARSERS_H
#define KORVSNMPCD_PROC_PARSERS_H

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace korvsnmpcd {

// The unit of /proc/diskstats' sector counts, whatever the device's own sector size.
inline constexpr uint64_t kDiskStatsSectorBytes = 512;

// A cumulative kernel counter as read; empty when its field was unreadable
// (or, for the CPU states of an old kernel, absent).
using Counter = std::optional<uint64_t>;

// The counter fields that could not be read: how many, and which came first.
struct UnreadableFields {
    size_t count = 0;
    std::string first;  // "line [KEY] field N [TEXT]", N from 1 after the key

    void Note(std::string_view key, size_t field, std::string_view text);
};

// Cumulative CPU time of all processors, in clock ticks ("cpu" line of /proc/stat).
struct CpuTimes {
    Counter user;
    Counter nice;
    Counter system;
    Counter idle;
    Counter iowait;
    Counter irq;
    Counter softirq;
    Counter steal;
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

// Cumulative counters of one network interface (/proc/net/dev).
struct InterfaceCounters {
    Counter rxBytes;
    Counter rxPackets;
    Counter rxErrors;
    Counter rxDrops;
    Counter txBytes;
    Counter txPackets;
    Counter txErrors;
    Counter txDrops;
};

// Cumulative counters of one block device (/proc/diskstats).
struct BlockCounters {
    unsigned major = 0;
    unsigned minor = 0;
    Counter reads;           // read operations completed
    Counter sectorsRead;     // 512-byte sectors
    Counter writes;          // write operations completed
    Counter sectorsWritten;  // 512-byte sectors
    Counter ioTicksMs;       // milliseconds with I/O in flight
};

// Cumulative counters of the NFS server (/proc/net/rpc/nfsd); empty when
// the file lacks their line.
struct NfsServerCounters {
    Counter readBytes;     // "io" line, first field
    Counter writtenBytes;  // "io" line, second field
    Counter rpcCalls;      // "rpc" line, first field
};

// Cumulative counters of one LUN of the kernel's iSCSI target (LIO's
// statistics/scsi_lu under the device's configfs directory).
struct LunCounters {
    Counter commands;     // num_cmds
    Counter readMbytes;   // read_mbytes: whole MiB
    Counter writeMbytes;  // write_mbytes
};

// False when the text has no "cpu" line with at least four fields; `times`
// is then untouched. The states an old kernel lacks stay empty.
bool ParseCpuTimes(std::string_view text, CpuTimes &times, UnreadableFields *unreadable = nullptr);

// False when the text has no "MemTotal:" line.
bool ParseMemoryInfo(std::string_view text, MemoryInfo &memory);

// Keyed by interface name; a line with fewer than the twelve fields up to
// the transmit drops is skipped.
std::map<std::string, InterfaceCounters> ParseNetDev(std::string_view text,
                                                     UnreadableFields *unreadable = nullptr);

// Keyed by the kernel's device name; a line with an unreadable major or
// minor number, or fewer than 14 fields, is skipped.
std::map<std::string, BlockCounters> ParseDiskStats(std::string_view text,
                                                     UnreadableFields *unreadable = nullptr);

NfsServerCounters ParseNfsServer(std::string_view text, UnreadableFields *unreadable = nullptr);

// A file holding one number (and a line feed), such as LIO's counters;
// `key` names it in `unreadable`.
Counter ParseSingleNumber(std::string_view text, std::string_view key,
                          UnreadableFields *unreadable = nullptr);

// The source (first field) of every mount line, octal escapes ("\040")
// decoded, in file order.
std::vector<std::string> ParseMountSources(std::string_view text);

}  // namespace korvsnmpcd

#endif
