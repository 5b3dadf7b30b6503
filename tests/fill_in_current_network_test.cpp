// The network section: which interfaces are reported and in what order,
// aggregation sums, PPPoE records, 32-bit totals, and every failure path.
#include <syslog.h>

#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korv_standin.h"
#include "platform_test.h"
#include "json_text.h"
#include "korvsnmp/fill_in_current_network.h"
#include "syslog_capture.h"

namespace {

using korvstandin::Fault;
using korvstandin::NetInterface;
using korvstandin::NetRole;
using korvstandin::Op;
using korvtest::Logged;
using korvtest::LoggedMessages;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kUnit[] = "fill_in_current_network";

using korvtest::Canonical;
using korvtest::ParseJson;

NetInterface Vlan(const std::string &name, const std::string &listed)
{
    return {name, NetRole::Vlan, "eth0", listed};
}

NetInterface Aggregation(const std::string &name, std::vector<std::string> members)
{
    return {name, NetRole::Aggregation, "", "", std::move(members)};
}

NetInterface OvsMaster(const std::string &name)
{
    return {name, NetRole::OvsMaster};
}

class NetworkTest : public korvtest::PlatformTest {
protected:

    // Runs the fill-in on `network` over an output holding "earlier"; the
    // output as compact text.
    static std::string Fill(const std::string &network, bool succeeds = true)
    {
        Json::Value output = "earlier";
        EXPECT_EQ(KORVSNMP::FillInCurrentNetwork(ParseJson(network), output), succeeds);
        return korvtest::JsonText(output);
    }
};

TEST_F(NetworkTest, InterfacesComeInByteOrderAfterTheTotal)
{
    korvstandin::Host().interfaces = {{"eth2"}, {"eth10"}, {"eth1"}, {"Eth0"}, {"eth0"}};

    EXPECT_EQ(Fill(R"([{"device": "eth1", "rx": 5, "tx": 6}, {"device": "eth9", "rx": 50},
                       {"device": "eth0", "rx": 1, "tx": 2, "extra": "kept"},
                       {"device": "eth10", "rx": 3}, {"device": "eth2"}, {"device": "Eth0"}])"),
              Canonical(R"([{"device": "total", "rx": 9, "tx": 8},
                        {"device": "Eth0"}, {"device": "eth0", "rx": 1, "tx": 2, "extra": "kept"},
                        {"device": "eth1", "rx": 5, "tx": 6}, {"device": "eth10", "rx": 3},
                        {"device": "eth2"}])"));
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

TEST_F(NetworkTest, AggregationIsSummedFromItsMembersOnly)
{
    korvstandin::Host().interfaces = {{"eth0"}, Aggregation("bond0", {"eth0", "eth1"}), {"eth1"},
                                      Aggregation("bond1", {"eth7", "eth8"}),
                                      Aggregation("bond2", {"eth0", "eth1", "eth2"})};
    korvstandin::Host().interfaces[4].memberCountClaim = 0;

    EXPECT_EQ(Fill(R"([{"device": "bond0", "rx": 500, "tx": 500}, {"device": "eth0", "rx": 10, "tx": 20},
                       {"device": "eth1", "rx": 1, "tx": 2}, {"device": "bond2", "rx": 9},
                       {"device": "eth0", "rx": 1000, "tx": 1000}])"),
              Canonical(R"([{"device": "total", "rx": 22, "tx": 44},
                        {"device": "eth0", "rx": 10, "tx": 20}, {"device": "eth1", "rx": 1, "tx": 2},
                        {"device": "bond0", "rx": 11, "tx": 22}])"));
}

TEST_F(NetworkTest, AggregationMembersAreReadFromAtMostThirtyTwoSlots)
{
    korvstandin::Host().interfaces = {Aggregation("bond0", {"eth0", "eth1"}),
                                      Aggregation("bond1", {"eth0"})};
    korvstandin::Host().interfaces[0].memberCountClaim = 40;  // slots 2 to 31 hold empty names
    korvstandin::Host().interfaces[1].memberCountClaim = -3;

    EXPECT_EQ(Fill(R"([{"device": "eth0", "rx": 1, "tx": 1}, {"device": "eth1", "rx": 2, "tx": 2},
                       {"device": "", "rx": 100, "tx": 100}])"),
              Canonical(R"([{"device": "total", "rx": 3003, "tx": 3003},
                        {"device": "bond0", "rx": 3003, "tx": 3003}])"));
}

TEST_F(NetworkTest, EachKindOfInterfaceIsListedByItsOwnRule)
{
    korvstandin::Host().interfaces = {
        {"dkos0"},           {"dko"},          Vlan("eth0.5", "dkos5"), OvsMaster("ovs_eth3"),
        OvsMaster("ovs1"),   OvsMaster("ab"),  {"eth4"}};
    korvstandin::Host().interfaces[4].ovsMasterAnswer = -7;  // any answer but 0 and 2
    korvstandin::Host().interfaces[6].vlanQueryFails = true;

    EXPECT_EQ(Fill(R"([{"device": "dkos0"}, {"device": "dko"}, {"device": "dkos5"},
                       {"device": "eth3"}, {"device": "", "rx": 1}, {"device": "eth4"}])"),
              Canonical(R"([{"device": "total", "rx": 2, "tx": 0},
                        {"device": "", "rx": 1}, {"device": "", "rx": 1},
                        {"device": "dko"}, {"device": "dkos5"}, {"device": "eth3"}])"));
}

TEST_F(NetworkTest, VlanRecordIsZeroedOncePerCallNotPerInterface)
{
    korvstandin::Host().interfaces = {Vlan("eth0.7", ""), Vlan("eth0.5", "vlan5"),
                                      Vlan("eth0.6", "vlan6")};
    // The first and third answer "VLAN" without writing the record.
    korvstandin::Host().interfaces[0].vlanRecordUnwritten = true;
    korvstandin::Host().interfaces[2].vlanRecordUnwritten = true;

    EXPECT_EQ(Fill(R"([{"device": "vlan5", "rx": 1}, {"device": "", "rx": 10}])"),
              Canonical(R"([{"device": "total", "rx": 12, "tx": 0}, {"device": "", "rx": 10},
                        {"device": "vlan5", "rx": 1}, {"device": "vlan5", "rx": 1}])"));
}

TEST_F(NetworkTest, TotalsWrapAroundInThirtyTwoBits)
{
    korvstandin::Host().interfaces = {{"eth0"}, {"eth1"}, Aggregation("bond0", {"eth0", "eth1"})};

    EXPECT_EQ(Fill(R"([{"device": "eth0", "rx": 4294967295, "tx": 4294967290},
                       {"device": "eth1", "rx": 2, "tx": 10}])"),
              Canonical(R"([{"device": "total", "rx": 2, "tx": 8},
                        {"device": "eth0", "rx": 4294967295, "tx": 4294967290},
                        {"device": "eth1", "rx": 2, "tx": 10},
                        {"device": "bond0", "rx": 1, "tx": 4}])"));
}

TEST_F(NetworkTest, PppoeRecordsFollowEveryGroupUncounted)
{
    korvstandin::Host().interfaces = {{"eth0"}, Aggregation("bond0", {"eth0"})};
    korvstandin::Host().pppoeInterface = "ppp0";

    EXPECT_EQ(Fill(R"([{"device": "ppp01", "rx": 7}, {"device": "pp0", "rx": 8}, {"device": 5},
                       {"device": "eth0", "rx": 1}, {"device": "ppp0", "rx": 9}, null])"),
              Canonical(R"([{"device": "total", "rx": 2, "tx": 0}, {"device": "eth0", "rx": 1},
                        {"device": "bond0", "rx": 1, "tx": 0},
                        {"device": "ppp01", "rx": 7}, {"device": "ppp0", "rx": 9}])"));
}

TEST_F(NetworkTest, EmptySectionGivesTheZeroTotalAndFixedArgumentsArePassed)
{
    korvstandin::Host().interfaces = {{"eth0"}};
    korvstandin::SetJournal(true);

    EXPECT_EQ(Fill("[]"), Canonical(R"([{"device": "total", "rx": 0, "tx": 0}])"));

    EXPECT_THAT(korvstandin::Journal(),
                ElementsAre("KLIBNetGetInterfaceInfo(32, 6)", "KLIBNetVlanGet(eth0)",
                            "KLIBNetOVSIfIsMaster(eth0)", "KORVPPPoeIntfGet(16)"));
}

TEST_F(NetworkTest, NoInterfaceLeavesTheBareTotalAndThePlatformsError)
{
    korvstandin::Host().interfaces = {{"eth0"}};
    korvstandin::SetFault(Op::KLIBNetGetInterfaceInfo, Fault::Fail, 0x1D2);

    EXPECT_EQ(Fill(R"([{"device": "eth0", "rx": 1}])", false), Canonical(R"([{"device": "total"}])"));
    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit, "Failed to get net interface, errno=0x1D2")));

    korvtest::FreshPlatform();  // a platform that lists nothing fails alike
    EXPECT_EQ(Fill("[]", false), Canonical(R"([{"device": "total"}])"));
    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit, "Failed to get net interface, errno=0x0")));
}

TEST_F(NetworkTest, UnreadableInputFailsAndLeavesTheOutputUntouched)
{
    korvstandin::Host().interfaces = {{"eth0"}, Aggregation("bond0", {"eth1"})};
    const struct {
        const char *network;
        const char *message;
    } cases[] = {
        {R"({"device": "eth0"})", "ReplyNetwork is not array"},
        {R"("eth0")", "ReplyNetwork is not array"},
        {R"([{"device": "eth0"}, 3])", "Network element 1 is not an object"},
        {R"([["eth0"]])", "Network element 0 is not an object"},
        {R"([{"device": "eth0", "rx": -1}])", R"(Network device [eth0]: "rx" is not an unsigned 32-bit number)"},
        {R"([{"device": "eth0", "tx": 4294967296}])",
         R"(Network device [eth0]: "tx" is not an unsigned 32-bit number)"},
        {R"([{"device": "eth1", "rx": "12"}])", R"(Network device [eth1]: "rx" is not an unsigned 32-bit number)"},
        {R"([{"device": "eth0", "rx": [1]}])", R"(Network device [eth0]: "rx" is not an unsigned 32-bit number)"},
    };
    for (const auto &bad : cases) {
        korvtest::ClearLog();
        EXPECT_EQ(Fill(bad.network, false), Canonical(R"("earlier")")) << bad.network;
        EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, bad.message)));
    }
}

}  // namespace
