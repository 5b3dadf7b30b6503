// A host made of files: a temporary directory tree with the kernel files
// that korvsnmpcd samples, for `korvsnmpcd --proc-root P --sys-root S` and
// for a Sampler built on SourcePathsUnder(P, S). A test sets the counters,
// writes them, lets the collector sample, and knows every value the reply
// must carry: the tests of the collector, the SNMP subagent and the
// OpenMetrics output share it.
#ifndef KORVTEST_FIXTURE_HOST_H
#define KORVTEST_FIXTURE_HOST_H

#include <array>
#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include <json/value.h>

#include "korv_standin.h"

namespace korvtest {

// /proc/net/dev: the leading four counters of each direction.
struct FixtureInterface {
    std::array<uint64_t, 4> rx{};  // bytes, packets, errors, drops
    std::array<uint64_t, 4> tx{};
};

// /proc/diskstats.
struct FixtureBlock {
    unsigned major = 0;
    unsigned minor = 0;
    bool disk = false;  // a whole disk: listed in sys/block with a device behind it
    uint64_t reads = 0;
    uint64_t sectorsRead = 0;
    uint64_t writes = 0;
    uint64_t sectorsWritten = 0;
    uint64_t ioTicksMs = 0;
};

// A LUN of the kernel's iSCSI target: sys/kernel/config/target/core/<hba>/<device>.
struct FixtureLun {
    std::string hba = "iblock_0";
    std::string device;  // the backstore's name
    uint64_t commands = 0;
    uint64_t readMbytes = 0;
    uint64_t writeMbytes = 0;
};

// /proc/net/rpc/nfsd.
struct FixtureNfs {
    uint64_t calls = 0;
    uint64_t readBytes = 0;
    uint64_t writtenBytes = 0;
};

class FixtureHost {
public:
    // A new tree under /tmp holding a typical host (below), written.
    FixtureHost();
    // Removes the tree.
    ~FixtureHost();
    FixtureHost(const FixtureHost &) = delete;
    FixtureHost &operator=(const FixtureHost &) = delete;

    const std::string &Root() const { return root_; }
    std::string ProcRoot() const { return root_ + "/proc"; }
    std::string SysRoot() const { return root_ + "/sys"; }
    // "--proc-root", ProcRoot(), "--sys-root", SysRoot().
    std::vector<std::string> CollectorArguments() const;

    // Writes every file from the members below. Each file is replaced in one
    // step, so a collector sampling meanwhile reads either its old or its new
    // text. Devices removed from the members disappear from the files.
    void Write();

    // Writes `text` as the file `path` under Root() ("proc/net/dev"), in one
    // step: for malformed files. The next Write() replaces it again.
    void WriteFile(const std::string &path, const std::string &text) const;

    // Mounts the block device `name` (one of `blocks`): a block-device node
    // with its major and minor numbers is made in the tree and named as a
    // mount source in proc/self/mounts, so that the collector reports the
    // device in "SpaceIO". False when the node cannot be made (mknod needs
    // root); the device is then not mounted.
    bool Mount(const std::string &name);

    // Adds a block device named and numbered as the first of the running
    // kernel's (/sys/dev/block) that `blocks` does not name yet, with its own counters, and mounts it: the
    // library's naming of volumes then resolves its node too. Its name, or
    // "" when the kernel lists none or the node cannot be made.
    std::string MountKernelDevice();

    // The host as the stand-in platform describes it, for the library's
    // names: the disks in bays 1, 2... in name order, the interfaces but lo,
    // the mounted devices as volumes "volume_<name>", each LUN named after
    // its backstore, and the English texts.
    korvstandin::HostDescription Description() const;

    // The typical host: every counter differs from every other.
    std::array<uint64_t, 8> cpu{};  // user nice system idle iowait irq softirq steal, in ticks
    std::map<std::string, FixtureInterface> interfaces;  // lo, eth0, eth1
    std::map<std::string, FixtureBlock> blocks;          // sda (8:0), sdb (8:16) disks; sda1 (8:1)
    std::map<std::string, FixtureLun> luns;              // by UUID: one LUN
    FixtureNfs nfs;

private:
    std::string root_;
    std::map<std::string, std::string> mounted_;  // block name -> its node
};

// The statistics reply's "data" of the collector on `socketPath` once it
// satisfies `ready`, polled as the collector samples; null when it does not
// within kProcessWait.
Json::Value CollectorDataWhen(const std::string &socketPath, const std::function<bool(const Json::Value &)> &ready);

}  // namespace korvtest

#endif
