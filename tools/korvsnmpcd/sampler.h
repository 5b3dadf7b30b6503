// Samples the kernel's statistics files and keeps the statistics reply for
// the interval between the last two samples.
#ifndef KORVSNMPCD_SAMPLER_H
#define KORVSNMPCD_SAMPLER_H

#include <cstdint>
#include <functional>
#include <set>
#include <string>
#include <vector>

#include "rates.h"
#include "statistics_source.h"

namespace korvsnmpcd {

inline constexpr char kProcRoot[] = "/proc";
inline constexpr char kSysRoot[] = "/sys";

// Where each source is read from; the defaults are the live host's.
struct SourcePaths {
    std::string stat = "/proc/stat";
    std::string meminfo = "/proc/meminfo";
    std::string netDev = "/proc/net/dev";
    std::string diskStats = "/proc/diskstats";
    std::string nfsServer = "/proc/net/rpc/nfsd";  // absent when the host serves no NFS
    std::string mounts = "/proc/self/mounts";      // its sources are device nodes, looked up as named
    std::string sysBlock = "/sys/block";
    std::string lioCore = "/sys/kernel/config/target/core";  // absent without the iSCSI target
};

// The sources under `procRoot` (for /proc) and `sysRoot` (for /sys).
SourcePaths SourcePathsUnder(const std::string &procRoot, const std::string &sysRoot);

// When a sample is taken.
struct SampleTime {
    uint64_t monotonicMs = 0;  // on a clock that only goes forward
    int64_t epochSeconds = 0;
};
using SampleClock = std::function<SampleTime()>;

// The steady clock and the system clock, now.
SampleTime SystemSampleTime();

class Sampler : public StatisticsSource {
public:
    // Takes the first sample; until the second one every rate is 0.
    // `clock` dates each sample.
    explicit Sampler(SourcePaths paths = SourcePaths(), SampleClock clock = SystemSampleTime);

    // Takes a sample and rebuilds the reply from it and the one before.
    void Sample();

    // The whole reply body to a statistics request.
    const std::string &StatisticsReply() const { return reply_; }

    void Tick() override { Sample(); }
    const std::string &Reply() override { return reply_; }

private:
    Snapshot TakeSnapshot();
    bool ReadSource(const std::string &path, bool optional);
    void RefreshDisks(Snapshot &snapshot);
    void RefreshMounted(Snapshot &snapshot);
    void ReadLuns(Snapshot &snapshot);
    void Unreadable(const std::string &path, const UnreadableFields &fields);
    void ReportUnreadable();

    SourcePaths paths_;
    SampleClock clock_;
    size_t unreadableCount_ = 0;   // counter fields unreadable in the sample being taken
    std::string firstUnreadable_;  // where the first of them is
    std::string lastReported_;     // the first unreadable field of the last report
    std::string text_;  // the file just read, kept to reuse its buffer
    std::set<std::string> unreadable_;  // required sources whose failure was logged
    Snapshot previous_;
    std::string previousMounts_;
    std::string reply_;
};

}  // namespace korvsnmpcd

#endif
