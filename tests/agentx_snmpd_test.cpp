// korvsnmp-agentx under Debian's snmpd, read with net-snmp's own client
// tools, against the test collector: every object matches the library's
// result for the same reply; the walk answers from the last snapshot while
// the collector stalls; the collector goes away and comes back; snmpd
// restarts and the subagent registers again.
#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <optional>
#include <sstream>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <korvsnmp/korvsnmp.h>

#include "block_nodes.h"
#include "json_text.h"
#include "korv_standin.h"
#include "test_collector.h"

extern char **environ;

namespace {

namespace fs = std::filesystem;
using Clock = std::chrono::steady_clock;

constexpr auto kReadyBound = std::chrono::seconds(20);  // generous for the sanitizer build
constexpr auto kPollGap = std::chrono::milliseconds(50);
constexpr char kSnmpd[] = "/usr/sbin/snmpd";

// A private directory, removed with everything in it.
class ScratchDir {
public:
    ScratchDir()
    {
        char pattern[] = "/tmp/korvsnmp-agentx-test.XXXXXX";
        path_ = mkdtemp(pattern) ? pattern : "";
    }
    ~ScratchDir()
    {
        std::error_code ignored;
        if (!path_.empty())
            fs::remove_all(path_, ignored);
    }
    const std::string &Path() const { return path_; }

private:
    std::string path_;
};

// A child process, stopped by its id (SIGTERM, then waited for).
class Child {
public:
    // Runs `argv` with this process's environment, `variables` ("NAME=value")
    // taking the place of their namesakes.
    Child(const std::vector<std::string> &argv, const std::string &output,
          std::vector<std::string> variables = {})
    {
        std::vector<char *> envp;
        for (std::string &variable : variables)
            envp.push_back(variable.data());
        for (char **variable = environ; *variable != nullptr; ++variable) {
            const std::string_view name(*variable, std::strcspn(*variable, "=") + 1);
            if (std::none_of(variables.begin(), variables.end(),
                             [name](const std::string &own) { return own.compare(0, name.size(), name) == 0; }))
                envp.push_back(*variable);
        }
        envp.push_back(nullptr);
        posix_spawn_file_actions_t actions;
        posix_spawn_file_actions_init(&actions);
        posix_spawn_file_actions_addopen(&actions, 1, output.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0600);
        posix_spawn_file_actions_adddup2(&actions, 1, 2);
        std::vector<char *> args;
        for (const std::string &arg : argv)
            args.push_back(const_cast<char *>(arg.c_str()));
        args.push_back(nullptr);
        if (posix_spawn(&pid_, args[0], &actions, nullptr, args.data(), envp.data()) != 0)
            pid_ = -1;
        posix_spawn_file_actions_destroy(&actions);
    }
    ~Child() { Stop(); }
    Child(const Child &) = delete;
    Child &operator=(const Child &) = delete;

    pid_t Pid() const { return pid_; }
    // Sends SIGTERM and waits; the exit status (-1: killed by a signal).
    int Stop()
    {
        if (pid_ > 0) {
            kill(pid_, SIGTERM);
            int status = 0;
            waitpid(pid_, &status, 0);
            pid_ = -1;
            status_ = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
        }
        return status_;
    }

private:
    pid_t pid_ = -1;
    int status_ = -1;
};

uint16_t FreeUdpPort()
{
    int fd = socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
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
    if (FILE *pipe = popen((command + " 2>&1").c_str(), "r")) {
        char buffer[4096];
        for (size_t n; (n = fread(buffer, 1, sizeof buffer, pipe)) > 0;)
            output.append(buffer, n);
        pclose(pipe);
    }
    return output;
}

std::string ReadFile(const std::string &path)
{
    std::ifstream in(path);
    return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

template <typename Predicate>
bool PollUntil(Predicate done)
{
    for (auto end = Clock::now() + kReadyBound; Clock::now() < end;) {
        if (done())
            return true;
        std::this_thread::sleep_for(kPollGap);
    }
    return done();
}

// Sockets on the test collector's path that are open now (listening socket
// included), from the kernel's table.
int CollectorSocketCount()
{
    const std::string &path = korvtest::PrivateCollectorPath();
    std::istringstream table(ReadFile("/proc/net/unix"));
    int count = 0;
    for (std::string line; std::getline(table, line);)
        count += line.size() > path.size() && line.compare(line.size() - path.size(), path.size(), path) == 0;
    return count;
}

// The appliance that the stand-in platform describes (KORVPLATFORM_HOST):
// internal disks and a USB disk, two interfaces in an aggregation, a VLAN,
// a PPPoE link, two volumes on real block nodes and a named LUN.
std::string HostDescription(const korvtest::BlockNodes &nodes)
{
    return R"({"disks": [{"number": 1, "container": "internal", "device_path": "/dev/sda"},
                         {"number": 3, "container": "internal", "device_path": "/dev/sdc"}],
               "usb": [{"name": "sdu", "display_text": "USB Disk 1"}],
               "interfaces": [{"name": "eth0"}, {"name": "eth1"},
                              {"name": "eth0.10", "role": "vlan", "vlan_parent": "eth0", "vlan_name": "eth0.10"},
                              {"name": "bond0", "role": "aggregation", "members": ["eth0", "eth1"]}],
               "pppoe": "ppp0",
               "spaces": [{"device_path": ")" + nodes.Node(0) + R"(", "name": "Volume 1"},
                          {"device_path": ")" + nodes.Node(1) + R"(", "name": "Backups"}],
               "luns": [{"uuid": "60014052-e000-4000-8000-000000000001", "name": "LUN-1"}],
               "strings": {"volume": {"volume_disk": "Disk", "volume_expansion": "Expansion Unit",
                                      "dedicated_ssd_cache": "SSD Cache"}}})";
}

// A collector reply for that appliance; `seed` varies the counters. A device
// that the appliance does not name (sdz, eth9) is dropped by the library.
Json::Value DescribedReply(const korvtest::BlockNodes &nodes, unsigned time, unsigned seed)
{
    unsigned n = 0;
    auto record = [&](const std::string &device) {
        Json::Value record(Json::objectValue);
        record["device"] = device;
        ++n;
        record["utilization"] = (seed + n * 7) % 100;
        for (const char *member : {"read_access", "read_byte", "write_access", "write_byte"})
            record[member] = seed * 1000 + n * 10 + record.size();
        return record;
    };
    Json::Value data(Json::objectValue);
    data["System"].append(korvtest::ParseJson(
        R"({"user": 11, "nice": 1, "system": 7, "idle": 70, "iowait": 5, "irq": 2, "softirq": 3, "steal": 1})"));
    data["Memory"].append(korvtest::ParseJson(
        R"({"total_real": 8000000, "avail_real": 6000000, "free_real": 4000000, "buffer": 1000,
            "cached": 200000, "total_swap": 1048576, "avail_swap": 1000000})"));
    for (const char *device : {"eth1", "eth0", "eth0.10", "bond0", "eth9", "ppp0"}) {
        Json::Value counters = record(device);
        data["Network"].append(korvtest::ParseJson(R"({"device": ")" + std::string(device) + R"(", "rx": )" +
                                                   counters["read_byte"].asString() + R"(, "tx": )" +
                                                   counters["write_byte"].asString() + "}"));
    }
    for (const char *device : {"sdc", "sda", "sdz", "sdu"})
        data["DiskIO"].append(record(device));
    data["SpaceIO"].append(record(nodes.Name(1)));
    data["SpaceIO"].append(record(nodes.Name(0)));
    data["SpaceIO"].append(record("total"));
    data["iSCSI"].append(record("60014052-e000-4000-8000-000000000001"));
    data["iSCSI"].append(record("60014052-e000-4000-8000-000000000002"));
    data["NFS"] = korvtest::ParseJson(R"({"calls": 40, "read_byte": 50, "write_byte": 60})");
    data["time"] = time;
    Json::Value reply;
    reply["data"] = data;
    return reply;
}

// What a walk with -Os -OQ -Oe -OU must show for the library's result of the
// first sample (rows numbered from 1 in the result's order), the subagent's
// own age and failure count left out.
std::map<std::string, std::string> ExpectedObjects(const Json::Value &result)
{
    std::map<std::string, std::string> objects;
    auto number = [](const Json::Value &value) { return std::to_string(value.asUInt64()); };
    auto text = [](const Json::Value &value) { return value.asString(); };
    auto scalars = [&](const char *section, std::initializer_list<std::pair<const char *, const char *>> names) {
        for (const auto &[object, member] : names)
            if (result[section].isMember(member))
                objects[std::string(object) + ".0"] = number(result[section][member]);
    };
    objects["korvSampleTime.0"] = number(result["time"]);
    objects["korvSampleInterval.0"] = "3600";
    scalars("cpu", {{"korvCpuUser", "user"}, {"korvCpuNice", "nice"}, {"korvCpuSystem", "system"},
                    {"korvCpuIdle", "idle"}, {"korvCpuIowait", "iowait"}, {"korvCpuIrq", "irq"},
                    {"korvCpuSoftirq", "softirq"}, {"korvCpuSteal", "steal"}});
    scalars("memory", {{"korvMemorySize", "memory_size"}, {"korvMemoryTotalReal", "total_real"},
                       {"korvMemoryAvailReal", "avail_real"}, {"korvMemoryFreeReal", "free_real"},
                       {"korvMemoryCached", "cached"}, {"korvMemoryBuffer", "buffer"},
                       {"korvMemoryTotalSwap", "total_swap"}, {"korvMemoryAvailSwap", "avail_swap"}});
    scalars("nfs", {{"korvNfsCalls", "calls"}, {"korvNfsReadByte", "read_byte"},
                    {"korvNfsWriteByte", "write_byte"}});
    const std::pair<const char *, const char *> counters[] = {
        {"Utilization", "utilization"}, {"ReadAccess", "read_access"}, {"ReadByte", "read_byte"},
        {"WriteAccess", "write_access"}, {"WriteByte", "write_byte"}};
    for (const auto &[table, section, total] :
         {std::tuple("korvDisk", "disk", "korvDiskTotal"), std::tuple("korvVolume", "space", "korvVolumeTotal")})
        for (const auto &[suffix, member] : counters)
            objects[std::string(total) + suffix + ".0"] = number(result[section]["total"][member]);
    const std::map<std::string, std::string> diskTypes = {{"internal", "1"}, {"ebox", "2"}, {"usb", "3"}, {"eSATA", "4"}};
    const std::tuple<std::string, Json::Value, const char *, const char *, const char *, const char *> tables[] = {
        {"korvDisk", result["disk"]["disk"], "device", "Device", "display_name", "DisplayName"},
        {"korvVolume", result["space"]["volume"], "device", "Device", "display_name", "DisplayName"},
        {"korvLun", result["lun"], "uuid", "Uuid", "lun_name", "Name"}};
    for (const auto &[table, rows, key, keyObject, name, nameObject] : tables) {
        int row = 0;
        for (const Json::Value &record : rows) {
            const std::string index = "." + std::to_string(++row);
            objects[table + keyObject + index] = text(record[key]);
            objects[table + nameObject + index] = text(record[name]);
            for (const auto &[suffix, member] : counters)
                objects[table + suffix + index] = number(record[member]);
            if (table == "korvDisk") {
                auto type = diskTypes.find(record["type"].asString());
                objects["korvDiskType" + index] = type == diskTypes.end() ? "5" : type->second;
            }
        }
    }
    int row = 0;
    for (const Json::Value &interface : result["network"]) {
        const std::string index = "." + std::to_string(++row);
        objects["korvIfDevice" + index] = text(interface["device"]);
        const std::string device = interface["device"].asString();
        objects["korvIfKind" + index] = row == 1 ? "1" : device == "bond0" ? "3" : device.rfind("ppp0", 0) == 0 ? "4" : "2";
        objects["korvIfRx" + index] = number(interface["rx"]);
        objects["korvIfTx" + index] = number(interface["tx"]);
    }
    return objects;
}

class AgentxUnderSnmpd : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_FALSE(scratch_.Path().empty());
        std::string whyNot;
        ASSERT_TRUE(nodes_.Make(2, whyNot)) << whyNot;
        hostFile_ = scratch_.Path() + "/host.json";
        std::ofstream(hostFile_) << HostDescription(nodes_);
        ASSERT_EQ(access(kSnmpd, X_OK), 0) << "snmpd is not installed";
        port_ = FreeUdpPort();
        agentxSocket_ = scratch_.Path() + "/agentx.sock";
        std::ofstream(scratch_.Path() + "/snmpd.conf")
            << "agentaddress udp:127.0.0.1:" << port_ << "\n"
            << "master agentx\n"
            << "agentXSocket " << agentxSocket_ << "\n"
            << "agentXTimeout 1\n"
            << "view korvview included .1.3.6.1.3.7947\n"
            << "rocommunity public 127.0.0.1 -V korvview\n";
        collector_.emplace();
        StartSnmpd();
    }

    void TearDown() override
    {
        unsetenv("KORVPLATFORM_HOST");
        korvstandin::UseProcessHost();
    }

    void StartSnmpd()
    {
        setenv("SNMP_PERSISTENT_DIR", (scratch_.Path() + "/snmpd-state").c_str(), 1);
        snmpd_.emplace(std::vector<std::string>{kSnmpd, "-f", "-C", "-c", scratch_.Path() + "/snmpd.conf",
                                                "-M", "", "-m", "", "-Lo"},
                       scratch_.Path() + "/snmpd.out");
        unsetenv("SNMP_PERSISTENT_DIR");
        ASSERT_TRUE(PollUntil([&] { return fs::exists(agentxSocket_); }))
            << ReadFile(scratch_.Path() + "/snmpd.out");
    }

    void StartSubagent()
    {
        subagent_.emplace(std::vector<std::string>{KORVSNMP_AGENTX_PATH, "--agentx-socket", agentxSocket_,
                                                   "--interval", "3600", "--ping-interval", "1",
                                                   "--persistent-dir", scratch_.Path() + "/agentx-state"},
                          SubagentLog(), Variables());
    }

    std::vector<std::string> Variables() const
    {
        std::vector<std::string> variables = korvtest::RedirectedChildVariables();
        variables.push_back("KORVPLATFORM_HOST=" + hostFile_);
        return variables;
    }

    std::string SubagentLog() const { return scratch_.Path() + "/agentx.out"; }

    std::string Client(const std::string &tool, const std::string &arguments) const
    {
        return RunCommand("SNMP_PERSISTENT_DIR=" + scratch_.Path() + "/client " + tool + " -v2c -c public -t 1 -r 0 -M " KORVSNMP_MIB_DIRS " -m KORVSNMP-MIB " +
                   "-Os -OQ -Oe -OU 127.0.0.1:" + std::to_string(port_) + " " + arguments);
    }

    std::string Get(const std::string &object) const { return Client("snmpget", object); }

    // Waits until the subagent answers from the sample of `time`.
    bool WaitForSample(unsigned time)
    {
        const std::string expected = "korvSampleTime.0 = " + std::to_string(time) + "\n";
        return PollUntil([&] { return Get("korvSampleTime.0") == expected; });
    }

    // Sends SIGHUP and waits until the subagent answers from the sample of `time`.
    bool SampleNow(unsigned time)
    {
        kill(subagent_->Pid(), SIGHUP);
        return WaitForSample(time);
    }

    // The library's result for `reply`, as the described appliance names it.
    Json::Value LibraryResult(const Json::Value &reply) const
    {
        setenv("KORVPLATFORM_HOST", hostFile_.c_str(), 1);
        korvstandin::UseProcessHost();
        Json::Value request, result;
        request["resource"].append("all");
        EXPECT_TRUE(SNMPParseReplyData(request, reply, result));
        return result;
    }

    static std::map<std::string, std::string> Objects(const std::string &walk)
    {
        std::map<std::string, std::string> objects;
        std::istringstream lines(walk);
        for (std::string line; std::getline(lines, line);) {
            size_t equals = line.find(" = ");
            if (equals == std::string::npos)
                objects["?" + line] = "";
            else if (line.find(" = No more variables left in this MIB View", equals) == equals)
                continue;  // the walk's end
            else if (line.compare(0, 15, "korvSnapshotAge") != 0 && line.compare(0, 17, "korvFailedSamples") != 0)
                objects[line.substr(0, equals)] = line.substr(equals + 3);
        }
        return objects;
    }

    ScratchDir scratch_;
    korvtest::BlockNodes nodes_;
    std::string hostFile_;
    uint16_t port_ = 0;
    std::string agentxSocket_;
    std::optional<korvtest::TestCollector> collector_;
    std::optional<Child> snmpd_;
    std::optional<Child> subagent_;  // declared last: stopped first
};

TEST_F(AgentxUnderSnmpd, EveryObjectIsTheLibrarysResultAndTheEdgesOfTheSubtreeAnswerRight)
{
    const Json::Value reply = DescribedReply(nodes_, 1795000000, 7);
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    StartSubagent();  // it samples at once
    ASSERT_TRUE(WaitForSample(1795000000)) << ReadFile(SubagentLog());

    const std::string walk = Client("snmpwalk", "korvsnmpMIB");
    EXPECT_THAT(Objects(walk), ::testing::ContainerEq(ExpectedObjects(LibraryResult(reply)))) << walk;
    EXPECT_THAT(walk, ::testing::EndsWith(
                          " = No more variables left in this MIB View (It is past the end of the MIB tree)\n"));
    EXPECT_EQ(Client("snmpbulkwalk", "-Cr7 korvsnmpMIB"), walk);

    const std::pair<std::string, std::string> edges[] = {
        {"snmpget korvDiskDevice.999", "korvDiskDevice.999 = No Such Instance currently exists at this OID\n"},
        {"snmpget korvObjects.99.0", "korvObjects.99.0 = No Such Object available on this agent at this OID\n"},
        {"snmpgetnext korvLunWriteByte.2",
         "korvLunWriteByte.2 = No more variables left in this MIB View (It is past the end of the MIB tree)\n"},
        {"snmpgetnext korvLunTable.9", "korvLunTable.9 = No more variables left in this MIB View (It is past the end of the MIB tree)\n"},
        {"snmpgetnext korvSampleTime", "korvSampleTime.0 = 1795000000\n"},
    };
    for (const auto &[command, expected] : edges) {
        const size_t space = command.find(' ');
        EXPECT_EQ(Client(command.substr(0, space), command.substr(space + 1)), expected) << command;
    }

    EXPECT_EQ(subagent_->Stop(), 0) << ReadFile(SubagentLog());
    EXPECT_THAT(Client("snmpwalk", "korvsnmpMIB"), ::testing::HasSubstr("No more variables left"));
}

TEST_F(AgentxUnderSnmpd, AStalledCollectorLeavesTheLastSampleAndAGoneOneIsCountedAndLoggedOnce)
{
    collector_->Script({korvtest::Frame(korvtest::JsonText(DescribedReply(nodes_, 1795000000, 1)))});
    StartSubagent();  // it samples at once
    ASSERT_TRUE(WaitForSample(1795000000)) << ReadFile(SubagentLog());
    const std::string before = Client("snmpwalk", "korvsnmpMIB");

    // The collector takes the request and holds the answer: the sampler waits
    // in the library, the walk answers from the previous snapshot at once.
    collector_->Script({"", false});
    const int idle = CollectorSocketCount();
    kill(subagent_->Pid(), SIGHUP);
    ASSERT_TRUE(PollUntil([&] { return CollectorSocketCount() > idle; }));
    const auto start = Clock::now();
    const std::string during = Client("snmpbulkwalk", "korvsnmpMIB");
    EXPECT_LT(Clock::now() - start, std::chrono::seconds(1));
    EXPECT_EQ(Objects(during), Objects(before));

    // Gone: the held exchange fails, then one more sample fails.
    collector_.reset();
    std::optional<korvtest::NoCollector> none(std::in_place);
    ASSERT_TRUE(PollUntil([&] { return Get("korvFailedSamples.0") == "korvFailedSamples.0 = 1\n"; }));
    kill(subagent_->Pid(), SIGHUP);
    ASSERT_TRUE(PollUntil([&] { return Get("korvFailedSamples.0") == "korvFailedSamples.0 = 2\n"; }));
    EXPECT_EQ(Objects(Client("snmpwalk", "korvsnmpMIB")), Objects(before));

    // Back, with a reply that lacks the disks: their table empties.
    none.reset();
    collector_.emplace();
    Json::Value reply = DescribedReply(nodes_, 1795000060, 2);
    reply["data"].removeMember("DiskIO");
    collector_->Script({korvtest::Frame(korvtest::JsonText(reply))});
    ASSERT_TRUE(SampleNow(1795000060)) << ReadFile(SubagentLog());
    EXPECT_EQ(Client("snmpgetnext", "korvDiskTotal korvDiskTable"),
              "korvIfDevice.1 = total\nkorvIfDevice.1 = total\n");

    const std::string log = ReadFile(SubagentLog());
    auto count = [&log](const std::string &text) {
        size_t n = 0;
        for (size_t at = log.find(text); at != std::string::npos; at = log.find(text, at + 1))
            ++n;
        return n;
    };
    EXPECT_EQ(count("No statistics from the collector; answering from the last sample"), 1u) << log;
    EXPECT_EQ(count("The collector answers again"), 1u) << log;
}

TEST_F(AgentxUnderSnmpd, SigtermDuringAStalledExchangeStopsAtOnce)
{
    collector_->Script({"", false});  // the first sample stalls
    const int idle = CollectorSocketCount();
    StartSubagent();
    ASSERT_TRUE(PollUntil([&] { return CollectorSocketCount() > idle; }));
    ASSERT_TRUE(PollUntil([&] { return Get("korvSampleInterval.0") == "korvSampleInterval.0 = 3600\n"; }));

    const auto start = Clock::now();
    EXPECT_EQ(subagent_->Stop(), 0) << ReadFile(SubagentLog());
    EXPECT_LT(Clock::now() - start, std::chrono::seconds(10));  // not the library's 90 s
}

TEST_F(AgentxUnderSnmpd, ARestartedSnmpdFindsTheSubagentRegisteredAgain)
{
    collector_->Script({korvtest::Frame(korvtest::JsonText(DescribedReply(nodes_, 1795000000, 3)))});
    StartSubagent();  // it samples at once
    ASSERT_TRUE(WaitForSample(1795000000)) << ReadFile(SubagentLog());

    snmpd_.reset();
    StartSnmpd();
    EXPECT_TRUE(PollUntil([&] { return Get("korvSampleTime.0") == "korvSampleTime.0 = 1795000000\n"; }))
        << ReadFile(SubagentLog());
    EXPECT_EQ(subagent_->Stop(), 0) << ReadFile(SubagentLog());
}

}  // namespace
