#include "sampler.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <memory>

#include "protocol/lio_target.h"
#include "protocol/unique_fd.h"
#include "protocol/unit_log.h"
#include "reply.h"

namespace korvsnmpcd {
namespace {

using korvproto::UniqueFd;

constexpr char kLogUnit[] = "sampler";
constexpr size_t kReadChunk = 16384;
constexpr char kDeviceLink[] = "/device";  // present under /sys/block/<name> for hardware disks

struct DirCloser {
    void operator()(DIR *dir) const { closedir(dir); }
};

// The subdirectories of `path`, "." and ".." left out; none when it cannot be read.
std::vector<std::string> Subdirectories(const std::string &path)
{
    std::vector<std::string> names;
    std::unique_ptr<DIR, DirCloser> dir(opendir(path.c_str()));
    while (dir) {
        const dirent *entry = readdir(dir.get());
        if (entry == nullptr)
            break;
        std::string name = entry->d_name;
        struct stat node;
        if (name != "." && name != ".." && stat((path + "/" + name).c_str(), &node) == 0 &&
            S_ISDIR(node.st_mode))
            names.push_back(std::move(name));
    }
    return names;
}

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

SourcePaths SourcePathsUnder(const std::string &procRoot, const std::string &sysRoot)
{
    SourcePaths paths;
    for (std::string *path : {&paths.stat, &paths.meminfo, &paths.netDev, &paths.diskStats,
                              &paths.nfsServer, &paths.mounts})
        path->replace(0, sizeof kProcRoot - 1, procRoot);
    for (std::string *path : {&paths.sysBlock, &paths.lioCore})
        path->replace(0, sizeof kSysRoot - 1, sysRoot);
    return paths;
}

SampleTime SystemSampleTime()
{
    using namespace std::chrono;
    SampleTime now;
    now.monotonicMs = static_cast<uint64_t>(
        duration_cast<milliseconds>(steady_clock::now().time_since_epoch()).count());
    now.epochSeconds = duration_cast<seconds>(system_clock::now().time_since_epoch()).count();
    return now;
}

Sampler::Sampler(SourcePaths paths, SampleClock clock)
    : paths_(std::move(paths)), clock_(std::move(clock))
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
    const SampleTime now = clock_();
    snapshot.monotonicMs = now.monotonicMs;
    snapshot.epochSeconds = now.epochSeconds;
    unreadableCount_ = 0;
    UnreadableFields cpu;
    UnreadableFields interfaces;
    UnreadableFields blocks;
    UnreadableFields nfs;
    if (ReadSource(paths_.stat, false))
        snapshot.hasCpu = ParseCpuTimes(text_, snapshot.cpu, &cpu);
    Unreadable(paths_.stat, cpu);
    if (ReadSource(paths_.meminfo, false))
        snapshot.hasMemory = ParseMemoryInfo(text_, snapshot.memory);
    if (ReadSource(paths_.netDev, false))
        snapshot.interfaces = ParseNetDev(text_, &interfaces);
    Unreadable(paths_.netDev, interfaces);
    if (ReadSource(paths_.diskStats, false))
        snapshot.blocks = ParseDiskStats(text_, &blocks);
    Unreadable(paths_.diskStats, blocks);
    if (ReadSource(paths_.nfsServer, true))
        snapshot.nfs = ParseNfsServer(text_, &nfs);
    Unreadable(paths_.nfsServer, nfs);
    RefreshDisks(snapshot);
    RefreshMounted(snapshot);
    ReadLuns(snapshot);
    ReportUnreadable();
    return snapshot;
}

void Sampler::Unreadable(const std::string &path, const UnreadableFields &fields)
{
    if (fields.count > 0 && unreadableCount_ == 0)
        firstUnreadable_ = path + " " + fields.first;
    unreadableCount_ += fields.count;
}

// One message for a sample with unreadable counter fields, and only when its
// first one is not the one reported last: a file that stays malformed is
// reported once, not every interval.
void Sampler::ReportUnreadable()
{
    if (unreadableCount_ == 0) {
        if (!lastReported_.empty())
            KORVSNMP_LOG(LOG_NOTICE, "Every counter field is readable again");
        lastReported_.clear();
        return;
    }
    if (firstUnreadable_ == lastReported_)
        return;
    lastReported_ = firstUnreadable_;
    KORVSNMP_LOG(LOG_WARNING, "Left %zu unreadable counter fields out of the sample, the first: %s",
                 unreadableCount_, firstUnreadable_.c_str());
}

// The LUNs of the kernel's iSCSI target: each device directory under an HBA
// directory whose unit serial names a UUID. Its counters that cannot be read
// are left empty; a device without a UUID is no LUN that the host can name.
void Sampler::ReadLuns(Snapshot &snapshot)
{
    struct File {
        const char *name;
        Counter LunCounters::*counter;
    };
    static const File kFiles[] = {{korvproto::kLioCommandsFile, &LunCounters::commands},
                                  {korvproto::kLioReadMbytesFile, &LunCounters::readMbytes},
                                  {korvproto::kLioWriteMbytesFile, &LunCounters::writeMbytes}};
    for (const std::string &hba : Subdirectories(paths_.lioCore)) {
        for (const std::string &device : Subdirectories(paths_.lioCore + "/" + hba)) {
            const std::string directory = paths_.lioCore + "/" + hba + "/" + device + "/";
            if (!ReadSource(directory + korvproto::kLioUnitSerialFile, true))
                continue;
            const std::string uuid = korvproto::LunUuidOfUnitSerial(text_);
            if (uuid.empty())
                continue;
            LunCounters &lun = snapshot.luns[uuid];
            for (const File &file : kFiles) {
                const std::string path = directory + file.name;
                UnreadableFields unreadable;
                if (ReadSource(path, true))
                    lun.*file.counter = ParseSingleNumber(text_, uuid, &unreadable);
                Unreadable(path, unreadable);
            }
        }
    }
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
