// KORVSNMP-MIB under Debian's snmpd through both front ends, the subagent
// korvsnmp-agentx and the module korvsnmp-snmpd.so (dlmod), read with
// net-snmp's own client tools, against the test collector: every object
// matches the library's result for the same reply, the Counter64 counters
// and their sums included; the walk answers from the last snapshot while the
// collector stalls; the collector goes away and comes back; snmpd restarts
// and serves again; snmpd stops or reloads while the module samples; a
// restarted front end finds every device under its index.
#include <netinet/in.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cctype>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <optional>
#include <sstream>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <korvsnmp/korvsnmp.h>

#include "block_nodes.h"
#include "catalogue/statistics_catalogue.h"
#include "collector_process.h"
#include "json_text.h"
#include "korv_standin.h"
#include "test_collector.h"

namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;
using korvtest::ReadWholeFile;

constexpr std::chrono::milliseconds kReadyBound{20000}, kPollStep{50};  // generous for the sanitizer build
constexpr char kSnmpd[] = "/usr/sbin/snmpd";
const std::vector<std::string> kCounters = {"utilization", "read_access", "read_byte", "write_access", "write_byte"};
constexpr char kEndOfView[] = " = No more variables left in this MIB View (It is past the end of the MIB tree)\n";

uint16_t FreeUdpPort()
{
    int fd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_in address{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    socklen_t length = sizeof address;
    bind(fd, reinterpret_cast<sockaddr *>(&address), sizeof address);
    getsockname(fd, reinterpret_cast<sockaddr *>(&address), &length);
    close(fd);
    return ntohs(address.sin_port);
}

// Runs a shell command; its standard output and error.
std::string RunCommand(const std::string &command)
{
    std::string output;
    std::unique_ptr<FILE, int (*)(FILE *)> pipe(popen((command + " 2>&1").c_str(), "r"), pclose);
    char buffer[4096];
    for (size_t n; pipe && (n = fread(buffer, 1, sizeof buffer, pipe.get())) > 0;) output.append(buffer, n);
    return output;
}

template <typename Predicate> bool PollUntil(Predicate done)
{
    for (auto end = Clock::now() + kReadyBound; !done(); std::this_thread::sleep_for(kPollStep))
        if (Clock::now() >= end) return false;
    return true;
}

// A walk without its korvSnapshotAge line, which counts the seconds that walks take.
std::string WithoutAge(const std::string &walk)
{
    std::istringstream lines(walk);
    std::string kept;
    for (std::string line; std::getline(lines, line);)
        if (line.rfind("korvSnapshotAge.0 = ", 0) != 0) kept += line + "\n";
    return kept;
}

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

// The cumulative counters of a section's records, as the catalogue names them.
std::vector<std::string> CounterMembers(korvcatalogue::Section section)
{
    std::vector<std::string> members;
    for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(section))
        if (statistic->kind == korvcatalogue::Kind::Counter && !statistic->member.empty())
            members.push_back(statistic->member);
    return members;
}

// A collector reply for that appliance; `seed` varies the rates and the
// counters (those beyond 2^32). A device that the appliance does not name
// (sdz, eth9) is dropped by the library.
Json::Value DescribedReply(const korvtest::BlockNodes &nodes, unsigned time, unsigned seed)
{
    using korvcatalogue::Section;
    auto record = [&, n = 0u](const std::string &device, std::vector<std::string> members,
                              Section section) mutable {
        Json::Value record(Json::objectValue);
        record["device"] = device;
        const std::vector<std::string> counters = CounterMembers(section);
        members.insert(members.end(), counters.begin(), counters.end());
        for (const std::string &member : members)
            record[member] = member == "utilization" ? Json::UInt64((seed + n * 7) % 100)
                : member.size() > 6 && member.compare(member.size() - 6, 6, "_total") == 0
                ? Json::UInt64(seed) << 33 | ++n : Json::UInt64(seed * 1000 + ++n * 10);
        return record;
    };
    Json::Value reply = korvtest::ParseJson(R"({"data": {"System": [{"user": 11, "nice": 1, "system": 7,
        "idle": 70, "iowait": 5, "irq": 2, "softirq": 3, "steal": 1}], "Memory": [{"total_real": 8000000,
        "avail_real": 6000000, "free_real": 4000000, "buffer": 1000, "cached": 200000, "total_swap": 1048576,
        "avail_swap": 1000000}], "NFS": {"calls": 40, "read_byte": 50, "write_byte": 60}}})");
    Json::Value &data = reply["data"];
    for (const char *name : {"eth1", "eth0", "eth0.10", "bond0", "eth9", "ppp0"})
        data["Network"].append(record(name, {"rx", "tx"}, Section::Interface));
    for (const char *name : {"sdc", "sda", "sdz", "sdu"})
        data["DiskIO"].append(record(name, kCounters, Section::Disk));
    for (std::string name : {nodes.Name(1), nodes.Name(0), std::string("total")})
        data["SpaceIO"].append(record(name, kCounters, Section::Volume));
    for (const char *uuid : {"60014052-e000-4000-8000-000000000001", "60014052-e000-4000-8000-000000000002"})
        data["iSCSI"].append(record(uuid, kCounters, Section::Lun));
    for (const auto &[section, name] : {std::pair(Section::Cpu, "System"), std::pair(Section::Nfs, "NFS")}) {
        Json::Value &values = section == Section::Cpu ? data[name][0] : data[name];
        for (const std::string &member : CounterMembers(section))
            values[member] = Json::UInt64(seed) << 40 | values.size();
    }
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

// The Counter64 objects that a walk must show for the library's result, each
// row's or group's discontinuity time as "time": a row's own counters as the
// library passed them on; the totals, the sums of their tables' rows modulo
// 2^64; the interface total, the sum of the rows of kind interface; none for
// the aggregation.
void AddCounters(const Json::Value &result, std::map<std::string, std::string> &objects)
{
    using korvcatalogue::Section;
    auto discontinuity = [](Section section) {
        for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(section))
            if (statistic->kind == korvcatalogue::Kind::Discontinuity) return statistic->snmpObject;
        return std::string("?");
    };
    auto add = [&](Section section, const std::string &index, const std::map<std::string, uint64_t> &counters) {
        for (const auto &[member, value] : counters)
            objects[korvcatalogue::Find(section, member)->snmpObject + index] = std::to_string(value);
        if (!counters.empty()) objects[discontinuity(section) + index] = "time";
    };
    auto countersOf = [](Section section, const Json::Value &record) {
        std::map<std::string, uint64_t> counters;
        for (const std::string &member : CounterMembers(section))
            if (record.isMember(member)) counters[member] = record[member].asUInt64();
        return counters;
    };
    add(Section::Cpu, ".0", countersOf(Section::Cpu, result["cpu"]));
    add(Section::Nfs, ".0", countersOf(Section::Nfs, result["nfs"]));
    const std::tuple<Section, Json::Value, Section> tables[] = {
        {Section::Disk, result["disk"]["disk"], Section::DiskTotal},
        {Section::Volume, result["space"]["volume"], Section::VolumeTotal},
        {Section::Lun, result["lun"], Section::Lun}, {Section::Interface, result["network"], Section::Interface}};
    for (const auto &[section, rows, total] : tables) {
        std::map<std::string, uint64_t> sums;
        for (Json::ArrayIndex row = 0; row < rows.size(); ++row) {
            const std::string device = rows[row]["device"].asString();
            if (section == Section::Interface && (row == 0 || device == "bond0")) continue;
            add(section, "." + std::to_string(row + 1), countersOf(section, rows[row]));
            if (device == "ppp0") continue;
            for (const auto &[member, value] : countersOf(section, rows[row])) sums[member] += value;
        }
        if (total != section) add(total, ".0", sums);
        if (section == Section::Interface) add(section, ".1", sums);
    }
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
    AddCounters(result, objects);
    return objects;
}

enum class FrontEnd { Subagent, Module };

class UnderSnmpd : public ::testing::TestWithParam<FrontEnd> {
protected:
    void SetUp() override
    {
        std::string whyNot;
        ASSERT_TRUE(nodes_.Make(2, whyNot)) << whyNot;  // its directory holds everything else too
        std::ofstream(Path("host.json")) << HostDescription(nodes_);
        ASSERT_EQ(access(kSnmpd, X_OK), 0) << "snmpd is not installed";
        std::ofstream conf(Path("snmpd.conf"));
        conf << "agentaddress udp:127.0.0.1:" << port_ << "\nview korvview included .1.3.6.1.3.7947\n"
             << "rocommunity public 127.0.0.1 -V korvview\n";
        if (Module()) {  // loaded twice: the second load adds nothing
            for (int load = 0; load < 2; ++load)
                conf << "dlmod korvsnmp " KORVSNMP_SNMPD_MODULE_PATH "\nkorvsnmpInterval 3600\n";
            conf << "korvsnmpStateDir " << StateDir() << "\n";
        } else
            conf << "master agentx\nagentXSocket " << Path("agentx.sock") << "\nagentXTimeout 1\n";
    }

    void TearDown() override { unsetenv("KORVPLATFORM_HOST"), korvstandin::UseProcessHost(); }

    bool Module() const { return GetParam() == FrontEnd::Module; }

    std::string Path(const char *name) const { return nodes_.Directory() + "/" + name; }

    // Where the front end keeps its row indexes: the subagent's --state-dir (also net-snmp's
    // state), the module's korvsnmpStateDir (beside snmpd's own state).
    std::string StateDir() const { return Path(Module() ? "module-state" : "state"); }

    // The environment of what samples: the connect redirection and the described appliance.
    std::vector<std::string> SamplingEnvironment() const
    {
        std::vector<std::string> words = korvtest::RedirectedChildVariables();
        words.insert(words.end(), {"SNMP_PERSISTENT_DIR=" + Path("state"), "KORVPLATFORM_HOST=" + Path("host.json")});
#ifdef KORVSNMP_SANITIZER_RUNTIME
        // snmpd is not built with the sanitizers: their runtime must come first for the
        // module, and snmpd's own leaks are known.
        if (Module()) {
            words.front().insert(words.front().find('=') + 1, KORVSNMP_SANITIZER_RUNTIME);
            words.push_back("LSAN_OPTIONS=suppressions=" KORVSNMP_SNMPD_LEAKS);
        }
#endif
        return words;
    }

    void StartSnmpd()
    {
        fs::remove(Path("agentx.sock"));  // a killed snmpd leaves it behind
        snmpd_.reset();  // run through env(1), as the subagent is
        std::vector<std::string> words = Module() ? SamplingEnvironment()
                                                  : std::vector<std::string>{"SNMP_PERSISTENT_DIR=" + Path("state")};
        words.insert(words.end(), {kSnmpd, "-f", "-C", "-c", Path("snmpd.conf"), "-M", "", "-m", "", "-Lo"});
        snmpd_.emplace("/usr/bin/env", words, Path("snmpd.out"));
        if (!Module()) {
            ASSERT_TRUE(PollUntil([&] { return fs::exists(Path("agentx.sock")); })) << snmpd_->Log();
        }
    }

    // Starts snmpd and, for the subagent, the subagent; what samples does so at once.
    // Waits for the sample of `time`.
    void StartServing(unsigned time)
    {
        StartSnmpd();
        if (!Module()) {
            std::vector<std::string> words = SamplingEnvironment();
            words.insert(words.end(), {KORVSNMP_AGENTX_PATH, "--agentx-socket", Path("agentx.sock"), "--interval",
                                       "3600", "--ping-interval", "1", "--state-dir", StateDir()});
            subagent_.reset();
            subagent_.emplace("/usr/bin/env", words, Path("agentx.out"));
        }
        ASSERT_TRUE(WaitForSample(time)) << Serving().Log();
    }

    // The process that samples: the subagent, or snmpd with the module.
    korvtest::CollectorProcess &Serving() { return Module() ? *snmpd_ : *subagent_; }

    // A sample at once: SIGHUP to the subagent; for the module, SIGHUP to snmpd,
    // which reloads it, and a loaded module samples at once.
    void SampleNow() { kill(Serving().Pid(), SIGHUP); }

    // A walk shows each value's type ("Gauge32: 5"), so that a wrong one shows; a get does not.
    std::string Client(const std::string &tool, const std::string &arguments) const
    {
        return RunCommand("SNMP_PERSISTENT_DIR=" + Path("client ") + tool +
                          " -v2c -c public -t 1 -r 0 -M " KORVSNMP_MIB_DIRS " -m KORVSNMP-MIB -Os -Oe -OU " +
                          (tool.find("walk") == std::string::npos ? "-OQ " : "") + "127.0.0.1:" +
                          std::to_string(port_) + " " + arguments);
    }

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
        SampleNow();
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
                objects[line.substr(0, equals)] = line.find("DiscontinuityTime") < equals &&
                    line.find(" = Timeticks: (") == equals ? "time" : line.substr(line.find(": ", equals) + 2);
        }
        return objects;
    }

    // The index of each device in a walk, by its naming object: "korvDiskDevice.3 = STRING: sda" gives
    // "korvDiskDevice sda" -> "3".
    static std::map<std::string, std::string> IndexesOf(const std::string &walk)
    {
        std::map<std::string, std::string> indexes;
        for (const auto &[object, value] : Objects(walk)) {
            const size_t dot = object.find('.');
            const std::string name = object.substr(0, dot);
            if (name == "korvDiskDevice" || name == "korvIfDevice" || name == "korvVolumeDevice" || name == "korvLunUuid")
                indexes[name + " " + value] = object.substr(dot + 1);
        }
        return indexes;
    }

    korvtest::BlockNodes nodes_;
    const uint16_t port_ = FreeUdpPort();
    std::optional<korvtest::TestCollector> collector_{std::in_place};
    std::optional<korvtest::CollectorProcess> snmpd_, subagent_;  // the subagent declared last: stopped first
};

INSTANTIATE_TEST_SUITE_P(FrontEnds, UnderSnmpd, ::testing::Values(FrontEnd::Subagent, FrontEnd::Module),
                         [](const auto &info) { return info.param == FrontEnd::Module ? "Module" : "Subagent"; });

TEST_P(UnderSnmpd, EveryObjectIsTheLibrarysResultAndARestartedSnmpdServesAgain)
{
    const Json::Value reply = DescribedReply(nodes_, 1795000000, 7);
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    StartServing(1795000000);

    const std::string walk = Client("snmpwalk", "korvsnmpMIB");
    const Json::Value result = LibraryResult(reply);
    EXPECT_THAT(Objects(walk), ::testing::ContainerEq(ExpectedObjects(result))) << walk;
    EXPECT_THAT(walk, ::testing::HasSubstr("korvDiskReadByteTotal.1 = Counter64: "));
    EXPECT_THAT(walk, ::testing::EndsWith(kEndOfView));
    EXPECT_EQ(WithoutAge(Client("snmpbulkwalk", "-Cr7 korvsnmpMIB")), WithoutAge(walk));

    const std::tuple<const char *, const char *, std::string> edges[] = {
        {"snmpget", "korvDiskDevice.999", "korvDiskDevice.999 = No Such Instance currently exists at this OID\n"},
        {"snmpget", "korvObjects.99.0", "korvObjects.99.0 = No Such Object available on this agent at this OID\n"},
        {"snmpgetnext", "korvLunDiscontinuityTime.2", std::string("korvLunDiscontinuityTime.2") + kEndOfView},
        {"snmpgetnext", "korvLunWriteByte.2", "korvLunCommandTotal.1 = " + result["lun"][0]["command_total"].asString() + "\n"},
        {"snmpgetnext", "korvLunTable.9", std::string("korvLunTable.9") + kEndOfView},
        {"snmpgetnext", "korvSampleTime", "korvSampleTime.0 = 1795000000\n"}};
    for (const auto &[tool, arguments, expected] : edges)
        EXPECT_EQ(Client(tool, arguments), expected) << tool << " " << arguments;

    if (Module())  // the restarted snmpd loads the module afresh, which samples
        collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    StartSnmpd();  // the old one killed
    EXPECT_TRUE(WaitForSample(1795000000)) << Serving().Log();
    EXPECT_EQ(Serving().Stop(SIGTERM), 0) << Serving().Log();
    if (!Module()) {
        EXPECT_THAT(Client("snmpwalk", "korvsnmpMIB"), ::testing::HasSubstr("No more variables left"));
    }
}

TEST_P(UnderSnmpd, AStalledCollectorLeavesTheLastSampleAndAGoneOneIsCountedAndLoggedOnce)
{
    collector_->Script({korvtest::Frame(korvtest::JsonText(DescribedReply(nodes_, 1795000000, 1)))});
    StartServing(1795000000);
    const std::string before = Client("snmpwalk", "korvsnmpMIB");

    // The sampler waits in the library; the walk answers from the previous snapshot at once.
    StallASample();
    const auto start = Clock::now();
    EXPECT_EQ(Objects(Client("snmpbulkwalk", "korvsnmpMIB")), Objects(before));
    EXPECT_LT(Clock::now() - start, std::chrono::seconds(1));

    // Gone: the held exchange fails, then one more sample fails.
    collector_.reset();  // its socket file goes with it
    ASSERT_TRUE(Answers("korvFailedSamples.0", "1"));
    SampleNow();
    ASSERT_TRUE(Answers("korvFailedSamples.0", "2"));
    EXPECT_EQ(Objects(Client("snmpwalk", "korvsnmpMIB")), Objects(before));

    // Back, with a reply that lacks the disks: their table empties, the next one stays.
    collector_.emplace();
    Json::Value reply = DescribedReply(nodes_, 1795000060, 2);
    reply["data"].removeMember("DiskIO");
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    SampleNow();
    ASSERT_TRUE(WaitForSample(1795000060)) << Serving().Log();
    EXPECT_EQ(Client("snmpgetnext", "korvDiskTotal korvDiskTable"), "korvIfDevice.1 = total\nkorvIfDevice.1 = total\n");
    if (!Module()) {  // the module's lines go to the system log, as snmpd's modules' do
        EXPECT_EQ(Occurrences(Serving().Log(), "No statistics from the collector; answering from the last sample"), 1);
        EXPECT_EQ(Occurrences(Serving().Log(), "The collector answers again"), 1) << Serving().Log();
    }

    // Stalled again: SIGTERM stops the subagent, or snmpd with the module's thread
    // broken off and joined, within the process wait, not the library's 90 s.
    StallASample();
    EXPECT_EQ(Serving().Stop(SIGTERM), 0) << Serving().Log();
}

// snmpd reloads on SIGHUP: the module (loaded twice here) is unloaded and loaded again,
// each time ending its sampling thread and starting a new one, while walks go on.
TEST_P(UnderSnmpd, ReloadsUnderWalksLeaveOneSamplingThreadAndTheLastSample)
{
    if (!Module())
        GTEST_SKIP() << "snmpd's reload concerns the module only";
    collector_->Script({korvtest::Frame(korvtest::JsonText(DescribedReply(nodes_, 1795000000, 3)))});
    StartServing(1795000000);
    const std::string before = Client("snmpbulkwalk", "korvsnmpMIB");
    const std::string tasks = "/proc/" + std::to_string(snmpd_->Pid()) + "/task";
    const auto threads = [&] { return std::distance(fs::directory_iterator(tasks), fs::directory_iterator()); };
    ASSERT_EQ(threads(), 2) << snmpd_->Log();

    std::vector<std::string> walks;
    std::atomic<bool> reloading{true};
    std::thread walker([&] {
        while (reloading)
            walks.push_back(Client("snmpbulkwalk", "korvsnmpMIB"));
    });
    // Each reloaded module samples; the collector closes unscripted connections: a failed sample.
    for (int reload = 1; reload <= 3; ++reload) {
        kill(snmpd_->Pid(), SIGHUP);
        EXPECT_TRUE(Answers("korvFailedSamples.0", std::to_string(reload))) << snmpd_->Log();
    }
    reloading = false;
    walker.join();

    ASSERT_FALSE(walks.empty());
    for (const std::string &walk : walks)
        EXPECT_EQ(Objects(walk), Objects(before));
    EXPECT_EQ(threads(), 2) << snmpd_->Log();
    EXPECT_EQ(snmpd_->Stop(SIGTERM), 0) << snmpd_->Log();
}

// The subagent restarts, or snmpd with the module: both read the indexes back from the state directory.
TEST_P(UnderSnmpd, ARestartedFrontEndFindsEveryDeviceUnderItsIndexAndANewOneUnderANewIndex)
{
    collector_->Script({korvtest::Frame(korvtest::JsonText(DescribedReply(nodes_, 1795000000, 1)))});
    StartServing(1795000000);
    const std::map<std::string, std::string> before = IndexesOf(Client("snmpwalk", "korvsnmpMIB"));
    ASSERT_EQ(before.size(), 13u) << Client("snmpwalk", "korvsnmpMIB");  // 3 disks, 6 interface rows, 2 volumes, 2 LUNs
    EXPECT_EQ(Serving().Stop(SIGTERM), 0) << Serving().Log();
    EXPECT_TRUE(fs::exists(StateDir() + "/row-indexes"));

    // The next run's collector lacks the first device of each section, so that the rows come in another
    // order, and has one LUN more.
    Json::Value reply = DescribedReply(nodes_, 1795000060, 2);
    for (const char *section : {"Network", "DiskIO", "SpaceIO", "iSCSI"}) {
        Json::Value removed;
        reply["data"][section].removeIndex(0, &removed);
    }
    const std::string newLun = "60014052-e000-4000-8000-000000000003";
    reply["data"]["iSCSI"].append(reply["data"]["iSCSI"][0]);
    reply["data"]["iSCSI"][1]["device"] = newLun;
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    StartServing(1795000060);
    std::map<std::string, std::string> after = IndexesOf(Client("snmpwalk", "korvsnmpMIB"));
    ASSERT_EQ(after.count("korvLunUuid " + newLun), 1u);
    EXPECT_EQ(after["korvLunUuid " + newLun], "3");  // after the two of the first run
    after.erase("korvLunUuid " + newLun);
    EXPECT_EQ(after.size(), 9u);
    for (const auto &[device, index] : after)
        EXPECT_EQ(before.count(device) ? before.at(device) : "none", index) << device;
}

}  // namespace
