// korvsnmp-agentx under Debian's snmpd, read with net-snmp's own client
// tools, against the test collector: every object matches the library's
// result for the same reply; the walk answers from the last snapshot while
// the collector stalls; the collector goes away and comes back; snmpd
// restarts and the subagent registers again.
#include <signal.h>
#include <unistd.h>

#include <cctype>
#include <chrono>
#include <fstream>
#include <map>
#include <optional>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <korvsnmp/korvsnmp.h>

#include "block_nodes.h"
#include "collector_process.h"
#include "json_text.h"
#include "korv_standin.h"
#include "private_snmpd.h"
#include "test_collector.h"

namespace {

using Clock = std::chrono::steady_clock;
using korvtest::PollUntil;
using korvtest::ReadWholeFile;

const std::vector<std::string> kCounters = {"utilization", "read_access", "read_byte", "write_access", "write_byte"};
constexpr char kEndOfView[] = " = No more variables left in this MIB View (It is past the end of the MIB tree)\n";

// How often `part` occurs in `text`.
std::ptrdiff_t Occurrences(const std::string &text, const std::string &part)
{
    std::ptrdiff_t count = 0;
    for (size_t at = 0; (at = text.find(part, at)) != std::string::npos; at += part.size()) ++count;
    return count;
}

// The appliance that the stand-in platform describes (KORVPLATFORM_HOST):
// internal disks and a USB disk, two interfaces in an aggregation, a VLAN,
// a PPPoE link, two volumes on real block nodes and a named LUN.
std::string HostDescription(const korvtest::BlockNodes &nodes)
{
    return R"({"disks": [{"number": 1, "container": "internal", "device_path": "/dev/sda"},
        {"number": 3, "container": "internal", "device_path": "/dev/sdc"}], "pppoe": "ppp0",
        "usb": [{"name": "sdu", "display_text": "USB Disk 1"}], "interfaces": [{"name": "eth0"},
        {"name": "eth1"}, {"name": "eth0.10", "role": "vlan", "vlan_parent": "eth0", "vlan_name": "eth0.10"},
        {"name": "bond0", "role": "aggregation", "members": ["eth0", "eth1"]}],
        "spaces": [{"device_path": ")" + nodes.Node(0) + R"(", "name": "Volume 1"},
        {"device_path": ")" + nodes.Node(1) + R"(", "name": "Backups"}],
        "luns": [{"uuid": "60014052-e000-4000-8000-000000000001", "name": "LUN-1"}], "strings": {"volume":
        {"volume_disk": "Disk", "volume_expansion": "Expansion Unit", "dedicated_ssd_cache": "SSD Cache"}}})";
}

// A collector reply for that appliance; `seed` varies the counters. A device
// that the appliance does not name (sdz, eth9) is dropped by the library.
Json::Value DescribedReply(const korvtest::BlockNodes &nodes, unsigned time, unsigned seed)
{
    auto record = [&, n = 0u](const std::string &device, const std::vector<std::string> &members) mutable {
        Json::Value record(Json::objectValue);
        record["device"] = device;
        for (const std::string &member : members)
            record[member] = member == "utilization" ? (seed + n * 7) % 100 : seed * 1000 + ++n * 10;
        return record;
    };
    Json::Value reply = korvtest::ParseJson(R"({"data": {"System": [{"user": 11, "nice": 1, "system": 7,
        "idle": 70, "iowait": 5, "irq": 2, "softirq": 3, "steal": 1}], "Memory": [{"total_real": 8000000,
        "avail_real": 6000000, "free_real": 4000000, "buffer": 1000, "cached": 200000, "total_swap": 1048576,
        "avail_swap": 1000000}], "NFS": {"calls": 40, "read_byte": 50, "write_byte": 60}}})");
    Json::Value &data = reply["data"];
    for (const char *name : {"eth1", "eth0", "eth0.10", "bond0", "eth9", "ppp0"})
        data["Network"].append(record(name, {"rx", "tx"}));
    for (const char *name : {"sdc", "sda", "sdz", "sdu"}) data["DiskIO"].append(record(name, kCounters));
    for (std::string name : {nodes.Name(1), nodes.Name(0), std::string("total")})
        data["SpaceIO"].append(record(name, kCounters));
    for (const char *uuid : {"60014052-e000-4000-8000-000000000001", "60014052-e000-4000-8000-000000000002"})
        data["iSCSI"].append(record(uuid, kCounters));
    data["time"] = time;
    return reply;
}

// The object name part for a result member: "read_byte" -> "ReadByte".
std::string Camel(const std::string &member)
{
    std::string name;
    for (size_t i = 0; i < member.size(); ++i)
        if (member[i] != '_')
            name += i == 0 || member[i - 1] == '_' ? char(std::toupper(member[i])) : member[i];
    return name;
}

// The objects (values without their types) that a walk must show for the library's result of the
// first sample (rows numbered from 1 in the result's order), the subagent's
// own age and failure count left out.
std::map<std::string, std::string> ExpectedObjects(const Json::Value &result)
{
    std::map<std::string, std::string> objects = {{"korvSampleTime.0", result["time"].asString()},
                                                  {"korvSampleInterval.0", "3600"}};
    auto add = [&](const std::string &object, const Json::Value &value) {
        if (!value.isNull()) objects[object] = value.asString(); };
    const std::tuple<std::string, Json::Value, std::vector<std::string>> scalars[] = {
        {"korvCpu", result["cpu"], {"user", "nice", "system", "idle", "iowait", "irq", "softirq", "steal"}},
        {"korvMemory", result["memory"],
         {"size", "total_real", "avail_real", "free_real", "cached", "buffer", "total_swap", "avail_swap"}},
        {"korvNfs", result["nfs"], {"calls", "read_byte", "write_byte"}},
        {"korvDiskTotal", result["disk"]["total"], kCounters},
        {"korvVolumeTotal", result["space"]["total"], kCounters}};
    for (const auto &[prefix, values, members] : scalars)
        for (const std::string &member : members)
            add(prefix + Camel(member) + ".0", values[member == "size" ? "memory_size" : member]);
    const std::tuple<std::string, Json::Value, std::vector<std::string>> tables[] = {
        {"korvDisk", result["disk"]["disk"], {"device", "display_name"}},
        {"korvVolume", result["space"]["volume"], {"device", "display_name"}},
        {"korvLun", result["lun"], {"uuid", "name"}}, {"korvIf", result["network"], {"device", "rx", "tx"}}};
    const std::map<std::string, std::string> diskTypes = {{"internal", "1"}, {"ebox", "2"}, {"usb", "3"}, {"eSATA", "4"}};
    for (auto [table, rows, members] : tables) {
        if (table != "korvIf") members.insert(members.end(), kCounters.begin(), kCounters.end());
        for (Json::ArrayIndex row = 0; row < rows.size(); ++row) {
            const std::string index = "." + std::to_string(row + 1);
            const Json::Value &record = rows[row];
            for (const std::string &member : members)
                add(table + Camel(member) + index, record[member == "name" ? "lun_name" : member]);
            const std::string device = record["device"].asString(), type = record["type"].asString();
            if (table == "korvDisk")
                objects["korvDiskType" + index] = diskTypes.count(type) ? diskTypes.at(type) : "5";
            if (table == "korvIf")  // total first, then interface, aggregation or PPPoE
                objects["korvIfKind" + index] = row == 0 ? "1" : device == "bond0" ? "3" : device.rfind("ppp0", 0) == 0 ? "4" : "2";
        }
    }
    return objects;
}

class AgentxUnderSnmpd : public ::testing::Test {
protected:
    void SetUp() override
    {
        std::string whyNot;
        ASSERT_TRUE(nodes_.Make(2, whyNot)) << whyNot;  // its directory holds everything else too
        std::ofstream(Path("host.json")) << HostDescription(nodes_);
        snmpd_.emplace(nodes_.Directory());
        StartSnmpd();
    }

    void TearDown() override { unsetenv("KORVPLATFORM_HOST"), korvstandin::UseProcessHost(); }

    std::string Path(const char *name) const { return nodes_.Directory() + "/" + name; }


    void StartSnmpd() { ASSERT_TRUE(snmpd_->Start()) << "snmpd did not start: " << snmpd_->Log(); }

    // Starts the subagent, which samples at once, and waits for the sample of `time`.
    void StartSubagent(unsigned time)
    {
        const std::vector<std::string> words = snmpd_->SubagentCommand(KORVSNMP_AGENTX_PATH, Path("host.json"),
                                                                       {"--interval", "3600", "--ping-interval", "1"});
        subagent_.reset();
        subagent_.emplace("/usr/bin/env", words, Path("agentx.out"));
        ASSERT_TRUE(WaitForSample(time)) << subagent_->Log();
    }

    // A walk shows each value's type ("Gauge32: 5"), so that a wrong one shows; a get does not.
    std::string Client(const std::string &tool, const std::string &arguments) const
    { return snmpd_->Client(KORVSNMP_MIB_DIRS, tool, arguments); }

    bool Answers(const std::string &object, const std::string &value) const
    { return PollUntil([&] { return Client("snmpget", object) == object + " = " + value + "\n"; }); }

    bool WaitForSample(unsigned time) const { return Answers("korvSampleTime.0", std::to_string(time)); }

    // Scripts the collector to hold its answer, asks for a sample and waits until the
    // collector holds one more socket (the kernel's table names the listening one and those accepted).
    void StallASample()
    {
        collector_->Script({"", false});
        auto sockets = [] { return Occurrences(ReadWholeFile("/proc/net/unix"), korvtest::PrivateCollectorPath()); };
        const auto idle = sockets();
        kill(subagent_->Pid(), SIGHUP);
        ASSERT_TRUE(PollUntil([&] { return sockets() > idle; }));
    }

    // The library's result for `reply`, as the described appliance names it.
    Json::Value LibraryResult(const Json::Value &reply) const
    {
        setenv("KORVPLATFORM_HOST", Path("host.json").c_str(), 1), korvstandin::UseProcessHost();
        Json::Value result, request = korvtest::ParseJson(R"({"resource": ["all"]})");
        EXPECT_TRUE(SNMPParseReplyData(request, reply, result));
        return result;
    }

    // A walk's objects without their types ("Wrong Type (should be Gauge32): Counter32: 5" keeps
    // one), the walk's end and the subagent's own age and failure count left out.
    static std::map<std::string, std::string> Objects(const std::string &walk)
    {
        std::map<std::string, std::string> objects;
        std::istringstream lines(walk);
        for (std::string line; std::getline(lines, line);) {
            const size_t equals = line.find(" = ");
            if (equals == std::string::npos) objects["?" + line] = "";
            else if (line.find(" = No more variables", equals) != equals && line.rfind("korvSnapshotAge", 0) != 0 &&
                     line.rfind("korvFailedSamples", 0) != 0)
                objects[line.substr(0, equals)] = line.substr(line.find(": ", equals) + 2);
        }
        return objects;
    }

    korvtest::BlockNodes nodes_;
    std::optional<korvtest::TestCollector> collector_{std::in_place};
    std::optional<korvtest::PrivateSnmpd> snmpd_;
    std::optional<korvtest::CollectorProcess> subagent_;  // declared last: stopped first
};

TEST_F(AgentxUnderSnmpd, EveryObjectIsTheLibrarysResultAndARestartedSnmpdFindsTheSubagentAgain)
{
    const Json::Value reply = DescribedReply(nodes_, 1795000000, 7);
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    StartSubagent(1795000000);

    const std::string walk = Client("snmpwalk", "korvsnmpMIB");
    EXPECT_THAT(Objects(walk), ::testing::ContainerEq(ExpectedObjects(LibraryResult(reply)))) << walk;
    EXPECT_THAT(walk, ::testing::EndsWith(kEndOfView));
    EXPECT_EQ(Client("snmpbulkwalk", "-Cr7 korvsnmpMIB"), walk);

    const std::tuple<const char *, const char *, std::string> edges[] = {
        {"snmpget", "korvDiskDevice.999", "korvDiskDevice.999 = No Such Instance currently exists at this OID\n"},
        {"snmpget", "korvObjects.99.0", "korvObjects.99.0 = No Such Object available on this agent at this OID\n"},
        {"snmpgetnext", "korvLunWriteByte.2", std::string("korvLunWriteByte.2") + kEndOfView},
        {"snmpgetnext", "korvLunTable.9", std::string("korvLunTable.9") + kEndOfView},
        {"snmpgetnext", "korvSampleTime", "korvSampleTime.0 = 1795000000\n"}};
    for (const auto &[tool, arguments, expected] : edges)
        EXPECT_EQ(Client(tool, arguments), expected) << tool << " " << arguments;

    StartSnmpd();  // the old one killed
    EXPECT_TRUE(WaitForSample(1795000000)) << subagent_->Log();
    EXPECT_EQ(subagent_->Stop(SIGTERM), 0) << subagent_->Log();
    EXPECT_THAT(Client("snmpwalk", "korvsnmpMIB"), ::testing::HasSubstr("No more variables left"));
}

TEST_F(AgentxUnderSnmpd, AStalledCollectorLeavesTheLastSampleAndAGoneOneIsCountedAndLoggedOnce)
{
    collector_->Script({korvtest::Frame(korvtest::JsonText(DescribedReply(nodes_, 1795000000, 1)))});
    StartSubagent(1795000000);
    const std::string before = Client("snmpwalk", "korvsnmpMIB");

    // The sampler waits in the library; the walk answers from the previous snapshot at once.
    StallASample();
    const auto start = Clock::now();
    EXPECT_EQ(Objects(Client("snmpbulkwalk", "korvsnmpMIB")), Objects(before));
    EXPECT_LT(Clock::now() - start, std::chrono::seconds(1));

    // Gone: the held exchange fails, then one more sample fails.
    collector_.reset();  // its socket file goes with it
    ASSERT_TRUE(Answers("korvFailedSamples.0", "1"));
    kill(subagent_->Pid(), SIGHUP);
    ASSERT_TRUE(Answers("korvFailedSamples.0", "2"));
    EXPECT_EQ(Objects(Client("snmpwalk", "korvsnmpMIB")), Objects(before));

    // Back, with a reply that lacks the disks: their table empties, the next one stays.
    collector_.emplace();
    Json::Value reply = DescribedReply(nodes_, 1795000060, 2);
    reply["data"].removeMember("DiskIO");
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    kill(subagent_->Pid(), SIGHUP);
    ASSERT_TRUE(WaitForSample(1795000060)) << subagent_->Log();
    EXPECT_EQ(Client("snmpgetnext", "korvDiskTotal korvDiskTable"), "korvIfDevice.1 = total\nkorvIfDevice.1 = total\n");
    EXPECT_EQ(Occurrences(subagent_->Log(), "No statistics from the collector; answering from the last sample"), 1);
    EXPECT_EQ(Occurrences(subagent_->Log(), "The collector answers again"), 1) << subagent_->Log();

    // Stalled again: SIGTERM stops it within the process wait, not the library's 90 s.
    StallASample();
    EXPECT_EQ(subagent_->Stop(SIGTERM), 0) << subagent_->Log();
}

}  // namespace
