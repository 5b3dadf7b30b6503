// Samples the kernel's statistics files and keeps the statistics reply for
// the interval between the last two samples.
#ifndef KORVSNMPCD_SAMPLER_H
#define KORVSNMPCD_SAMPLER_H

#include <set>
#include <string>
#include <vector>

#include "rates.h"
#include "statistics_source.h"

namespace korvsnmpcd {

// Where each source is read from; the defaults are the live host's.
struct SourcePaths {
    std::string stat = "/proc/stat";
    std::string meminfo = "/proc/meminfo";
    std::string netDev = "/proc/net/dev";
    std::string diskStats = "/proc/diskstats";
    std::string nfsServer = "/proc/net/rpc/nfsd";  // absent when the host serves no NFS
    std::string mounts = "/proc/self/mounts";
    std::string sysBlock = "/sys/block";
};

class Sampler : public StatisticsSource {
public:
    // Takes the first sample; until the second one every rate is 0.
    explicit Sampler(SourcePaths paths = SourcePaths());

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

    SourcePaths paths_;
    std::string text_;  // the file just read, kept to reuse its buffer
    std::set<std::string> unreadable_;  // required sources whose failure was logged
    Snapshot previous_;
    std::string previousMounts_;
    std::string reply_;
};

}  // namespace korvsnmpcd

#endif
