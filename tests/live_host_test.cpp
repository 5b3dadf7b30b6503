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
using korvstandin::HostDescription;
using korvstandin::NetRole;
using ::testing::ElementsAre;

class LiveHostTest : public korvtest::PlatformTest {
protected:
    void SetUp() override
    {
        PlatformTest::SetUp();
        char pattern[] = "/tmp/korvsnmp-live-XXXXXX";
        ASSERT_NE(mkdtemp(pattern), nullptr);
        root_ = pattern;
    }
    void TearDown() override
    {
        fs::remove_all(root_);
        korvstandin::Reset();
        PlatformTest::TearDown();
    }

    void Write(const std::string &path, const std::string &text)
    {
        fs::create_directories((root_ / path).parent_path());
        std::ofstream(root_ / path) << text;
    }
    void Directory(const std::string &path) { fs::create_directories(root_ / path); }
    void Link(const std::string &path, const std::string &target)
    {
        fs::create_directories((root_ / path).parent_path());
        fs::create_directory_symlink(target, root_ / path);
    }

    fs::path root_;
};

TEST_F(LiveHostTest, WholeDisksAreNumberedAndUsbDevicesNamedByModel)
{
    Directory("sys/block/sda/device");
    Directory("sys/block/sdaa/device");
    Directory("sys/block/sdb/device");
    Directory("sys/block/loop0");  // no hardware behind it
    Directory("sys/devices/pci0/usb2/2-1/host6/block/sdc/device");
    Write("sys/devices/pci0/usb2/2-1/host6/block/sdc/device/vendor", "Kingston \n");
    Write("sys/devices/pci0/usb2/2-1/host6/block/sdc/device/model", "DataTraveler\n");
    Link("sys/block/sdc", "../devices/pci0/usb2/2-1/host6/block/sdc");

    HostDescription host;
    korvstandin::live::ProbeDisks(root_.string(), host);

    ASSERT_EQ(host.disks.size(), 3u);
    EXPECT_EQ(host.disks[0].devicePath, "/dev/sda");
    EXPECT_EQ(host.disks[1].devicePath, "/dev/sdb");
    EXPECT_EQ(host.disks[2].devicePath, "/dev/sdaa");
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(host.disks[i].number, i + 1);
        EXPECT_EQ(host.disks[i].container, DISK_CONTAINER_INTERNAL);
    }
    ASSERT_EQ(host.usb.devices.size(), 1u);
    EXPECT_EQ(host.usb.devices[0].name, "sdc");
    EXPECT_EQ(host.usb.devices[0].displayText, "Kingston DataTraveler");
}

TEST_F(LiveHostTest, InterfacesWithVlansBondsAndPpp)
{
    for (const char *name : {"lo", "eth0", "eth1", "eth0.5", "ppp0"})
        Directory(std::string("sys/class/net/") + name);
    Write("sys/class/net/bond0/bonding/slaves", "eth0 eth1\n");
    Write("proc/net/vlan/config",
          "VLAN Dev name    | VLAN ID\nName-Type: VLAN_NAME_TYPE_RAW_PLUS_VID_NO_PAD\n"
          "eth0.5         | 5  | eth0\n");
    const std::string root = root_.string();
    using korvstandin::live::ProbeInterface;

    EXPECT_THAT(korvstandin::live::ProbeInterfaceNames(root),
                ElementsAre("bond0", "eth0", "eth0.5", "eth1", "ppp0"));
    EXPECT_EQ(ProbeInterface(root, "bond0")->role, NetRole::Aggregation);
    EXPECT_THAT(ProbeInterface(root, "bond0")->members, ElementsAre("eth0", "eth1"));
    EXPECT_EQ(ProbeInterface(root, "eth0.5")->role, NetRole::Vlan);
    EXPECT_EQ(ProbeInterface(root, "eth0.5")->vlanParent, "eth0");
    EXPECT_EQ(ProbeInterface(root, "eth0.5")->vlanName, "eth0.5");
    EXPECT_EQ(ProbeInterface(root, "eth0")->role, NetRole::Plain);
    for (const char *absent : {"eth9", "", "..", "../net/eth0"})
        EXPECT_FALSE(ProbeInterface(root, absent)) << absent;
    EXPECT_EQ(korvstandin::live::ProbePppLink(root), "ppp0");
}

TEST_F(LiveHostTest, MountedBlockDevicesBecomeSpacesNamedByMountPoint)
{
    Write("proc/self/mounts",
          "/dev/vda1 / ext4 rw 0 0\n"
          "proc /proc proc rw 0 0\n"
          "/dev/vdb1 /volume\\0401 xfs rw 0 0\n"
          "/dev/vda1 /mnt/again ext4 rw 0 0\n");

    HostDescription host;
    korvstandin::live::ProbeSpaces(root_.string(), host);

    ASSERT_EQ(host.spaces.size(), 2u);
    EXPECT_EQ(host.spaces[0].devicePath, "/dev/vda1");
    EXPECT_EQ(host.spaces[0].name, "root");
    EXPECT_EQ(host.spaces[1].devicePath, "/dev/vdb1");
    EXPECT_EQ(host.spaces[1].name, "volume 1");
}

TEST_F(LiveHostTest, IscsiBackstoresBecomeLuns)
{
    Write("sys/kernel/config/target/core/iblock_0/lun_a/wwn/vpd_unit_serial",
          "T10 VPD Unit Serial Number: 6001405abcdef\n");
    Directory("sys/kernel/config/target/core/iblock_0/lun_without_serial");

    HostDescription host;
    korvstandin::live::ProbeLuns(root_.string(), host);

    ASSERT_EQ(host.luns.size(), 1u);
    EXPECT_EQ(host.luns[0].uuid.asString(), "6001405abcdef");
    EXPECT_EQ(host.luns[0].name.asString(), "lun_a");
}

TEST_F(LiveHostTest, StringsFileWhenPresentElseShippedTexts)
{
    HostDescription shipped;
    korvstandin::live::ProbeStrings(root_.string(), shipped);
    auto &texts = shipped.files[korvstandin::kStringsFilePath]["volume"];
    EXPECT_EQ(texts["volume_disk"], "Disk");
    EXPECT_EQ(texts["volume_expansion"], "Expansion Unit");
    EXPECT_EQ(texts["dedicated_ssd_cache"], "SSD Cache");

    Write(korvstandin::kStringsFilePath + 1,
          "# web texts\n[common]\nok = \"OK\"\n[volume]\nvolume_disk=\"Laufwerk\"\n");
    HostDescription present;
    korvstandin::live::ProbeStrings(root_.string(), present);
    auto &file = present.files[korvstandin::kStringsFilePath];
    EXPECT_EQ(file["volume"]["volume_disk"], "Laufwerk");
    EXPECT_EQ(file["common"]["ok"], "OK");
    EXPECT_EQ(file["volume"].count("volume_expansion"), 0u);
}

TEST_F(LiveHostTest, StandinAnswersFromThisMachineUntilDescribed)
{
    unsetenv("KORVPLATFORM_HOST");
    korvstandin::UseProcessHost();

    EXPECT_EQ(KLIBSystemPhysMemSizeGet(), korvstandin::live::ProbeMemory());
    EXPECT_GT(KLIBSystemPhysMemSizeGet(), 0u);
    KLIBNetInterfaceInfo records[32] = {};
    int count = KLIBNetGetInterfaceInfo(records, 32, 6);
    for (int i = 0; i < count; ++i)
        EXPECT_STRNE(records[i].name, "lo");
    char text[256] = {};
    EXPECT_EQ(KLIBCFileGetSectionValue(korvstandin::kStringsFilePath, "volume", "volume_disk", text,
                                       sizeof text),
              0);
    EXPECT_STRNE(text, "");

    korvstandin::Reset();
    EXPECT_EQ(KLIBSystemPhysMemSizeGet(), 0u);  // described now: an empty host
}

}  // namespace
