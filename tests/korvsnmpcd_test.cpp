// The reference collector: its parsers on fixed kernel texts, the rate
// rules, the replies, and the built daemon itself, run on a socket of its own
// and talked to over raw connections, hostile clients included.
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstring>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include "client_crowd.h"
#include "collector_process.h"
#include "proc_parsers.h"
#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "rates.h"
#include "reply.h"
#include "json_text.h"
#include "syslog_capture.h"

namespace {

using korvsnmpcd::BlockCounters;
using korvtest::CollectorProcess;
using korvsnmpcd::Snapshot;
using korvproto::UniqueFd;
using korvtest::Logged;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Pair;
using ::testing::UnorderedElementsAre;
using Clock = std::chrono::steady_clock;

constexpr uint32_t kUint32Max = 4294967295u;

// Record fields in one list, for comparison with ElementsAre.
std::vector<uint64_t> Fields(std::initializer_list<uint64_t> values) { return values; }

// ---------------------------------------------------------------- parsers

TEST(KorvsnmpcdParsers, CpuLineOfAllProcessors)
{
    const char text[] =
        "cpu  10 20 30 40 50 60 70 80 90 100\n"
        "cpu0 1 2 3 4 5 6 7 8 9 10\n"
        "intr 12345\n";
    korvsnmpcd::CpuTimes times;
    ASSERT_TRUE(korvsnmpcd::ParseCpuTimes(text, times));
    EXPECT_THAT(Fields({times.user, times.nice, times.system, times.idle, times.iowait, times.irq,
                        times.softirq, times.steal}),
                ElementsAre(10, 20, 30, 40, 50, 60, 70, 80));

    korvsnmpcd::CpuTimes old;
    ASSERT_TRUE(korvsnmpcd::ParseCpuTimes("cpu 1 2 3 4\n", old));
    EXPECT_EQ(old.idle, 4u);
    EXPECT_EQ(old.iowait, 0u);

    korvsnmpcd::CpuTimes untouched;
    untouched.user = 7;
    EXPECT_FALSE(korvsnmpcd::ParseCpuTimes("cpu0 1 2 3 4 5\n", untouched));
    EXPECT_FALSE(korvsnmpcd::ParseCpuTimes("cpu 1 2 x 4 5\n", untouched));
    EXPECT_FALSE(korvsnmpcd::ParseCpuTimes("", untouched));
    EXPECT_EQ(untouched.user, 7u);
}

TEST(KorvsnmpcdParsers, MemorySizesInKiB)
{
    const char text[] =
        "MemTotal:       24684096 kB\n"
        "MemFree:        24218396 kB\n"
        "MemAvailable:   24277032 kB\n"
        "Buffers:            1380 kB\n"
        "Cached:           261308 kB\n"
        "SwapCached:            9 kB\n"
        "SwapTotal:       2097148 kB\n"
        "SwapFree:        2097000 kB\n";
    korvsnmpcd::MemoryInfo memory;
    ASSERT_TRUE(korvsnmpcd::ParseMemoryInfo(text, memory));
    EXPECT_THAT(Fields({memory.totalKiB, memory.freeKiB, memory.availableKiB, memory.buffersKiB,
                        memory.cachedKiB, memory.swapTotalKiB, memory.swapFreeKiB}),
                ElementsAre(24684096, 24218396, 24277032, 1380, 261308, 2097148, 2097000));
    EXPECT_FALSE(korvsnmpcd::ParseMemoryInfo("MemFree: 12 kB\n", memory));
}

TEST(KorvsnmpcdParsers, InterfaceByteCounters)
{
    const char text[] =
        "Inter-|   Receive                                                |  Transmit\n"
        " face |bytes    packets errs drop fifo frame compressed multicast|bytes    packets "
        "errs drop fifo colls carrier compressed\n"
        "    lo:    3267      29    0    0    0     0          0         0     4268      29    "
        "0    0    0     0       0          0\n"
        "eth0:18446744073709551615 5 0 0 0 0 0 0 77 6 0 0 0 0 0 0\n"
        "  bad: 1 2 3\n";
    EXPECT_THAT(korvsnmpcd::ParseNetDev(text),
                ElementsAre(Pair("eth0", ::testing::AllOf(
                                             ::testing::Field(&korvsnmpcd::InterfaceCounters::rxBytes,
                                                              18446744073709551615ull),
                                             ::testing::Field(&korvsnmpcd::InterfaceCounters::txBytes, 77u))),
                            Pair("lo", ::testing::AllOf(
                                           ::testing::Field(&korvsnmpcd::InterfaceCounters::rxBytes, 3267u),
                                           ::testing::Field(&korvsnmpcd::InterfaceCounters::txBytes, 4268u)))));
}

TEST(KorvsnmpcdParsers, BlockDeviceCountersOfEveryKernelLayout)
{
    const char text[] =
        // 14 fields (older kernels), 18 (discards), 20 (flushes)
        "   8       0 sda 100 1 2000 3 400 4 8000 5 0 900 6\n"
        "   8       1 sda1 10 0 200 0 40 0 800 0 0 90 0 0 0 0 0\n"
        " 253       0 dm-0 7 0 70 0 8 0 80 0 0 700 0 0 0 0 0 0 0\n"
        "   8      16 short 1 2 3\n";
    auto devices = korvsnmpcd::ParseDiskStats(text);
    ASSERT_EQ(devices.size(), 3u);
    const BlockCounters &sda = devices.at("sda");
    EXPECT_THAT(Fields({sda.major, sda.minor, sda.reads, sda.sectorsRead, sda.writes,
                        sda.sectorsWritten, sda.ioTicksMs}),
                ElementsAre(8, 0, 100, 2000, 400, 8000, 900));
    EXPECT_EQ(devices.at("sda1").minor, 1u);
    EXPECT_EQ(devices.at("dm-0").major, 253u);
    EXPECT_EQ(devices.at("dm-0").ioTicksMs, 700u);
}

TEST(KorvsnmpcdParsers, NfsServerAndMountSources)
{
    auto nfs = korvsnmpcd::ParseNfsServer(
        "rc 0 12 34\nio 1000 2000\nth 8 0 0 0 0 0 0 0 0 0 0 0\nrpc 55 0 0 0 0\nproc3 22 0 1\n");
    EXPECT_EQ(nfs.readBytes, 1000u);
    EXPECT_EQ(nfs.writtenBytes, 2000u);
    EXPECT_EQ(nfs.rpcCalls, 55u);

    EXPECT_THAT(korvsnmpcd::ParseMountSources(
                    "/dev/sda1 / ext4 rw 0 0\n"
                    "proc /proc proc rw 0 0\n"
                    "/dev/disk/by-label/My\\040Disk /mnt/x vfat rw 0 0\n"
                    "/dev/trailing\\04 /y ext4 rw 0 0\n"),
                ElementsAre("/dev/sda1", "proc", "/dev/disk/by-label/My Disk", "/dev/trailing\\04"));
}

// ---------------------------------------------------------------- rates

TEST(KorvsnmpcdRates, CounterRules)
{
    struct Case {
        uint64_t before, after, elapsedMs;
        uint32_t rate;
    } cases[] = {
        {100, 1100, 1000, 1000},                    // per second
        {100, 1100, 500, 2000},                     // over half a second
        {0, 2, 3000, 1},                            // rounded to nearest
        {1100, 100, 1000, 0},                       // backwards: reset or wrapped
        {4294967290u, 5, 1000, 0},                  // a 32-bit kernel counter wrapping
        {0, 10, 0, 0},                              // no time elapsed
        {0, 4294967296ull, 1000, kUint32Max},       // clamped to 32 bits
        {0, 18446744073709551615ull, 1, kUint32Max},  // no overflow on the way
    };
    for (const Case &c : cases) {
        EXPECT_EQ(korvsnmpcd::CounterRate(c.before, c.after, c.elapsedMs), c.rate)
            << c.before << " -> " << c.after << " in " << c.elapsedMs << " ms";
    }
    EXPECT_EQ(korvsnmpcd::BusyPercent(1000, 1500, 1000), 50u);
    EXPECT_EQ(korvsnmpcd::BusyPercent(1000, 3000, 1000), 100u);  // never above 100
    EXPECT_EQ(korvsnmpcd::BusyPercent(3000, 1000, 1000), 0u);
}

TEST(KorvsnmpcdRates, CpuShares)
{
    korvsnmpcd::CpuTimes before{100, 0, 100, 100, 0, 0, 0, 0};
    korvsnmpcd::CpuTimes after{125, 0, 150, 125, 0, 0, 0, 0};
    korvsnmpcd::CpuUsage usage = korvsnmpcd::CpuPercentages(before, after);
    EXPECT_EQ(usage.user, 25u);
    EXPECT_EQ(usage.system, 50u);
    EXPECT_EQ(usage.idle, 25u);

    korvsnmpcd::CpuTimes backwards{0, 0, 0, 200, 0, 0, 0, 0};
    usage = korvsnmpcd::CpuPercentages(after, backwards);  // only idle moved: 200 - 125
    EXPECT_EQ(usage.idle, 100u);
    EXPECT_EQ(usage.user, 0u);
    EXPECT_EQ(korvsnmpcd::CpuPercentages(after, after).idle, 100u);
}

BlockCounters Block(unsigned minor, uint64_t reads, uint64_t sectors, uint64_t ticks)
{
    BlockCounters counters;
    counters.major = 8;
    counters.minor = minor;
    counters.reads = reads;
    counters.sectorsRead = sectors;
    counters.writes = reads * 2;
    counters.sectorsWritten = sectors * 2;
    counters.ioTicksMs = ticks;
    return counters;
}

TEST(KorvsnmpcdRates, DevicesComingAndGoingGiveNoSpike)
{
    Snapshot before;
    before.monotonicMs = 10000;
    before.blocks = {{"sda", Block(0, 10, 100, 0)}, {"sdb", Block(16, 5, 5, 0)},
                     {"sdc", Block(32, 9, 9, 0)}};
    before.interfaces = {{"eth0", {1000, 2000}}, {"eth1", {1, 1}}};
    Snapshot after;
    after.monotonicMs = 12000;
    after.blocks = {{"sda", Block(0, 30, 300, 1000)},        // steady
                    {"sdc", Block(48, 999999, 999999, 0)},   // replaced by another device
                    {"sdd", Block(64, 500000, 500000, 0)}};  // new
    after.disks = {"sda", "sdc", "sdd"};
    after.mounted = {"sda", "sdd", "sdx"};  // sdx has no counters
    after.interfaces = {{"eth0", {3000, 2000}}, {"ppp0", {123456789, 1}}};

    korvsnmpcd::Rates rates = korvsnmpcd::ComputeRates(before, after);
    ASSERT_EQ(rates.disks.size(), 3u);
    const korvsnmpcd::BlockRates &sda = rates.disks.at("sda");
    EXPECT_THAT(Fields({sda.readAccess, sda.readByte, sda.writeAccess, sda.writeByte, sda.utilization}),
                ElementsAre(10, 100 * 512, 20, 200 * 512, 50));
    for (const char *fresh : {"sdc", "sdd"}) {
        const korvsnmpcd::BlockRates &zero = rates.disks.at(fresh);
        EXPECT_EQ(zero.readAccess + zero.readByte + zero.writeAccess + zero.writeByte +
                      zero.utilization,
                  0u)
            << fresh;
    }
    EXPECT_EQ(rates.disks.count("sdb"), 0u);

    ASSERT_EQ(rates.spaces.size(), 2u);  // sda and sdd
    EXPECT_EQ(rates.spaceTotal.readByte, 100u * 512);
    EXPECT_EQ(rates.spaceTotal.utilization, 25u);  // mean of 50 and 0

    EXPECT_EQ(rates.interfaces.at("eth0").rx, 1000u);
    EXPECT_EQ(rates.interfaces.at("eth0").tx, 0u);
    EXPECT_EQ(rates.interfaces.at("ppp0").rx, 0u);
    EXPECT_EQ(rates.interfaces.count("eth1"), 0u);
}

TEST(KorvsnmpcdRates, SpaceTotalIsClampedNotWrapped)
{
    Snapshot before;
    before.monotonicMs = 0;
    before.blocks = {{"sda", Block(0, 0, 0, 0)}, {"sdb", Block(16, 0, 0, 0)}};
    Snapshot after = before;
    after.monotonicMs = 1000;
    after.blocks = {{"sda", Block(0, 3000000000u, 0, 0)}, {"sdb", Block(16, 3000000000u, 0, 0)}};
    after.mounted = {"sda", "sdb"};
    korvsnmpcd::Rates rates = korvsnmpcd::ComputeRates(before, after);
    EXPECT_EQ(rates.spaces.at("sda").writeAccess, kUint32Max);
    EXPECT_EQ(rates.spaceTotal.readAccess, kUint32Max);
}

// ---------------------------------------------------------------- replies and frames

TEST(KorvsnmpcdReply, StatisticsSections)
{
    korvsnmpcd::Rates rates;
    rates.interfaces["eth0"] = {7, 8};
    rates.disks["sda"] = {1, 2, 3, 4, 5};
    rates.spaces["sda1"] = {6, 7, 8, 9, 10};
    rates.spaceTotal = {6, 7, 8, 9, 10};
    Snapshot sample;
    sample.memory.totalKiB = 8000000000ull;  // beyond 32 bits: clamped
    sample.epochSeconds = 1700000000;

    Json::Value reply = korvsnmpcd::StatisticsReply(rates, sample);
    const Json::Value &data = reply["data"];
    EXPECT_EQ(data["Memory"][0]["total_real"].asUInt(), kUint32Max);
    EXPECT_EQ(korvtest::JsonText(data["Network"]), "[{\"device\":\"eth0\",\"rx\":7,\"tx\":8}]");
    EXPECT_EQ(korvtest::JsonText(data["DiskIO"]),
              "[{\"device\":\"sda\",\"read_access\":2,\"read_byte\":3,\"utilization\":1,"
              "\"write_access\":4,\"write_byte\":5}]");
    ASSERT_EQ(data["SpaceIO"].size(), 2u);
    EXPECT_EQ(data["SpaceIO"][0]["device"], "sda1");
    EXPECT_EQ(data["SpaceIO"][1]["device"], "total");
    EXPECT_EQ(data["SpaceIO"][1]["write_byte"].asUInt(), 10u);
    EXPECT_EQ(korvtest::JsonText(data["iSCSI"]), "[]");
    EXPECT_EQ(data["time"].asInt64(), 1700000000);
}

class KorvsnmpcdAnswer : public ::testing::Test {
protected:
    void SetUp() override { korvtest::ClearLog(); }
};

TEST_F(KorvsnmpcdAnswer, ControlAndStatisticsRequests)
{
    using korvsnmpcd::RequestKind;
    EXPECT_EQ(korvsnmpcd::ReadRequest(std::string("{\"request\":\"reload\"}\n\0", 22)),
              RequestKind::kControl);
    EXPECT_EQ(korvsnmpcd::ReadRequest("{\"reason\":\"disk swap\",\"request\":\"history_mode\"}\n"),
              RequestKind::kControl);
    EXPECT_EQ(korvsnmpcd::ControlReply(RequestKind::kControl), "{\"success\":true}");
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(Logged(LOG_NOTICE, "reply",
                                   "Reload requested; nothing to reload, sampling goes on"),
                            Logged(LOG_NOTICE, "reply", "History mode requested, reason: [disk swap]")));
    for (const char *statisticsRequest :
         {"{\"resource\":[\"all\"]}\n", "{}", "{\"request\":\"other\"}", "{\"request\":7}"})
        EXPECT_EQ(korvsnmpcd::ReadRequest(statisticsRequest), RequestKind::kStatistics)
            << statisticsRequest;
}

TEST_F(KorvsnmpcdAnswer, AnythingButAnObjectIsRefused)
{
    const std::string deep(100000, '[');
    for (const std::string &body : {std::string("garbage"), std::string("[1,2]"), std::string("7"),
                                    std::string(""), std::string("{\"a\":"), deep}) {
        EXPECT_EQ(korvsnmpcd::ReadRequest(body), korvsnmpcd::RequestKind::kNotAnObject)
            << body.substr(0, 20);
    }
    EXPECT_EQ(korvsnmpcd::ControlReply(korvsnmpcd::RequestKind::kNotAnObject),
              "{\"error\":\"the request is not a JSON object\",\"success\":false}");
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::IsEmpty());  // the server counts refusals
}

// ---------------------------------------------------------------- the daemon

constexpr auto kPeerWait = std::chrono::seconds(5);
constexpr char kClientTimeout[] = "0.6";
constexpr auto kPrompt = std::chrono::milliseconds(400);  // well within the client timeout

std::string TestSocketPath(const char *tag)
{
    return "/tmp/korvsnmpcd-test-" + std::to_string(getpid()) + "-" + tag + ".sock";
}

sockaddr_un Address(const std::string &path)
{
    sockaddr_un address;
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    return address;
}

Json::Value StatisticsRequest()
{
    Json::Value request;
    request["resource"].append("all");
    return request;
}

bool Answers(const std::string &path)
{
    const std::string frame = korvproto::EncodeRequestFrame(StatisticsRequest());
    Json::Value reply = korvtest::ParseJson(korvtest::ExchangeWith(path, frame));
    return reply.isObject() && reply["data"].isObject() && reply["data"]["Memory"].isArray();
}

// The built daemon on a socket path of its own; its output goes to a file beside the socket.
std::unique_ptr<CollectorProcess> StartDaemon(const std::string &path)
{
    return std::make_unique<CollectorProcess>(
        KORVSNMPCD_PATH,
        std::vector<std::string>{"--foreground", "--socket", path, "--interval", "0.05",
                                 "--client-timeout", kClientTimeout},
        path + ".log");
}

class KorvsnmpcdDaemon : public ::testing::Test {
protected:
    // The daemon (a member) is started before SetUp runs: removing its path
    // here would race with its bind. It replaces a stale socket file itself.
    void SetUp() override
    {
        ASSERT_GT(daemon_->Pid(), 0) << "cannot start " << KORVSNMPCD_PATH;
        ASSERT_TRUE(korvtest::WaitUntilConnectable(path_)) << daemon_->Log();
    }
    void TearDown() override
    {
        EXPECT_TRUE(Answers(path_)) << "the daemon no longer answers";
        EXPECT_EQ(daemon_->Stop(SIGTERM), 0) << daemon_->Log();
        EXPECT_NE(access(path_.c_str(), F_OK), 0) << "socket file left behind";
    }

    const std::string path_ = TestSocketPath("main");
    std::unique_ptr<CollectorProcess> daemon_ = StartDaemon(path_);
};

TEST_F(KorvsnmpcdDaemon, StatisticsReplyHasEverySection)
{
    const std::string frame = korvproto::EncodeRequestFrame(StatisticsRequest());
    Json::Value reply = korvtest::ParseJson(korvtest::ExchangeWith(path_, frame));
    const Json::Value &data = reply["data"];
    ASSERT_TRUE(data.isObject()) << reply;
    EXPECT_EQ(data["System"].size(), 1u);
    ASSERT_EQ(data["Memory"].size(), 1u);
    korvsnmpcd::MemoryInfo memory;
    ASSERT_TRUE(korvsnmpcd::ParseMemoryInfo(korvtest::ReadWholeFile("/proc/meminfo"), memory));
    EXPECT_EQ(data["Memory"][0]["total_real"].asUInt(), memory.totalKiB);

    std::vector<std::string> interfaces;
    for (const Json::Value &record : data["Network"]) {
        interfaces.push_back(record["device"].asString());
        EXPECT_TRUE(record["rx"].isUInt() && record["tx"].isUInt()) << record;
    }
    EXPECT_THAT(interfaces, Contains("lo"));
    for (const char *section : {"DiskIO", "SpaceIO"}) {
        ASSERT_TRUE(data[section].isArray()) << section;
        for (const Json::Value &record : data[section]) {
            for (const char *counter :
                 {"utilization", "read_access", "read_byte", "write_access", "write_byte"})
                EXPECT_TRUE(record[counter].isUInt()) << section << " " << record;
            EXPECT_LE(record["utilization"].asUInt(), 100u);
        }
    }
    ASSERT_GE(data["SpaceIO"].size(), 1u);
    EXPECT_EQ(data["SpaceIO"][data["SpaceIO"].size() - 1]["device"], "total");
    EXPECT_TRUE(data["iSCSI"].isArray());
    EXPECT_TRUE(data.isMember("NFS"));
    int64_t now = std::chrono::duration_cast<std::chrono::seconds>(
                      std::chrono::system_clock::now().time_since_epoch())
                      .count();
    EXPECT_NEAR(static_cast<double>(data["time"].asInt64()), static_cast<double>(now), 5);
}

TEST_F(KorvsnmpcdDaemon, ControlRequestsSucceedAndLogTheReason)
{
    Json::Value reload;
    reload["request"] = "reload";
    Json::Value history;
    history["request"] = "history_mode";
    history["reason"] = "nightly backup";
    EXPECT_EQ(korvtest::ExchangeWith(path_, korvproto::EncodeRequestFrame(reload)), "{\"success\":true}");
    EXPECT_EQ(korvtest::ExchangeWith(path_, korvproto::EncodeRequestFrame(history)), "{\"success\":true}");
    EXPECT_THAT(daemon_->Log(), HasSubstr("History mode requested, reason: [nightly backup]"));
    EXPECT_THAT(daemon_->Log(), HasSubstr("Reload requested"));
}

TEST_F(KorvsnmpcdDaemon, GarbageIsRefusedOrDropped)
{
    const std::string garbage = korvproto::EncodeFramePrefix(8) + "garbage!";
    EXPECT_EQ(korvtest::ParseJson(korvtest::ExchangeWith(path_, garbage))["success"], false);

    struct Case {
        const char *what;
        std::string bytes;
    } cases[] = {
        {"text without a frame", "GET / HTTP/1.0\r\n\r\n"},  // claims 0x47455420 bytes
        {"oversize length claim", korvproto::EncodeFramePrefix(0xffffffffu) + "{}"},
        {"zero length", korvproto::EncodeFramePrefix(0)},
    };
    for (const Case &c : cases) {
        Clock::time_point start = Clock::now();
        EXPECT_EQ(korvtest::ExchangeWith(path_, c.bytes), "") << c.what;
        EXPECT_LT(Clock::now() - start, kPrompt) << c.what << ": not closed at once";
    }
}

TEST_F(KorvsnmpcdDaemon, HundredsOfConnectionsInARowLeakNothing)
{
    ASSERT_TRUE(Answers(path_));
    size_t descriptors = korvtest::OpenDescriptorCount(daemon_->Pid());
    const std::string frame = korvproto::EncodeRequestFrame(StatisticsRequest());
    for (int i = 0; i < 300; ++i)
        ASSERT_TRUE(korvtest::ParseJson(korvtest::ExchangeWith(path_, frame))["data"].isObject()) << "exchange " << i;
    // Clients that leave without waiting for their reply.
    for (int i = 0; i < 300; ++i) {
        UniqueFd fd = korvtest::ConnectTo(path_);
        ASSERT_TRUE(fd.Valid()) << "connection " << i;
        const std::string sent = i % 2 == 0 ? frame : frame.substr(0, 6);
        send(fd.Get(), sent.data(), sent.size(), MSG_NOSIGNAL);
    }
    ASSERT_TRUE(Answers(path_));
    // The daemon closes the last of them as it notices that their clients left.
    Clock::time_point giveUp = Clock::now() + kPeerWait;
    while (korvtest::OpenDescriptorCount(daemon_->Pid()) != descriptors && Clock::now() < giveUp)
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    EXPECT_EQ(korvtest::OpenDescriptorCount(daemon_->Pid()), descriptors);
}

TEST(KorvsnmpcdLifecycle, SecondDaemonRefusesToStart)
{
    const std::string path = TestSocketPath("twice");
    unlink(path.c_str());
    auto first = StartDaemon(path);
    ASSERT_TRUE(korvtest::WaitUntilConnectable(path)) << first->Log();
    auto second = StartDaemon(path);
    EXPECT_EQ(second->WaitForExit(), 1);
    EXPECT_THAT(second->Log(), HasSubstr("Another collector already answers on [" + path +
                                        "]; not starting"));
    EXPECT_TRUE(Answers(path));
    EXPECT_EQ(first->Stop(SIGINT), 0);
    EXPECT_NE(access(path.c_str(), F_OK), 0);
}

TEST(KorvsnmpcdLifecycle, StaleSocketIsReplacedButNoOtherFile)
{
    const std::string path = TestSocketPath("stale");
    unlink(path.c_str());
    {
        UniqueFd stale(socket(AF_UNIX, SOCK_STREAM, 0));
        sockaddr_un address = Address(path);
        ASSERT_EQ(bind(stale.Get(), reinterpret_cast<sockaddr *>(&address), sizeof address), 0);
    }
    {
        auto daemon = StartDaemon(path);
        ASSERT_TRUE(korvtest::WaitUntilConnectable(path)) << daemon->Log();
        EXPECT_TRUE(Answers(path));
        EXPECT_THAT(daemon->Log(), HasSubstr("Replaced the stale socket file [" + path + "]"));
        EXPECT_EQ(daemon->Stop(SIGTERM), 0);
    }

    std::ofstream(path) << "keep me";
    auto refused = StartDaemon(path);
    EXPECT_EQ(refused->WaitForExit(), 1);
    EXPECT_THAT(refused->Log(), HasSubstr("exists and is not a socket; not replacing it"));
    EXPECT_EQ(korvtest::ReadWholeFile(path), "keep me");
    unlink(path.c_str());
}

}  // namespace
