#include "sampler.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <memory>

#include "protocol/unit_log.h"
#include "reply.h"
#include "protocol/unique_fd.h"

namespace korvsnmpcd {
namespace {

using korvproto::UniqueFd;

constexpr char kLogUnit[] = "sampler";
constexpr size_t kReadChunk = 16384;
constexpr char kDeviceLink[] = "/device";  // present under /sys/block/<name> for hardware disks

uint64_t MonotonicMs()
{
    using namespace std::chrono;
    return static_cast<uint64_t>(
        duration_cast<milliseconds>(steady_clock::now().time_since_epoch()).count());
}

int64_t EpochSeconds()
{
    using namespace std::chrono;
    return duration_cast<seconds>(system_clock::now().time_since_epoch()).count();
}

struct DirCloser {
    void operator()(DIR *dir) const { closedir(dir); }
};

bool SameNames(const std::map<std::string, BlockCounters> &a,
               const std::map<std::string, BlockCounters> &b)
{
    if (a.size() != b.size())
        return false;
    for (auto i = a.begin(), j = b.begin(); i != a.end(); ++i, ++j) {
        if (i->first != j->first || i->second.major != j->second.major ||
            i->second.minor != j->second.minor)
            return false;
    }
    return true;
}

}  // namespace

Sampler::Sampler(SourcePaths paths) : paths_(std::move(paths))
{
    previous_ = TakeSnapshot();
    reply_ = StatisticsReplyText(ComputeRates(previous_, previous_), previous_);
}

void Sampler::Sample()
{
    Snapshot current = TakeSnapshot();
    reply_ = StatisticsReplyText(ComputeRates(previous_, current), current);
    previous_ = std::move(current);
}

bool Sampler::ReadSource(const std::string &path, bool optional)
{
    text_.clear();
    UniqueFd fd(open(path.c_str(), O_RDONLY | O_CLOEXEC));
    bool ok = fd.Valid();
    while (ok) {
        size_t used = text_.size();
        text_.resize(used + kReadChunk);
        ssize_t got = read(fd.Get(), &text_[used], kReadChunk);
        text_.resize(used + (got > 0 ? static_cast<size_t>(got) : 0));
        if (got == 0)
            break;
        if (got < 0 && errno != EINTR)
            ok = false;
    }
    if (!ok)
        text_.clear();
    if (ok) {
        if (unreadable_.erase(path) > 0)
            KORVSNMP_LOG(LOG_NOTICE, "%s is readable again", path.c_str());
    } else if (!optional && unreadable_.insert(path).second) {
        KORVSNMP_LOG(LOG_ERR, "Cannot read %s: %m; its statistics are left out", path.c_str());
    }
    return ok;
}

Snapshot Sampler::TakeSnapshot()
{
    Snapshot snapshot;
    snapshot.monotonicMs = MonotonicMs();
    snapshot.epochSeconds = EpochSeconds();
    if (ReadSource(paths_.stat, false))
        snapshot.hasCpu = ParseCpuTimes(text_, snapshot.cpu);
    if (ReadSource(paths_.meminfo, false))
        snapshot.hasMemory = ParseMemoryInfo(text_, snapshot.memory);
    if (ReadSource(paths_.netDev, false))
        snapshot.interfaces = ParseNetDev(text_);
    if (ReadSource(paths_.diskStats, false))
        snapshot.blocks = ParseDiskStats(text_);
    if (ReadSource(paths_.nfsServer, true))
        snapshot.nfs = ParseNfsServer(text_);
    RefreshDisks(snapshot);
    RefreshMounted(snapshot);
    return snapshot;
}

// Whole hardware disks: the block devices listed in /sys/block that have a
// device behind them (loop, ram, dm and md devices have none). Looked up
// again only when the kernel's list of block devices changes.
void Sampler::RefreshDisks(Snapshot &snapshot)
{
    if (!previous_.blocks.empty() && SameNames(previous_.blocks, snapshot.blocks)) {
        snapshot.disks = previous_.disks;
        return;
    }
    std::unique_ptr<DIR, DirCloser> dir(opendir(paths_.sysBlock.c_str()));
    if (!dir)
        return;
    while (const dirent *entry = readdir(dir.get())) {
        std::string name = entry->d_name;
        if (snapshot.blocks.count(name) == 0)
            continue;
        std::string device = paths_.sysBlock + "/" + name + kDeviceLink;
        if (access(device.c_str(), F_OK) == 0)
            snapshot.disks.insert(name);
    }
}

// The block devices named as the source of a mounted filesystem, by their
// kernel names: each source node (a /dev/mapper link included) is resolved
// through its device number. Resolved again only when the mount table or the
// kernel's list of block devices changes.
void Sampler::RefreshMounted(Snapshot &snapshot)
{
    if (!ReadSource(paths_.mounts, false))
        return;
    if (text_ == previousMounts_ && SameNames(previous_.blocks, snapshot.blocks)) {
        snapshot.mounted = previous_.mounted;
        return;
    }
    previousMounts_ = text_;
    std::map<dev_t, const std::string *> byNumber;
    for (const auto &[name, counters] : snapshot.blocks)
        byNumber[makedev(counters.major, counters.minor)] = &name;
    for (const std::string &source : ParseMountSources(text_)) {
        struct stat node;
        if (source.empty() || source[0] != '/' || stat(source.c_str(), &node) != 0 ||
            !S_ISBLK(node.st_mode))
            continue;
        auto device = byNumber.find(node.st_rdev);
        if (device != byNumber.end())
            snapshot.mounted.insert(*device->second);
    }
}

}  // namespace korvsnmpcd
