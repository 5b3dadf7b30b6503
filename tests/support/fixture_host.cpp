#include "fixture_host.h"

#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <json/reader.h>

#include "block_nodes.h"
#include "collector_process.h"
#include "platform_test.h"
#include "protocol/collector_protocol.h"
#include "protocol/lio_target.h"

namespace korvtest {
namespace {

namespace fs = std::filesystem;

constexpr char kRootTemplate[] = "/tmp/korvfixture-XXXXXX";
constexpr char kNewSuffix[] = ".new";
constexpr unsigned int kMemTotalKiB = 8041216;
constexpr char kMeminfoAfterTotal[] =
    "MemFree:         5120000 kB\nMemAvailable:    6144000 kB\n"
    "Buffers:          102400 kB\nCached:          1048576 kB\nSwapTotal:       2097148 kB\n"
    "SwapFree:        2000000 kB\n";

// The directories of `parent` that `wanted` does not name are removed.
void RemoveOthers(const fs::path &parent, const std::map<std::string, bool> &wanted)
{
    std::error_code error;
    for (const fs::directory_entry &entry : fs::directory_iterator(parent, error))
        if (entry.is_directory() && wanted.count(entry.path().filename().string()) == 0)
            fs::remove_all(entry.path(), error);
}

}  // namespace

FixtureHost::FixtureHost()
{
    std::string path = kRootTemplate;
    if (mkdtemp(path.data()) != nullptr)
        root_ = path;
    for (const char *directory : {"proc/net/rpc", "proc/self", "sys/block", "dev"})
        fs::create_directories(fs::path(root_) / directory);
    fs::create_directories(fs::path(root_) / "sys" / korvproto::kLioCoreDirectory);

    cpu = {1000, 20, 300, 40000, 50, 6, 70, 8};
    interfaces["lo"] = {{5000, 50, 0, 0}, {5000, 50, 0, 0}};
    interfaces["eth0"] = {{4294966296, 3000000, 3, 4}, {700000, 6000, 1, 2}};
    interfaces["eth1"] = {{10, 1, 0, 0}, {20, 2, 0, 0}};
    blocks["sda"] = {8, 0, true, 100, 2000, 300, 4000, 500};
    blocks["sdb"] = {8, 16, true, 1000, 16000, 30, 480, 90};
    blocks["sda1"] = {8, 1, false, 40, 800, 60, 1200, 70};
    luns["6001405a-1c2d-4e5f-8a9b-0c1d2e3f4a5b"] = {"iblock_0", "lun_a", 12345, 678, 910};
    nfs = {5555, (uint64_t{1} << 33) + 7, 123456};
    Write();
}

FixtureHost::~FixtureHost()
{
    std::error_code error;
    if (!root_.empty())
        fs::remove_all(root_, error);
}

std::vector<std::string> FixtureHost::CollectorArguments() const
{
    return {"--proc-root", ProcRoot(), "--sys-root", SysRoot()};
}

void FixtureHost::WriteFile(const std::string &path, const std::string &text) const
{
    const fs::path target = fs::path(root_) / path;
    const fs::path next = target.string() + kNewSuffix;
    std::ofstream(next, std::ios::binary | std::ios::trunc) << text;
    std::error_code error;
    fs::rename(next, target, error);
}

void FixtureHost::Write()
{
    std::ostringstream stat;
    stat << "cpu ";
    for (uint64_t ticks : cpu)
        stat << " " << ticks;
    stat << " 0 0\ncpu0";
    for (uint64_t ticks : cpu)
        stat << " " << ticks;
    stat << " 0 0\nintr 0\nctxt 0\nbtime 1700000000\n";
    WriteFile("proc/stat", stat.str());
    WriteFile("proc/meminfo", "MemTotal:        " + std::to_string(kMemTotalKiB) + " kB\n" + kMeminfoAfterTotal);

    std::ostringstream netDev;
    netDev << "Inter-|   Receive                            |  Transmit\n"
              " face |bytes    packets errs drop fifo frame compressed multicast|bytes    packets errs "
              "drop fifo colls carrier compressed\n";
    for (const auto &[name, counters] : interfaces) {
        netDev << "  " << name << ":";
        for (uint64_t value : counters.rx)
            netDev << " " << value;
        netDev << " 0 0 0 0";
        for (uint64_t value : counters.tx)
            netDev << " " << value;
        netDev << " 0 0 0 0\n";
    }
    WriteFile("proc/net/dev", netDev.str());

    std::ostringstream diskStats;
    std::map<std::string, bool> disks;
    for (const auto &[name, b] : blocks) {
        diskStats << "   " << b.major << "       " << b.minor << " " << name << " " << b.reads << " 0 "
                  << b.sectorsRead << " 0 " << b.writes << " 0 " << b.sectorsWritten << " 0 0 " << b.ioTicksMs
                  << " 0\n";
        if (b.disk)
            disks[name] = true;
    }
    WriteFile("proc/diskstats", diskStats.str());
    const fs::path sysBlock = fs::path(root_) / "sys/block";
    RemoveOthers(sysBlock, disks);
    for (const auto &[name, disk] : disks) {
        fs::create_directories(sysBlock / name);
        std::ofstream(sysBlock / name / "device") << "";
    }

    std::ostringstream nfsd;
    nfsd << "rc 0 0 0\nfh 0 0 0 0 0\nio " << nfs.readBytes << " " << nfs.writtenBytes << "\nth 8 0 0 0 0 0 0 0 0 0 0 0\n"
         << "rpc " << nfs.calls << " 0 0 0 0\nproc3 22 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0\n";
    WriteFile("proc/net/rpc/nfsd", nfsd.str());

    std::ostringstream mounts;
    mounts << "sysfs /sys sysfs rw,nosuid 0 0\nproc /proc proc rw 0 0\n";
    for (const auto &[name, node] : mounted_)
        if (blocks.count(name) > 0)
            mounts << node << " /" << name << " ext4 rw,relatime 0 0\n";
    WriteFile("proc/self/mounts", mounts.str());

    const fs::path core = fs::path(root_) / "sys" / korvproto::kLioCoreDirectory;
    std::map<std::string, std::map<std::string, bool>> devices;  // by HBA
    for (const auto &[uuid, lun] : luns)
        devices[lun.hba][lun.device] = true;
    std::map<std::string, bool> hbas;
    for (const auto &[hba, names] : devices)
        hbas[hba] = true;
    RemoveOthers(core, hbas);
    for (const auto &[hba, names] : devices) {
        fs::create_directories(core / hba);
        RemoveOthers(core / hba, names);
    }
    for (const auto &[uuid, lun] : luns) {
        const std::string device = "sys/" + std::string(korvproto::kLioCoreDirectory) + "/" + lun.hba + "/" +
                                   lun.device + "/";
        fs::create_directories(fs::path(root_) / device / "wwn");
        fs::create_directories((fs::path(root_) / device / korvproto::kLioCommandsFile).parent_path());
        WriteFile(device + korvproto::kLioUnitSerialFile, "T10 VPD Unit Serial Number: " + uuid + "\n");
        WriteFile(device + korvproto::kLioCommandsFile, std::to_string(lun.commands) + "\n");
        WriteFile(device + korvproto::kLioReadMbytesFile, std::to_string(lun.readMbytes) + "\n");
        WriteFile(device + korvproto::kLioWriteMbytesFile, std::to_string(lun.writeMbytes) + "\n");
    }
}

bool FixtureHost::Mount(const std::string &name)
{
    auto block = blocks.find(name);
    if (block == blocks.end())
        return false;
    const std::string node = root_ + "/dev/" + name;
    unlink(node.c_str());
    if (mknod(node.c_str(), S_IFBLK | 0600, makedev(block->second.major, block->second.minor)) != 0)
        return false;
    mounted_[name] = node;
    Write();
    return true;
}

std::string FixtureHost::MountKernelDevice()
{
    const std::vector<KernelDevice> devices = KernelDevices();
    auto unused = std::find_if(devices.begin(), devices.end(),
                               [this](const KernelDevice &device) { return blocks.count(device.name) == 0; });
    if (unused == devices.end())
        return "";
    const KernelDevice &device = *unused;
    blocks[device.name] = {device.major, device.minor, false, 7, 77, 777, 7777, 77777};
    if (Mount(device.name))
        return device.name;
    blocks.erase(device.name);
    return "";
}

korvstandin::HostDescription FixtureHost::Description() const
{
    korvstandin::HostDescription host;
    DescribeEnglishTexts(host);
    host.physMemSize = kMemTotalKiB;
    int bay = 1;
    for (const auto &[name, block] : blocks)
        if (block.disk)
            host.disks.push_back({bay++, DISK_CONTAINER_INTERNAL, 0, "/dev/" + name});
    for (const auto &[name, counters] : interfaces)
        if (name != "lo")
            host.interfaces.push_back({name});
    for (const auto &[name, node] : mounted_)
        if (blocks.count(name) > 0)
            host.spaces.push_back({node, "volume_" + name});
    for (const auto &[uuid, lun] : luns)
        host.luns.push_back({Json::Value(uuid), Json::Value(lun.device)});
    return host;
}

Json::Value CollectorDataWhen(const std::string &socketPath, const std::function<bool(const Json::Value &)> &ready)
{
    Json::Value request(Json::objectValue);
    request["resource"].append("all");
    const std::string frame = korvproto::EncodeRequestFrame(request);
    Json::Value data;
    const bool got = Eventually([&] {
        Json::Value reply;
        const std::string text = ExchangeWith(socketPath, frame);
        if (!Json::Reader().parse(text, reply) || !reply.isObject() || !reply["data"].isObject())
            return false;
        data = reply["data"];
        return ready(data);
    });
    return got ? data : Json::Value();
}

}  // namespace korvtest
