// The collector's cumulative counters through the library: every record
// that the library copies keeps them exactly, 64 bits included; the records
// that it builds itself (the interface total and aggregations, the disk
// total) carry none; and a reply without counters gives none, not zeros.
#include <cstdint>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/writer.h>  // prints a Json::Value in a failure

#include "block_nodes.h"
#include "catalogue/statistics_catalogue.h"
#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/parse_data.h"
#include "platform_test.h"
#include "syslog_capture.h"

namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using ::testing::IsEmpty;

constexpr uint64_t kBeyond32Bits = uint64_t{1} << 40;
constexpr char kLunUuid[] = "6001405a-1c2d-4e5f-8a9b-0c1d2e3f4a5b";

std::vector<std::string> CounterMembers(Section section)
{
    std::vector<std::string> members;
    for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(section))
        if (statistic->kind == Kind::Counter)
            members.push_back(statistic->member);
    return members;
}

// A record of the collector's: `device` (unless empty), one rate, and when
// `seed` is not 0 the section's counters, each a value of its own beyond 32 bits.
Json::Value Record(Section section, const std::string &device, uint64_t seed)
{
    Json::Value record(Json::objectValue);
    if (!device.empty())
        record["device"] = device;
    record[section == Section::Interface ? "rx" : section == Section::Cpu ? "idle" : "read_byte"] = 5;
    uint64_t value = kBeyond32Bits * seed;
    for (const std::string &member : CounterMembers(section))
        if (seed != 0)
            record[member] = Json::UInt64(value++);
    return record;
}

// A record of the result that carries the same counters as `sent`, or none when `sent` has none.
::testing::AssertionResult SameCounters(Section section, const Json::Value &received, const Json::Value &sent)
{
    for (const std::string &member : CounterMembers(section)) {
        if (sent.isMember(member) != received.isMember(member))
            return ::testing::AssertionFailure() << member << " present in only one of " << sent << received;
        if (sent.isMember(member) && !(received[member].isUInt64() &&
                                       received[member].asUInt64() == sent[member].asUInt64()))
            return ::testing::AssertionFailure() << member << ": " << received[member] << " sent as " << sent[member];
    }
    return ::testing::AssertionSuccess();
}

struct CounterPassThroughTest : korvtest::PlatformTest {
    void SetUp() override
    {
        korvtest::PlatformTest::SetUp();
        if (std::string whyNot; !nodes_.Make(1, whyNot))
            GTEST_SKIP() << whyNot;
        korvstandin::HostDescription &host = korvstandin::Host();
        host.disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"}};
        host.interfaces = {{"eth0"}, {"eth1"}};
        host.interfaces.push_back({"bond0", korvstandin::NetRole::Aggregation, "", "", {"eth0", "eth1"}});
        host.pppoeInterface = "ppp0";
        host.spaces = {{nodes_.Node(0), "volume1"}};
        host.luns = {{Json::Value(kLunUuid), Json::Value("LUN-1")}};
    }

    // The reply of a collector on this host; with counters when `counters`.
    Json::Value Reply(bool counters) const
    {
        const uint64_t seed = counters ? 1 : 0;
        Json::Value data(Json::objectValue);
        data["System"].append(Record(Section::Cpu, "", seed));
        Json::Value memory(Json::objectValue);
        memory["total_real"] = 2048;
        data["Memory"].append(memory);
        for (const char *device : {"eth0", "eth1", "ppp0"})
            data["Network"].append(Record(Section::Interface, device, seed * (1 + data["Network"].size())));
        for (const char *device : {"sda", "sdb"})
            data["DiskIO"].append(Record(Section::Disk, device, seed * (10 + data["DiskIO"].size())));
        data["SpaceIO"].append(Record(Section::Volume, nodes_.Name(0), seed * 20));
        data["SpaceIO"].append(Record(Section::VolumeTotal, "total", 0));
        data["iSCSI"].append(Record(Section::Lun, kLunUuid, seed * 30));
        data["NFS"] = Record(Section::Nfs, "", seed * 40);
        data["time"] = 1700000000;
        Json::Value reply(Json::objectValue);
        reply["data"] = data;
        return reply;
    }

    korvtest::BlockNodes nodes_;
};

TEST_F(CounterPassThroughTest, CopiedRecordsKeepTheirCountersBuiltOnesHaveNone)
{
    for (bool counters : {true, false}) {
        SCOPED_TRACE(counters ? "with counters" : "without counters");
        const Json::Value reply = Reply(counters);
        const Json::Value &data = reply["data"];
        ASSERT_EQ(data["iSCSI"][0].isMember(CounterMembers(Section::Lun).front()), counters);
        Json::Value result;
        ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue), reply, result))
            << ::testing::PrintToString(korvtest::LoggedMessages());

        EXPECT_TRUE(SameCounters(Section::Cpu, result["cpu"], data["System"][0]));
        EXPECT_TRUE(SameCounters(Section::Nfs, result["nfs"], data["NFS"]));
        const Json::Value &network = result["network"];  // total, eth0, eth1, bond0, ppp0
        ASSERT_EQ(network.size(), 5u) << network;
        EXPECT_TRUE(SameCounters(Section::Interface, network[0], Json::Value(Json::objectValue)));
        EXPECT_TRUE(SameCounters(Section::Interface, network[1], data["Network"][0]));
        EXPECT_TRUE(SameCounters(Section::Interface, network[2], data["Network"][1]));
        EXPECT_TRUE(SameCounters(Section::Interface, network[3], Json::Value(Json::objectValue)));
        EXPECT_TRUE(SameCounters(Section::Interface, network[4], data["Network"][2]));
        const Json::Value &disks = result["disk"]["disk"];
        ASSERT_EQ(disks.size(), 2u) << result["disk"];
        EXPECT_TRUE(SameCounters(Section::Disk, disks[0], data["DiskIO"][0]));
        EXPECT_TRUE(SameCounters(Section::Disk, disks[1], data["DiskIO"][1]));
        EXPECT_TRUE(SameCounters(Section::DiskTotal, result["disk"]["total"], Json::Value(Json::objectValue)));
        const Json::Value &volumes = result["space"]["volume"];
        ASSERT_EQ(volumes.size(), 1u) << result["space"];
        EXPECT_TRUE(SameCounters(Section::Volume, volumes[0], data["SpaceIO"][0]));
        EXPECT_TRUE(SameCounters(Section::VolumeTotal, result["space"]["total"], Json::Value(Json::objectValue)));
        ASSERT_EQ(result["lun"].size(), 1u) << result["lun"];
        EXPECT_TRUE(SameCounters(Section::Lun, result["lun"][0], data["iSCSI"][0]));
        EXPECT_EQ(result["lun"][0]["lun_name"], "LUN-1");
        EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
    }
}

}  // namespace
