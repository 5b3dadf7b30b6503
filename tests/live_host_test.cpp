// Describing a live Linux host: probes over a directory tree shaped like
// the host's /sys and /proc, and the stand-in answering from this machine.
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korv_standin.h"
#include "live_host.h"
#include "platform_test.h"

namespace {

namespace fs = std::filesystem;
using korvstandin::HostDescription, korvstandin::NetRole, ::testing::ElementsAre;

struct LiveHostTest : korvtest::PlatformTest {
    ~LiveHostTest() override { fs::remove_all(root_); }

    // Writes `text` at `path` under the root; with no text, makes a directory.
    void Write(const std::string &path, const char *text = nullptr)
    {
        fs::create_directories(text != nullptr ? (root_ / path).parent_path() : root_ / path);
        if (text != nullptr) std::ofstream(root_ / path) << text;
    }

    // Made by the first Write; left absent by a test that writes nothing.
    const fs::path root_ = fs::temp_directory_path() / ("korvsnmp-live-" + std::to_string(getpid()));
};

TEST_F(LiveHostTest, DisksSpacesAndLunsAreProbed)
{
    for (const char *disk : {"sda", "sdaa", "sdb"}) Write(std::string("sys/block/") + disk + "/device");
    Write("sys/block/loop0");  // no hardware behind it
    Write("sys/devices/pci0/usb2/2-1/host6/block/sdc/device/vendor", "Kingston \n");
    Write("sys/devices/pci0/usb2/2-1/host6/block/sdc/device/model", "DataTraveler\n");
    fs::create_directory_symlink("../devices/pci0/usb2/2-1/host6/block/sdc", root_ / "sys/block/sdc");

    HostDescription host; korvstandin::live::ProbeDisks(root_.string(), host);
    std::vector<std::string> disks, spaces;
    for (const korvstandin::Disk &disk : host.disks)
        disks.push_back(std::to_string(disk.number) + (disk.container == DISK_CONTAINER_INTERNAL ? " internal " : " ")
                        + disk.devicePath);
    EXPECT_THAT(disks, ElementsAre("1 internal /dev/sda", "2 internal /dev/sdb", "3 internal /dev/sdaa"));
    ASSERT_EQ(host.usb.devices.size(), 1u);
    EXPECT_EQ(host.usb.devices[0].name + "=" + host.usb.devices[0].displayText, "sdc=Kingston DataTraveler");

    // Mounted block devices become spaces, named by mount point; iSCSI
    // backstores with a serial become LUNs.
    Write("proc/self/mounts", "/dev/vda1 / ext4 rw 0 0\nproc /proc proc rw 0 0\n"
                              "/dev/vdb1 /volume\\0401 xfs rw 0 0\n/dev/vda1 /mnt/again ext4 rw 0 0\n");
    korvstandin::live::ProbeSpaces(root_.string(), host);
    for (const korvstandin::Space &space : host.spaces) spaces.push_back(space.devicePath + "=" + space.name);
    EXPECT_THAT(spaces, ElementsAre("/dev/vda1=root", "/dev/vdb1=volume 1"));

    Write("sys/kernel/config/target/core/iblock_0/lun_a/wwn/vpd_unit_serial",
          "T10 VPD Unit Serial Number: 6001405abcdef\n");
    Write("sys/kernel/config/target/core/iblock_0/lun_without_serial");
    korvstandin::live::ProbeLuns(root_.string(), host); ASSERT_EQ(host.luns.size(), 1u);
    EXPECT_EQ(host.luns[0].uuid.asString() + "=" + host.luns[0].name.asString(), "6001405abcdef=lun_a");
}

TEST_F(LiveHostTest, InterfacesWithVlansBondsAndPpp)
{
    for (const char *name : {"lo", "eth0", "eth1", "eth0.5", "ppp0"})
        Write(std::string("sys/class/net/") + name);
    Write("sys/class/net/bond0/bonding/slaves", "eth0 eth1\n");
    Write("proc/net/vlan/config", "VLAN Dev name    | VLAN ID\nName-Type: VLAN_NAME_TYPE_RAW_PLUS_VID_NO_PAD\n"
                                  "eth0.5         | 5  | eth0\n");
    const std::string root = root_.string(); using korvstandin::live::ProbeInterface;

    EXPECT_THAT(korvstandin::live::ProbeInterfaceNames(root), ElementsAre("bond0", "eth0", "eth0.5", "eth1", "ppp0"));
    EXPECT_EQ(ProbeInterface(root, "bond0")->role, NetRole::Aggregation);
    EXPECT_THAT(ProbeInterface(root, "bond0")->members, ElementsAre("eth0", "eth1"));
    const auto vlan = ProbeInterface(root, "eth0.5");
    EXPECT_TRUE(vlan->role == NetRole::Vlan && vlan->vlanParent == "eth0" && vlan->vlanName == "eth0.5");
    EXPECT_EQ(ProbeInterface(root, "eth0")->role, NetRole::Plain);
    for (const char *absent : {"eth9", "", "..", "../net/eth0"})
        EXPECT_FALSE(ProbeInterface(root, absent)) << absent;
    EXPECT_EQ(korvstandin::live::ProbePppLink(root), "ppp0");
}

TEST_F(LiveHostTest, StringsFileWhenPresentElseShippedTexts)
{
    HostDescription shipped, present; korvstandin::live::ProbeStrings(root_.string(), shipped);
    auto &texts = shipped.files[korvstandin::kStringsFilePath]["volume"];
    EXPECT_EQ(texts["volume_disk"] + "/" + texts["volume_expansion"] + "/" + texts["dedicated_ssd_cache"],
              "Disk/Expansion Unit/SSD Cache");

    Write(korvstandin::kStringsFilePath + 1,
          "# web texts\n[common]\nok = \"OK\"\n[volume]\nvolume_disk=\"Laufwerk\"\n");
    korvstandin::live::ProbeStrings(root_.string(), present);
    EXPECT_EQ(present.files[korvstandin::kStringsFilePath],
              (korvstandin::SectionedFile{{"common", {{"ok", "OK"}}}, {"volume", {{"volume_disk", "Laufwerk"}}}}));
}

TEST_F(LiveHostTest, StandinAnswersFromThisMachineUntilDescribed)
{
    unsetenv("KORVPLATFORM_HOST"); korvstandin::UseProcessHost();

    EXPECT_EQ(KLIBSystemPhysMemSizeGet(), korvstandin::live::ProbeMemory());
    EXPECT_GT(KLIBSystemPhysMemSizeGet(), 0u);
    KLIBNetInterfaceInfo records[32] = {}; char text[256] = {};
    for (int i = 0, count = KLIBNetGetInterfaceInfo(records, 32, 6); i < count; ++i)
        EXPECT_STRNE(records[i].name, "lo");
    EXPECT_EQ(KLIBCFileGetSectionValue(korvstandin::kStringsFilePath, "volume", "volume_disk", text, sizeof text), 0);
    EXPECT_STRNE(text, "");

    korvstandin::Reset();
    EXPECT_EQ(KLIBSystemPhysMemSizeGet(), 0u);  // described now: an empty host
}

}  // namespace
