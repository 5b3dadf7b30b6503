// The reference collector: its parsers on fixed kernel texts, the rate
// rules, the replies, and the built daemon itself, run on a socket of its own
// and talked to over raw connections, hostile clients included.
#include <signal.h>
#include <sys/socket.h>
#include <syslog.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <memory>

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
using korvsnmpcd::Snapshot;
using korvtest::CollectorProcess;
using korvtest::Logged;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using Clock = std::chrono::steady_clock;

constexpr uint32_t kUint32Max = 4294967295u;

using korvsnmpcd::Counter;

std::vector<Counter> Fields(std::initializer_list<Counter> values) { return values; }

// ---------------------------------------------------------------- parsers

TEST(KorvsnmpcdParsers, CpuLineOfAllProcessors)
{
    korvsnmpcd::CpuTimes t;
    korvsnmpcd::CpuTimes untouched;
    untouched.user = 7;
    ASSERT_TRUE(korvsnmpcd::ParseCpuTimes("cpu  10 20 30 40 50 60 70 80 90 100\ncpu0 1 2 3 4 5\n", t));
    EXPECT_THAT(Fields({t.user, t.nice, t.system, t.idle, t.iowait, t.irq, t.softirq, t.steal}),
                ElementsAre(10, 20, 30, 40, 50, 60, 70, 80));
    ASSERT_TRUE(korvsnmpcd::ParseCpuTimes("cpu 1 2 3 4\n", t));  // an old kernel's four fields
    EXPECT_THAT(Fields({t.idle, t.iowait}), ElementsAre(4, std::nullopt));
    for (const char *bad : {"cpu0 1 2 3 4 5\n", "cpu 1 2 3\n", ""}) {
        EXPECT_FALSE(korvsnmpcd::ParseCpuTimes(bad, untouched)) << bad;
        EXPECT_EQ(untouched.user, 7u) << bad;
    }
}

// A field that is no unsigned 64-bit number leaves that one counter out and is noted.
TEST(KorvsnmpcdParsers, UnreadableCounterFieldsAreLeftOutAndNoted)
{
    korvsnmpcd::UnreadableFields unreadable;
    korvsnmpcd::CpuTimes t;
    ASSERT_TRUE(korvsnmpcd::ParseCpuTimes("cpu 1 -2 3 4 1.5 6 7 18446744073709551616\n", t, &unreadable));
    EXPECT_THAT(Fields({t.user, t.nice, t.system, t.idle, t.iowait, t.irq, t.softirq, t.steal}),
                ElementsAre(1, std::nullopt, 3, 4, std::nullopt, 6, 7, std::nullopt));
    EXPECT_EQ(unreadable.count, 3u);
    EXPECT_EQ(unreadable.first, "line [cpu] field 2 [-2]");

    unreadable = {};
    auto interfaces = korvsnmpcd::ParseNetDev("eth0: 1 2 x 4 5 6 7 8 9 10 11 +12\n", &unreadable);
    const korvsnmpcd::InterfaceCounters &eth0 = interfaces.at("eth0");
    EXPECT_THAT(Fields({eth0.rxBytes, eth0.rxPackets, eth0.rxErrors, eth0.rxDrops, eth0.txBytes,
                        eth0.txPackets, eth0.txErrors, eth0.txDrops}),
                ElementsAre(1, 2, std::nullopt, 4, 9, 10, 11, std::nullopt));
    EXPECT_EQ(unreadable.count, 2u);
    EXPECT_EQ(unreadable.first, "line [eth0] field 3 [x]");

    unreadable = {};
    auto devices = korvsnmpcd::ParseDiskStats("8 0 sda 1 0 99999999999999999999 0 4 0 8 0 0 ten 0\n", &unreadable);
    const BlockCounters &sda = devices.at("sda");
    EXPECT_THAT(Fields({sda.reads, sda.sectorsRead, sda.writes, sda.sectorsWritten, sda.ioTicksMs}),
                ElementsAre(1, std::nullopt, 4, 8, std::nullopt));
    EXPECT_EQ(unreadable.first, "line [sda] field 3 [99999999999999999999]");

    unreadable = {};
    auto nfs = korvsnmpcd::ParseNfsServer("io 5 -6\nrpc 7e3 0 0\n", &unreadable);
    EXPECT_THAT(Fields({nfs.readBytes, nfs.writtenBytes, nfs.rpcCalls}), ElementsAre(5, std::nullopt, std::nullopt));
    EXPECT_EQ(unreadable.count, 2u);

    const struct { const char *text; Counter value; } numbers[] = {
        {"18446744073709551615\n", 18446744073709551615ull}, {"0", 0}, {"", std::nullopt},
        {"12 13\n", std::nullopt}, {"-1\n", std::nullopt}, {"18446744073709551616\n", std::nullopt}};
    for (const auto &number : numbers)
        EXPECT_EQ(korvsnmpcd::ParseSingleNumber(number.text, "lun"), number.value) << number.text;
}

TEST(KorvsnmpcdParsers, MemoryInterfacesAndNfs)
{
    korvsnmpcd::MemoryInfo m;
    ASSERT_TRUE(korvsnmpcd::ParseMemoryInfo(
        "MemTotal: 24684096 kB\nMemFree: 24218396 kB\nMemAvailable: 24277032 kB\nBuffers: 1380 kB\n"
        "Cached: 261308 kB\nSwapCached: 9 kB\nSwapTotal: 2097148 kB\nSwapFree: 2097000 kB\n", m));
    EXPECT_THAT(Fields({m.totalKiB, m.freeKiB, m.availableKiB, m.buffersKiB, m.cachedKiB, m.swapTotalKiB,
                m.swapFreeKiB}), ElementsAre(24684096, 24218396, 24277032, 1380, 261308, 2097148, 2097000));
    EXPECT_FALSE(korvsnmpcd::ParseMemoryInfo("MemFree: 12 kB\n", m));

    auto interfaces = korvsnmpcd::ParseNetDev(
        "Inter-|   Receive |  Transmit\n face |bytes packets|bytes packets\n"
        "    lo:    3267      29    0    0    0     0          0         0     4268      29    "
        "0    0    0     0       0          0\n"
        "eth0:18446744073709551615 5 1 2 0 0 0 0 77 6 3 4 0 0 0 0\n  bad: 1 2 3 4 5 6 7 8 9 10 11\n");
    ASSERT_EQ(interfaces.size(), 2u);
    const korvsnmpcd::InterfaceCounters &eth0 = interfaces.at("eth0");
    EXPECT_THAT(Fields({eth0.rxBytes, eth0.rxPackets, eth0.rxErrors, eth0.rxDrops, eth0.txBytes,
                        eth0.txPackets, eth0.txErrors, eth0.txDrops}),
                ElementsAre(18446744073709551615ull, 5, 1, 2, 77, 6, 3, 4));
    EXPECT_THAT(Fields({interfaces.at("lo").rxBytes, interfaces.at("lo").txBytes}), ElementsAre(3267, 4268));

    auto nfs = korvsnmpcd::ParseNfsServer(
        "rc 0 12 34\nio 1000 2000\nth 8 0 0 0 0 0 0 0 0 0 0 0\nrpc 55 0 0 0 0\nproc3 22 0 1\n");
    EXPECT_THAT(Fields({nfs.readBytes, nfs.writtenBytes, nfs.rpcCalls}), ElementsAre(1000, 2000, 55));
}

TEST(KorvsnmpcdParsers, BlockDevicesOfEveryKernelLayoutAndMountSources)
{
    auto devices = korvsnmpcd::ParseDiskStats(  // 14 fields (older kernels), 18 (discards), 20 (flushes)
        "   8       0 sda 100 1 2000 3 400 4 8000 5 0 900 6\n"
        "   8       1 sda1 10 0 200 0 40 0 800 0 0 90 0 0 0 0 0\n"
        " 253       0 dm-0 7 0 70 0 8 0 80 0 0 700 0 0 0 0 0 0 0\n"
        "   8      16 short 1 2 3\n");
    ASSERT_EQ(devices.size(), 3u);
    const BlockCounters &sda = devices.at("sda");
    EXPECT_THAT(Fields({sda.major, sda.minor, sda.reads, sda.sectorsRead, sda.writes, sda.sectorsWritten,
                        sda.ioTicksMs}), ElementsAre(8, 0, 100, 2000, 400, 8000, 900));
    EXPECT_THAT(Fields({devices.at("sda1").minor, devices.at("dm-0").major, devices.at("dm-0").ioTicksMs}),
                ElementsAre(1, 253, 700));

    EXPECT_THAT(korvsnmpcd::ParseMountSources("/dev/sda1 / ext4 rw 0 0\nproc /proc proc rw 0 0\n"
                "/dev/disk/by-label/My\\040Disk /mnt/x vfat rw 0 0\n/dev/trailing\\04 /y ext4 rw 0 0\n"),
                ElementsAre("/dev/sda1", "proc", "/dev/disk/by-label/My Disk", "/dev/trailing\\04"));
}

// ---------------------------------------------------------------- rates

TEST(KorvsnmpcdRates, CounterRules)
{
    struct Case { uint64_t before, after, elapsedMs; uint32_t rate; } cases[] = {
        // Per second, over half a second; rounded to nearest; backwards: reset or wrapped;
        {100, 1100, 1000, 1000}, {100, 1100, 500, 2000}, {0, 2, 3000, 1}, {1100, 100, 1000, 0},
        // a 32-bit kernel counter wrapping; no time elapsed; clamped to 32 bits; no overflow on the way.
        {4294967290u, 5, 1000, 0}, {0, 10, 0, 0}, {0, 4294967296ull, 1000, kUint32Max},
        {0, 18446744073709551615ull, 1, kUint32Max}};
    for (const Case &c : cases)
        EXPECT_EQ(korvsnmpcd::CounterRate(c.before, c.after, c.elapsedMs), c.rate)
            << c.before << " -> " << c.after << " in " << c.elapsedMs << " ms";
    auto busy = [](uint64_t before, uint64_t after) { return korvsnmpcd::BusyPercent(before, after, 1000); };
    EXPECT_THAT(Fields({busy(1000, 1500), busy(1000, 3000), busy(3000, 1000)}), ElementsAre(50, 100, 0));
}

korvsnmpcd::CpuTimes Cpu(uint64_t user, uint64_t nice, uint64_t system, uint64_t idle)
{
    korvsnmpcd::CpuTimes times;
    times.user = user;
    times.nice = nice;
    times.system = system;
    times.idle = idle;
    return times;
}

korvsnmpcd::InterfaceCounters Traffic(uint64_t rxBytes, uint64_t txBytes)
{
    korvsnmpcd::InterfaceCounters counters;
    counters.rxBytes = rxBytes;
    counters.txBytes = txBytes;
    return counters;
}

TEST(KorvsnmpcdRates, CpuShares)
{
    // From `after` to `backwards` only idle moved: 200 - 125.
    korvsnmpcd::CpuTimes before = Cpu(100, 0, 100, 100);
    korvsnmpcd::CpuTimes after = Cpu(125, 0, 150, 125);
    korvsnmpcd::CpuTimes backwards = Cpu(0, 0, 0, 200);
    korvsnmpcd::CpuUsage u = korvsnmpcd::CpuPercentages(before, after);
    EXPECT_THAT(Fields({u.user, u.system, u.idle}), ElementsAre(25, 50, 25));
    u = korvsnmpcd::CpuPercentages(after, backwards);
    EXPECT_THAT(Fields({u.user, u.idle}), ElementsAre(0, 100));
    EXPECT_EQ(korvsnmpcd::CpuPercentages(after, after).idle, 100u);
}

BlockCounters Block(unsigned minor, uint64_t reads, uint64_t sectors, uint64_t ticks = 0) {
    return {8, minor, reads, sectors, reads * 2, sectors * 2, ticks}; }

TEST(KorvsnmpcdRates, DevicesComingAndGoingGiveNoSpike)
{
    Snapshot before;
    Snapshot after;
    before.monotonicMs = 10000;
    after.monotonicMs = 12000;
    before.blocks = {{"sda", Block(0, 10, 100)}, {"sdb", Block(16, 5, 5)}, {"sdc", Block(32, 9, 9)}};
    before.interfaces = {{"eth0", Traffic(1000, 2000)}, {"eth1", Traffic(1, 1)}};
    // sda steady, sdc replaced by another device, sdd new.
    after.blocks = {{"sda", Block(0, 30, 300, 1000)}, {"sdc", Block(48, 999999, 999999)},
                    {"sdd", Block(64, 500000, 500000)}};
    after.disks = {"sda", "sdc", "sdd"};
    after.mounted = {"sda", "sdd", "sdx"};  // sdx has no counters
    after.interfaces = {{"eth0", Traffic(3000, 2000)}, {"ppp0", Traffic(123456789, 1)}};

    korvsnmpcd::Rates rates = korvsnmpcd::ComputeRates(before, after);
    ASSERT_EQ(rates.disks.size(), 3u);
    for (const char *disk : {"sda", "sdc", "sdd"}) {
        const korvsnmpcd::BlockRates &r = rates.disks.at(disk);
        std::vector<Counter> steady = {10, 100 * 512, 20, 200 * 512, 50};
        EXPECT_EQ(Fields({r.readAccess, r.readByte, r.writeAccess, r.writeByte, r.utilization}),
                  disk == std::string("sda") ? steady : std::vector<Counter>(5, 0)) << disk;
    }
    ASSERT_EQ(rates.spaces.size(), 2u);  // sda and sdd
    // The utilization is the mean of 50 and 0.
    EXPECT_THAT(Fields({rates.spaceTotal.readByte, rates.spaceTotal.utilization}), ElementsAre(51200, 25));
    EXPECT_THAT(Fields({rates.interfaces.at("eth0").rx, rates.interfaces.at("eth0").tx,
                        rates.interfaces.at("ppp0").rx, rates.interfaces.count("eth1")}),
                ElementsAre(1000, 0, 0, 0));

    before.blocks = {{"sda", Block(0, 0, 0)}, {"sdb", Block(16, 0, 0)}};  // totals clamp, not wrap
    before.monotonicMs = after.monotonicMs - 1000;
    after.mounted = {"sda", "sdb"};
    after.blocks = {{"sda", Block(0, 3000000000u, 0)}, {"sdb", Block(16, 3000000000u, 0)}};
    rates = korvsnmpcd::ComputeRates(before, after);
    EXPECT_THAT(Fields({rates.spaces.at("sda").writeAccess, rates.spaceTotal.readAccess}),
                ElementsAre(kUint32Max, kUint32Max));
}

// ---------------------------------------------------------------- replies

TEST(KorvsnmpcdReply, StatisticsSections)
{
    korvsnmpcd::Rates rates;
    rates.interfaces["eth0"] = {7, 8};
    rates.disks["sda"] = {1, 2, 3, 4, 5};
    rates.spaces["sda1"] = {6, 7, 8, 9, 10};
    rates.spaceTotal = {6, 7, 8, 9, 10};
    Snapshot sample;  // without counters: a reply without counter members
    sample.memory.totalKiB = 8000000000ull;  // beyond 32 bits: clamped
    sample.epochSeconds = 1700000000;

    const Json::Value data = korvsnmpcd::StatisticsReply(rates, sample)["data"];
    EXPECT_EQ(data["Memory"][0]["total_real"].asUInt(), kUint32Max);
    EXPECT_EQ(korvtest::JsonText(data["Network"]), "[{\"device\":\"eth0\",\"rx\":7,\"tx\":8}]");
    EXPECT_EQ(korvtest::JsonText(data["DiskIO"]),
              "[{\"device\":\"sda\",\"read_access\":2,\"read_byte\":3,\"utilization\":1,"
              "\"write_access\":4,\"write_byte\":5}]");
    EXPECT_EQ(korvtest::JsonText(data["SpaceIO"]),
              "[{\"device\":\"sda1\",\"read_access\":7,\"read_byte\":8,\"utilization\":6,\"write_access\":9,"
              "\"write_byte\":10},{\"device\":\"total\",\"read_access\":7,\"read_byte\":8,\"utilization\":6,"
              "\"write_access\":9,\"write_byte\":10}]");
    EXPECT_EQ(korvtest::JsonText(data["iSCSI"]), "[]");
    EXPECT_EQ(data["time"].asInt64(), 1700000000);
}

TEST(KorvsnmpcdAnswer, RequestKindsRepliesAndLog)
{
    using korvsnmpcd::RequestKind;
    korvtest::ClearLog();
    const struct { std::string body; RequestKind kind; } cases[] = {
        {std::string("{\"request\":\"reload\"}\n\0", 22), RequestKind::kControl},
        {"{\"reason\":\"disk swap\",\"request\":\"history_mode\"}\n", RequestKind::kControl},
        {"{\"resource\":[\"all\"]}\n", RequestKind::kStatistics}, {"{}", RequestKind::kStatistics},
        {"{\"request\":\"other\"}", RequestKind::kStatistics}, {"{\"request\":7}", RequestKind::kStatistics},
        {"garbage", RequestKind::kNotAnObject}, {"[1,2]", RequestKind::kNotAnObject}, {"7", RequestKind::kNotAnObject},
        {"", RequestKind::kNotAnObject}, {"{\"a\":", RequestKind::kNotAnObject},
        {std::string(100000, '['), RequestKind::kNotAnObject}};
    for (const auto &c : cases)
        EXPECT_EQ(korvsnmpcd::ReadRequest(c.body), c.kind) << c.body.substr(0, 20);
    // Only the control requests log; the server counts refusals.
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(Logged(LOG_NOTICE, "reply", "Reload requested; nothing to reload, sampling goes on"),
                            Logged(LOG_NOTICE, "reply", "History mode requested, reason: [disk swap]")));
    EXPECT_EQ(korvsnmpcd::ControlReply(RequestKind::kControl), "{\"success\":true}");
    EXPECT_EQ(korvsnmpcd::ControlReply(RequestKind::kNotAnObject),
              "{\"error\":\"the request is not a JSON object\",\"success\":false}");
}

// ---------------------------------------------------------------- the daemon

constexpr auto kPrompt = std::chrono::milliseconds(400);  // well within the client timeout

// The daemon's reply on `path` to the request `json`.
std::string Ask(const std::string &path, const char *json) {
    return korvtest::ExchangeWith(path, korvproto::EncodeRequestFrame(korvtest::ParseJson(json))); }
std::string Statistics(const std::string &path) { return Ask(path, R"({"resource": ["all"]})"); }
bool Answers(const std::string &path) {
    return korvtest::ParseJson(Statistics(path))["data"]["Memory"].isArray(); }
std::string TestSocketPath(const char *tag) {
    return "/tmp/korvsnmpcd-test-" + std::to_string(getpid()) + "-" + tag + ".sock"; }

// The built daemon on socket `path`; its output goes to a file of its own, `path` + `logTag` + ".log".
std::unique_ptr<CollectorProcess> StartDaemon(const std::string &path, const char *tag = "") {
    return std::make_unique<CollectorProcess>(KORVSNMPCD_PATH, std::vector<std::string>{"--foreground",
        "--socket", path, "--interval", "0.05", "--client-timeout", "0.6"}, path + tag + ".log"); }

class KorvsnmpcdDaemon : public ::testing::Test {
protected:
    // The daemon (a member) is started before SetUp runs: removing its path
    // here would race with its bind. It replaces a stale socket file itself.
    void SetUp() override { ASSERT_TRUE(korvtest::WaitUntilConnectable(path_)) << daemon_->Log(); }
    void TearDown() override {
        EXPECT_TRUE(Answers(path_)) << "the daemon no longer answers";
        EXPECT_EQ(daemon_->Stop(SIGTERM), 0) << daemon_->Log();
        EXPECT_NE(access(path_.c_str(), F_OK), 0) << "socket file left behind";
    }

    const std::string path_ = TestSocketPath("main");
    std::unique_ptr<korvtest::CollectorProcess> daemon_ = StartDaemon(path_);
};

TEST_F(KorvsnmpcdDaemon, StatisticsReplyOfThisHost)
{
    const Json::Value data = korvtest::ParseJson(Statistics(path_))["data"];
    ASSERT_TRUE(data.isObject()) << data;
    korvsnmpcd::MemoryInfo memory;
    ASSERT_TRUE(korvsnmpcd::ParseMemoryInfo(korvtest::ReadWholeFile("/proc/meminfo"), memory));
    EXPECT_EQ(data["Memory"][0]["total_real"].asUInt(), memory.totalKiB);
    EXPECT_EQ(data["System"].size(), 1u);
    EXPECT_THAT(korvtest::JsonText(data["Network"]), HasSubstr("{\"device\":\"lo\",\"rx\":"));
    EXPECT_EQ(data["SpaceIO"][data["SpaceIO"].size() - 1]["device"], "total");
    EXPECT_TRUE(data["iSCSI"].isArray() && data.isMember("NFS")) << data;
    const auto now = std::chrono::system_clock::now().time_since_epoch();
    EXPECT_NEAR(data["time"].asDouble(), std::chrono::duration<double>(now).count(), 5);
}

TEST_F(KorvsnmpcdDaemon, GarbageIsRefusedOrDroppedAndLeavesNothingOpen)
{
    EXPECT_EQ(Ask(path_, R"({"request": "history_mode", "reason": "nightly backup"})"), "{\"success\":true}");
    EXPECT_THAT(daemon_->Log(), HasSubstr("History mode requested, reason: [nightly backup]"));
    const std::string garbage = korvproto::EncodeFramePrefix(8) + "garbage!";
    EXPECT_EQ(korvtest::ParseJson(korvtest::ExchangeWith(path_, garbage))["success"], false);

    const size_t descriptors = korvtest::OpenDescriptorCount(daemon_->Pid());
    // Text without a frame (claims 0x47455420 bytes), an oversize length claim, a zero length.
    for (const std::string &bytes : {std::string("GET / HTTP/1.0\r\n\r\n"),
                                     korvproto::EncodeFramePrefix(0xffffffffu) + "{}", korvproto::EncodeFramePrefix(0)}) {
        Clock::time_point start = Clock::now();
        EXPECT_EQ(korvtest::ExchangeWith(path_, bytes), "") << bytes.size();
        EXPECT_LT(Clock::now() - start, kPrompt) << bytes.size() << " bytes: not closed at once";
    }
    // Clients that leave without waiting for their reply, a whole request sent or half of one.
    const std::string frame = korvproto::EncodeRequestFrame(Json::Value(Json::objectValue));
    for (int i = 0; i < 300; ++i) {
        korvproto::UniqueFd fd = korvtest::ConnectTo(path_);
        ASSERT_TRUE(fd.Valid()) << "connection " << i;
        send(fd.Get(), frame.data(), i % 2 == 0 ? frame.size() : 6, MSG_NOSIGNAL);
    }
    EXPECT_TRUE(Answers(path_));
    // The daemon closes the last of them as it notices that their clients left.
    EXPECT_TRUE(korvtest::Eventually(
        [&] { return korvtest::OpenDescriptorCount(daemon_->Pid()) == descriptors; }))
        << korvtest::OpenDescriptorCount(daemon_->Pid()) << " open, not " << descriptors;
}

TEST(KorvsnmpcdLifecycle, SecondDaemonRefusedStaleSocketReplacedOtherFileKept)
{
    const std::string path = TestSocketPath("life");
    unlink(path.c_str());
    auto first = StartDaemon(path);
    ASSERT_TRUE(korvtest::WaitUntilConnectable(path)) << first->Log();
    // A log of its own: the first daemon may still be writing to its log.
    auto second = StartDaemon(path, "-second");
    EXPECT_EQ(second->WaitForExit(), 1) << second->Log();
    EXPECT_THAT(second->Log(), HasSubstr("Another collector already answers on [" + path + "]; not starting"));
    EXPECT_TRUE(Answers(path)) << first->Log();
    EXPECT_EQ(first->Stop(SIGKILL), 128 + SIGKILL);  // leaves a stale socket file behind

    auto daemon = StartDaemon(path);
    ASSERT_TRUE(korvtest::WaitUntilConnectable(path)) << daemon->Log();
    EXPECT_TRUE(Answers(path));
    EXPECT_THAT(daemon->Log(), HasSubstr("Replaced the stale socket file [" + path + "]"));
    EXPECT_EQ(daemon->Stop(SIGINT), 0);
    EXPECT_NE(access(path.c_str(), F_OK), 0);

    std::ofstream(path) << "keep me";
    auto refused = StartDaemon(path);
    EXPECT_EQ(refused->WaitForExit(), 1);
    EXPECT_THAT(refused->Log(), HasSubstr("[" + path + "] exists and is not a socket; not replacing it"));
    EXPECT_EQ(korvtest::ReadWholeFile(path), "keep me");
    unlink(path.c_str());
}

}  // namespace
