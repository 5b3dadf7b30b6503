// Real block-device nodes in a temporary directory, for devices that the
// running kernel has, so that the library's stat/readlink through
// /sys/dev/block gives their kernel names back. Making them needs root.
#ifndef KORVTEST_BLOCK_NODES_H
#define KORVTEST_BLOCK_NODES_H

#include <string>
#include <vector>

namespace korvtest {

// A block device that the running kernel has.
struct KernelDevice {
    unsigned int major;
    unsigned int minor;
    std::string name;  // its kernel name
};

// The devices listed under /sys/dev/block, by kernel name.
std::vector<KernelDevice> KernelDevices();

class BlockNodes {
public:
    BlockNodes() = default;
    ~BlockNodes();
    BlockNodes(const BlockNodes &) = delete;
    BlockNodes &operator=(const BlockNodes &) = delete;

    // Makes `count` nodes, node i for kernel device i. False, with the
    // reason in `whyNot`, when the kernel has fewer devices or mknod is refused.
    bool Make(size_t count, std::string &whyNot);

    const std::string &Directory() const { return directory_; }
    const std::string &Node(size_t i) const { return nodes_.at(i); }
    const std::string &Name(size_t i) const { return devices_.at(i).name; }
    const KernelDevice &Device(size_t i) const { return devices_.at(i); }

private:
    std::string directory_;
    std::vector<KernelDevice> devices_;
    std::vector<std::string> nodes_;
};

}  // namespace korvtest

#endif
