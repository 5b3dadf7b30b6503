#include "block_nodes.h"

#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>

namespace korvtest {
namespace {
constexpr char kSysBlock[] = "/sys/dev/block";
}

std::vector<KernelDevice> KernelDevices()
{
    std::vector<KernelDevice> devices;
    std::error_code error;
    for (std::filesystem::directory_iterator it(kSysBlock, error), end; !error && it != end;
         it.increment(error)) {
        KernelDevice device{};
        std::error_code linkError;
        device.name = std::filesystem::read_symlink(it->path(), linkError).filename().string();
        if (std::sscanf(it->path().filename().c_str(), "%u:%u", &device.major, &device.minor) == 2 &&
            !linkError && !device.name.empty())
            devices.push_back(device);
    }
    std::sort(devices.begin(), devices.end(),
              [](const KernelDevice &a, const KernelDevice &b) { return a.name < b.name; });
    return devices;
}

BlockNodes::~BlockNodes() { if (!directory_.empty()) std::filesystem::remove_all(directory_); }

bool BlockNodes::Make(size_t count, std::string &whyNot)
{
    const auto fail = [&whyNot](std::string why) { whyNot = std::move(why); return false; };
    devices_ = KernelDevices();
    if (devices_.size() < count)
        return fail("needs " + std::to_string(count) + " block devices under " + kSysBlock + ", found " +
                    std::to_string(devices_.size()));
    char pattern[] = "/tmp/korvsnmp_nodes_XXXXXX";
    if (mkdtemp(pattern) == nullptr) return fail(std::string("mkdtemp: ") + std::strerror(errno));
    directory_ = pattern;
    for (size_t i = 0; i < count; ++i) {
        nodes_.push_back(directory_ + "/node" + std::to_string(i));
        if (mknod(nodes_.back().c_str(), S_IFBLK | 0600, makedev(devices_[i].major, devices_[i].minor)) != 0)
            return fail(std::string("cannot make block-device nodes: ") + std::strerror(errno));
    }
    return true;
}

}  // namespace korvtest
