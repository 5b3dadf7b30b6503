// The stand-in platform keeps the operations' contracts that the library
// relies on: lists released by their head, fault switches, record layouts.
#include <gtest/gtest.h>

#include "korv_standin.h"

namespace {

using korvstandin::Fault;
using korvstandin::Op;

class StandinTest : public ::testing::Test {
protected:
    void SetUp() override { korvstandin::Reset(); }
    void TearDown() override { korvstandin::Reset(); }
};

TEST_F(StandinTest, DiskListIsHandedOutAndReleasedByItsHead)
{
    korvstandin::Host().disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"},
                                 {2, DISK_CONTAINER_EBOX, 0, "/dev/sdb", true}};
    DiskFilter filter{0x23};
    DiskInfoList *head = nullptr;
    ASSERT_EQ(DiskInfoEnum(&filter, &head), 0);
    ASSERT_NE(head, nullptr);
    ASSERT_NE(head->disk, nullptr);
    EXPECT_STREQ(head->disk->devicePath, "/dev/sda");
    ASSERT_NE(head->next, nullptr);
    EXPECT_EQ(head->next->disk, nullptr);
    EXPECT_EQ(korvstandin::OutstandingAllocations(), 1);
    DiskInfoEnumFree(head);
    EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
}

}  // namespace
