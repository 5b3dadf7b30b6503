// The stand-in platform keeps the contracts that the library's tests rely
// on: lists released by their head, failures with the platform's last error,
// the two-call device list, records written only where the contract says.
#include <cstdlib>
#include <cstring>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korv_standin.h"
#include "platform_test.h"

namespace {

using korvstandin::Fault;
using korvstandin::Host;
using korvstandin::Op;

using StandinTest = korvtest::PlatformTest;

TEST_F(StandinTest, ListsAreHandedOutInOrderAndReleasedByTheirHead)
{
    Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {2, DISK_CONTAINER_EBOX, 0, "", true}};
    Host().spaces = {{"/dev/vg1/volume_1", "Volume 1"}};
    Host().expansionUnits = {{1, {"/dev/sdb"}, std::string("X5"), false}};
    DiskFilter filter{0x23};
    DiskInfoList *disks = nullptr;
    SpaceInfo *spaces = nullptr;
    EBoxInfo *units = nullptr;

    ASSERT_EQ(DiskInfoEnum(&filter, &disks), 0);
    ASSERT_EQ(KORVSpaceInfoEnum(1, &spaces), 0);
    ASSERT_EQ(KORVEBoxInfoEnum(&units), 0);
    EXPECT_EQ(korvstandin::OutstandingAllocations(), 3);

    EXPECT_STREQ(disks->disk->devicePath, "/dev/sda");
    EXPECT_EQ(disks->next->disk, nullptr);
    EXPECT_STREQ(spaces->name, "Volume 1");
    EXPECT_EQ(KLIBCSzListFind(units->diskPaths, "/dev/sdb"), 0);
    EXPECT_LT(KLIBCSzListFind(units->diskPaths, "sdb"), 0);
    EXPECT_STREQ(units->modelName(&units->identity), "X5");
    EXPECT_EQ(KORVEBoxIsPoweron(units), 0);
    DiskInfoEnumFree(disks);
    KORVSpaceInfoFree(spaces);
    KORVEBoxInfoEnumFree(units);
}

TEST_F(StandinTest, DeviceListComesInTwoCalls)
{
    Host().usb.devices = {{"sdq", "USB Disk 1"}, {"sdr", "USB Disk 2"}};
    int needed = 0;
    ASSERT_EQ(KORVUSBDevEnum(EXTERNAL_USB_DEVICE, nullptr, 0, &needed), 0);
    EXPECT_EQ(needed, static_cast<int>(2 * sizeof(char *) + 8));

    char **block = static_cast<char **>(std::calloc(1, needed));
    ASSERT_EQ(KORVUSBDevEnum(EXTERNAL_USB_DEVICE, block, needed, &needed), 2);
    EXPECT_STREQ(block[0], "sdq");
    EXPECT_STREQ(block[1], "sdr");
    EXPECT_LT(KORVUSBDevEnum(EXTERNAL_USB_DEVICE, block, needed - 1, &needed), 0);
    std::free(block);

    int esataNeeded = -1;
    ASSERT_EQ(KORVUSBDevEnum(EXTERNAL_ESATA_DEVICE, nullptr, 0, &esataNeeded), 0);
    EXPECT_EQ(esataNeeded, 0);
}

TEST_F(StandinTest, VlanRecordIsWrittenOnlyForAVlan)
{
    Host().interfaces = {{"eth0"}, {"eth0.5", korvstandin::NetRole::Vlan, "eth0", "vlan5"}};
    KLIBNetVlanInfo vlan;
    std::memset(&vlan, 0x5a, sizeof vlan);

    EXPECT_EQ(KLIBNetVlanGet("eth0", &vlan), 0);
    EXPECT_EQ(vlan.name[0], 0x5a);
    EXPECT_EQ(KLIBNetVlanGet("eth0.5", &vlan), 1);
    EXPECT_STREQ(vlan.name, "vlan5");
}

struct CallsCase {
    korvstandin::Calls calls;
    std::vector<bool> fails;  // calls 1 to 4
};

class StandinFaultCalls : public korvtest::PlatformTestWithParam<CallsCase> {};

TEST_P(StandinFaultCalls, FaultHitsTheChosenCalls)
{
    Host().physMemSize = 64;
    korvstandin::SetFault(Op::KLIBSystemPhysMemSizeGet, Fault::Fail, 0x77, GetParam().calls);
    for (bool fails : GetParam().fails)
        EXPECT_EQ(KLIBSystemPhysMemSizeGet(), fails ? 0u : 64u);
}

INSTANTIATE_TEST_SUITE_P(Calls, StandinFaultCalls,
                         ::testing::Values(CallsCase{korvstandin::Calls::Every(), {true, true, true, true}},
                                           CallsCase{korvstandin::Calls::Only(2), {false, true, false, false}},
                                           CallsCase{korvstandin::Calls::From(3), {false, false, true, true}}));

}  // namespace
