// The whole statistics road, as a caller runs it: a statistics request to
// the collector, its reply parsed, and the result assembled against a host
// with disks of every kind, a VLAN, an aggregation, PPPoE, spaces with a
// flash cache and LUNs.

#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "block_nodes.h"
#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/korvsnmp.h"
#include "syslog_capture.h"
#include "test_collector.h"

namespace {

using korvstandin::NetRole;

// Replaces every "{0}", "{1}"... in `text` by the kernel name of node i.
std::string WithNames(std::string text, const korvtest::BlockNodes &nodes, size_t count)
{
    for (size_t i = 0; i < count; ++i)
        for (size_t at; (at = text.find("{" + std::to_string(i) + "}")) != std::string::npos;)
            text.replace(at, 3, nodes.Name(i));
    return text;
}

constexpr size_t kNodes = 3;

const char kReply[] = R"json({"data": {
  "System": [{"user": 10, "system": 5, "idle": 85}], "Memory": [{"total_real": 4096000, "avail_real": 1000}],
  "Network": [{"device": "lo", "rx": 7, "tx": 7}, {"device": "eth1", "rx": 10, "tx": 20},
    {"device": "bond0", "rx": 999, "tx": 999}, {"device": "ppp01", "rx": 30, "tx": 40},
    {"device": "eth0", "rx": 100, "tx": 200}, {"device": "eth2", "rx": 1, "tx": 2},
    {"device": "eth0.5", "rx": 5, "tx": 6}, {"device": "ppp0", "rx": 3, "tx": 4}],
  "DiskIO": [
    {"device": "sdb", "utilization": 4, "read_access": 2, "read_byte": 4000000000, "write_access": 1, "write_byte": 10},
    {"device": "sda", "utilization": 3, "read_access": 1, "read_byte": 4000000000, "write_access": 1, "write_byte": 10},
    {"device": "sdz", "utilization": 99, "read_access": 9, "read_byte": 9, "write_access": 9, "write_byte": 9},
    {"device": "sdc", "utilization": 10, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0},
    {"device": "nvme0n1", "utilization": 1, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0},
    {"device": "sdu", "utilization": 0, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0},
    {"device": "sde", "utilization": 0, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0}],
  "SpaceIO": [{"device": "{0}", "read_byte": 1}, {"device": "{1}", "read_byte": 2},
    {"device": "total", "read_byte": 6}, {"device": "{2}", "read_byte": 3}],
  "iSCSI": [{"device": "uuid-a", "read": 1}, {"device": "uuid-c", "read": 2}], "NFS": {"read": 5},
  "time": 1795000000}})json";

const char kExpected[] = R"json({"cpu": {"user": 10, "system": 5, "idle": 85},
  "memory": {"total_real": 4096000, "avail_real": 1000, "memory_size": 8192000},
  "network": [{"device": "total", "rx": 127, "tx": 250}, {"device": "eth0", "rx": 100, "tx": 200},
    {"device": "eth0.5", "rx": 5, "tx": 6}, {"device": "eth1", "rx": 10, "tx": 20},
    {"device": "eth2", "rx": 1, "tx": 2}, {"device": "bond0", "rx": 11, "tx": 22},
    {"device": "ppp01", "rx": 30, "tx": 40}, {"device": "ppp0", "rx": 3, "tx": 4}],
  "disk": {"disk": [
      {"device": "sdb", "utilization": 4, "read_access": 2, "read_byte": 4000000000, "write_access": 1, "write_byte": 10, "display_name": "Disk 2", "type": "internal"},
      {"device": "sda", "utilization": 3, "read_access": 1, "read_byte": 4000000000, "write_access": 1, "write_byte": 10, "display_name": "Disk 1", "type": "internal"},
      {"device": "sdc", "utilization": 10, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0, "display_name": "Disk 3 (X5-2)", "type": "ebox"},
      {"device": "nvme0n1", "utilization": 1, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0, "display_name": "SSD Cache 1-12", "type": "internal"},
      {"device": "sdu", "utilization": 0, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0, "display_name": "USB Disk 1", "type": "usb"},
      {"device": "sde", "utilization": 0, "read_access": 0, "read_byte": 0, "write_access": 0, "write_byte": 0, "display_name": "eSATA Disk 1", "type": "eSATA"}],
    "total": {"device": "total", "utilization": 3, "read_access": 3, "read_byte": 8000000000, "write_access": 2, "write_byte": 20}},
  "space": {"volume": [{"device": "{0}", "read_byte": 1, "display_name": "volume1"},
      {"device": "{2}", "read_byte": 3, "display_name": "volume2"}],
    "total": {"device": "total", "read_byte": 6}},
  "lun": [{"uuid": "uuid-a", "lun_name": "LUN A", "read": 1},
    {"uuid": "uuid-c", "lun_name": "uuid-c", "read": 2}],
  "nfs": {"read": 5}, "time": 1795000000})json";

TEST(WholeRoadTest, CollectorReplyBecomesTheNamedResult)
{
    korvtest::BlockNodes nodes;
    std::string whyNot;
    if (!nodes.Make(kNodes, whyNot))
        GTEST_SKIP() << whyNot;
    korvstandin::Reset();
    korvtest::ClearLog();
    korvstandin::HostDescription &host = korvstandin::Host();
    host.physMemSize = 8192000;
    host.supportsEBox = true;
    host.files[korvstandin::kStringsFilePath]["volume"] = {{"volume_disk", "Disk"},
        {"volume_expansion", "Expansion Unit"}, {"dedicated_ssd_cache", "SSD Cache"}};
    host.disks = {{1, DISK_CONTAINER_INTERNAL, 0, "/dev/sda"}, {2, DISK_CONTAINER_INTERNAL, 0, "/dev/sdb"},
                  {3, DISK_CONTAINER_EBOX, 0, "/dev/sdc"}, {12, DISK_CONTAINER_SSD_CACHE, 1, "/dev/nvme0n1"}};
    host.expansionUnits = {{1, {"/dev/sdx"}, std::string("Korvel-X7"), true},
                           {2, {"/dev/sdc"}, std::string("Korvel-X5"), true}};
    host.usb.devices = {{"sdu", "USB Disk 1"}}, host.esata.devices = {{"sde", "eSATA Disk 1"}};
    host.interfaces = {{"eth2"}, {"eth0"}, {"bond0", NetRole::Aggregation, "", "", {"eth1", "eth2"}},
                       {"eth1"}, {"eth0.5", NetRole::Vlan, "eth0", "eth0.5"}};
    host.pppoeInterface = "ppp0";
    host.spaces = {{nodes.Node(0), "volume1"}, {nodes.Node(1), "volume2"}};
    host.flashCaches = {{nodes.Node(1), "/volume2", nodes.Node(2)}};
    host.luns = {{Json::Value("uuid-a"), "LUN A"}, {Json::Value("uuid-b"), "LUN B"}};

    korvtest::TestCollector collector;
    collector.Script({korvtest::Frame(WithNames(kReply, nodes, kNodes) + '\0')});
    const Json::Value request = korvtest::ParseJson(R"({"resource":["all"]})");
    Transmitor transmitor("nas");
    Json::Value parsed, result(Json::objectValue);
    ASSERT_EQ(transmitor.Transmit(request), 0);
    ASSERT_EQ(transmitor.GetDataJson(parsed), 0);
    ASSERT_TRUE(SNMPParseReplyData(request, parsed, result));
    EXPECT_EQ(korvtest::JsonText(result), korvtest::Canonical(WithNames(kExpected, nodes, kNodes)));
    ASSERT_TRUE(collector.WaitForConnections(1));
    EXPECT_EQ(collector.Requests().at(0), korvtest::Frame(std::string("{\"resource\":[\"all\"]}\n") + '\0'));
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());
    EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
}

}  // namespace
