// The fixture of the tests that run against the stand-in platform: each test
// starts on an empty described host whose strings file holds the English
// texts, with no faults and an empty log, and must leave no platform list,
// hash or string list unreleased.
#ifndef KORVTEST_PLATFORM_TEST_H
#define KORVTEST_PLATFORM_TEST_H

#include <gtest/gtest.h>

#include "korv_standin.h"

namespace korvtest {

// Resets the stand-in to the empty host with English texts and clears the log.
void FreshPlatform();

// The English texts of the strings file's "volume" section.
void DescribeEnglishTexts(korvstandin::HostDescription &host);

class PlatformTest : public ::testing::Test {
protected:
    void SetUp() override { FreshPlatform(); }
    void TearDown() override
    {
        EXPECT_EQ(korvstandin::OutstandingAllocations(), 0) << "platform allocations left unreleased";
    }
};

// The same, for tables of cases.
template <typename Case>
class PlatformTestWithParam : public PlatformTest, public ::testing::WithParamInterface<Case> {};

}  // namespace korvtest

#endif
