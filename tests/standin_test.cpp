// The stand-in's behaviour that the library's tests rely on without seeing
// it fail otherwise: records written only where the contract says, faults
// on the chosen calls only. (List release, last errors and the two-call
// device list show in the library's own tests and the fault sweep.)
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
