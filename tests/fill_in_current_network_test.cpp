// The network section: which interfaces are reported and in what order,
// aggregation sums, PPPoE records, 32-bit totals, and bad input. A failing
// interface list is also covered by the fault sweep.
#include <syslog.h>

#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/fill_in_current_network.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using korvstandin::Host, korvstandin::NetInterface, korvstandin::NetRole;
using korvtest::Canonical, korvtest::Logged, korvtest::LoggedMessages, ::testing::ElementsAre;

constexpr char kUnit[] = "fill_in_current_network";

NetInterface Vlan(std::string name, std::string listed) { return {name, NetRole::Vlan, "eth0", listed}; }
NetInterface Aggregation(std::string name, std::vector<std::string> members) { return {name, NetRole::Aggregation, "", "", members}; }

// Runs the fill-in on `network` over an output holding "earlier"; the output
// as compact text.
std::string Fill(const std::string &network, bool succeeds = true)
{
    Json::Value output = "earlier";
    EXPECT_EQ(KORVSNMP::FillInCurrentNetwork(korvtest::ParseJson(network), output), succeeds);
    return korvtest::JsonText(output);
}

using NetworkTest = korvtest::PlatformTest;

TEST_F(NetworkTest, InterfacesComeInByteOrderAfterTheTotal)
{
    Host().interfaces = {{"eth2"}, {"eth10"}, {"eth1"}, {"Eth0"}, {"eth0"}};
    EXPECT_EQ(Fill(R"([{"device": "eth1", "rx": 5, "tx": 6}, {"device": "eth9", "rx": 50},
                       {"device": "eth0", "rx": 1, "tx": 2, "extra": "kept"},
                       {"device": "eth10", "rx": 3}, {"device": "eth2"}, {"device": "Eth0"}])"),
              Canonical(R"([{"device": "total", "rx": 9, "tx": 8}, {"device": "Eth0"},
                        {"device": "eth0", "rx": 1, "tx": 2, "extra": "kept"}, {"device": "eth1", "rx": 5, "tx": 6},
                        {"device": "eth10", "rx": 3}, {"device": "eth2"}])"));
    EXPECT_THAT(LoggedMessages(), ::testing::IsEmpty());
}

// Sums and the total wrap around in 32 bits; PPPoE records follow every
// group, uncounted.
TEST_F(NetworkTest, AggregationIsSummedFromItsMembersOnlyAndPppoeFollows)
{
    Host().interfaces = {{"eth0"}, Aggregation("bond0", {"eth0", "eth1"}), {"eth1"},
                         Aggregation("bond1", {"eth7", "eth8"}), Aggregation("bond2", {"eth0", "eth1", "eth2"})};
    Host().interfaces[4].memberCountClaim = 0, Host().pppoeInterface = "ppp0";
    EXPECT_EQ(Fill(R"([{"device": "bond0", "rx": 500, "tx": 500}, {"device": "eth0", "rx": 4294967295, "tx": 20},
                       {"device": "eth1", "rx": 2, "tx": 2}, {"device": "bond2", "rx": 9},
                       {"device": "ppp01", "rx": 7}, {"device": "pp0", "rx": 8}, {"device": 5}, null,
                       {"device": "eth0", "rx": 1000, "tx": 1000}, {"device": "ppp0", "rx": 9}])"),
              Canonical(R"([{"device": "total", "rx": 2, "tx": 44}, {"device": "eth0", "rx": 4294967295, "tx": 20},
                        {"device": "eth1", "rx": 2, "tx": 2}, {"device": "bond0", "rx": 1, "tx": 22},
                        {"device": "ppp01", "rx": 7}, {"device": "ppp0", "rx": 9}])"));
}

TEST_F(NetworkTest, AggregationMembersAreReadFromAtMostThirtyTwoSlots)
{
    Host().interfaces = {Aggregation("bond0", {"eth0", "eth1"}), Aggregation("bond1", {"eth0"})};
    // Slots 2 to 31 hold empty names.
    Host().interfaces[0].memberCountClaim = 40, Host().interfaces[1].memberCountClaim = -3;
    EXPECT_EQ(Fill(R"([{"device": "eth0", "rx": 1, "tx": 1}, {"device": "eth1", "rx": 2, "tx": 2},
                       {"device": "", "rx": 100, "tx": 100}])"),
              Canonical(R"([{"device": "total", "rx": 3003, "tx": 3003}, {"device": "bond0", "rx": 3003, "tx": 3003}])"));
}

TEST_F(NetworkTest, EachKindOfInterfaceIsListedByItsOwnRule)
{
    Host().interfaces = {{"dkos0"}, {"dko"}, Vlan("eth0.5", "dkos5"), {"ovs_eth3", NetRole::OvsMaster},
                         {"ovs1", NetRole::OvsMaster}, {"ab", NetRole::OvsMaster}, {"eth4"}};
    // The second OVS master gives any answer but 0 and 2.
    Host().interfaces[4].ovsMasterAnswer = -7, Host().interfaces[6].vlanQueryFails = true;
    EXPECT_EQ(Fill(R"([{"device": "dkos0"}, {"device": "dko"}, {"device": "dkos5"}, {"device": "eth3"},
                       {"device": "", "rx": 1}, {"device": "eth4"}])"),
              Canonical(R"([{"device": "total", "rx": 2, "tx": 0}, {"device": "", "rx": 1}, {"device": "", "rx": 1},
                        {"device": "dko"}, {"device": "dkos5"}, {"device": "eth3"}])"));
}

TEST_F(NetworkTest, VlanRecordIsZeroedOncePerCallNotPerInterface)
{
    Host().interfaces = {Vlan("eth0.7", ""), Vlan("eth0.5", "vlan5"), Vlan("eth0.6", "vlan6")};
    // The first and third answer "VLAN" without writing the record.
    Host().interfaces[0].vlanRecordUnwritten = Host().interfaces[2].vlanRecordUnwritten = true;
    EXPECT_EQ(Fill(R"([{"device": "vlan5", "rx": 1}, {"device": "", "rx": 10}])"),
              Canonical(R"([{"device": "total", "rx": 12, "tx": 0}, {"device": "", "rx": 10},
                        {"device": "vlan5", "rx": 1}, {"device": "vlan5", "rx": 1}])"));
}

TEST_F(NetworkTest, EmptySectionGivesTheZeroTotalAndNoInterfaceTheBareOne)
{
    Host().interfaces = {{"eth0"}}; korvstandin::SetJournal(true);
    EXPECT_EQ(Fill("[]"), Canonical(R"([{"device": "total", "rx": 0, "tx": 0}])"));
    EXPECT_THAT(korvstandin::Journal(), ElementsAre("KLIBNetGetInterfaceInfo(32, 6)", "KLIBNetVlanGet(eth0)",
                                                    "KLIBNetOVSIfIsMaster(eth0)", "KORVPPPoeIntfGet(16)"));

    korvtest::FreshPlatform();  // a platform that lists nothing fails as one that fails
    EXPECT_EQ(Fill(R"([{"device": "eth0", "rx": 1}])", false), Canonical(R"([{"device": "total"}])"));
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "Failed to get net interface, errno=0x0")));
}

TEST_F(NetworkTest, UnreadableInputFailsAndLeavesTheOutputUntouched)
{
    Host().interfaces = {{"eth0"}, Aggregation("bond0", {"eth1"})};
    const auto number = [](std::string device, const char *member) {
        return "Network device [" + device + "]: \"" + member + "\" is not an unsigned 32-bit number"; };
    const struct { const char *network; std::string message; } cases[] = {
        {R"({"device": "eth0"})", "ReplyNetwork is not array"},
        {R"([["eth0"]])", "Network element 0 is not an object"},
        {R"([{"device": "eth0"}, 3])", "Network element 1 is not an object"},
        {R"([{"device": "eth0", "rx": -1}])", number("eth0", "rx")},
        {R"([{"device": "eth0", "tx": 4294967296}])", number("eth0", "tx")},
        {R"([{"device": "eth1", "rx": "12"}])", number("eth1", "rx")}};
    for (const auto &bad : cases) {
        korvtest::ClearLog(); SCOPED_TRACE(bad.network);
        EXPECT_EQ(Fill(bad.network, false), Canonical(R"("earlier")"));
        EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, bad.message)));
    }
}

}  // namespace
