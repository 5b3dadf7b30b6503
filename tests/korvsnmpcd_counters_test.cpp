// korvsnmpcd's cumulative counters, read from a host made of files: each
// reply member equals the kernel field behind it, 64 bits wide, whatever the
// counter did (grew past 2^32, went back); the rates beside them stay those
// of the interval; an unreadable field leaves its one counter out.
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/reader.h>
#include <json/writer.h>  // prints a Json::Value in a failure

#include "catalogue/statistics_catalogue.h"
#include "collector_process.h"
#include "fixture_host.h"
#include "korv_standin.h"
#include "korvsnmp/parse_data.h"
#include "platform_test.h"
#include "protocol/lio_target.h"
#include "sampler.h"
#include "syslog_capture.h"

namespace {

using korvcatalogue::Kind;
using korvcatalogue::Section;
using korvtest::FixtureHost;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

constexpr char kLun[] = "6001405a-1c2d-4e5f-8a9b-0c1d2e3f4a5b";
constexpr uint64_t kTwoTo32 = uint64_t{1} << 32;
constexpr uint64_t kIntervalMs = 2000;

// The record of `device` in a section's array, or null.
Json::Value Device(const Json::Value &section, const std::string &device)
{
    for (const Json::Value &record : section)
        if (record["device"] == device)
            return record;
    return Json::Value();
}

// One reply member and the value it must have.
struct Expected {
    std::string where;  // section and device, for messages
    Json::Value record;
    std::string member;
    uint64_t value;
};

// Every counter of `host` as the reply must carry it, with its kernel field.
std::vector<Expected> ExpectedCounters(const Json::Value &data, const FixtureHost &host)
{
    const Json::Value cpu = data["System"][0];
    const Json::Value eth0 = Device(data["Network"], "eth0");
    const Json::Value sda = Device(data["DiskIO"], "sda");
    const Json::Value sdb = Device(data["DiskIO"], "sdb");
    const Json::Value lun = Device(data["iSCSI"], kLun);
    const korvtest::FixtureInterface &e = host.interfaces.at("eth0");
    const korvtest::FixtureBlock &a = host.blocks.at("sda");
    const korvtest::FixtureBlock &b = host.blocks.at("sdb");
    const korvtest::FixtureLun &l = host.luns.at(kLun);
    return {
        {"cpu", cpu, "user_ticks_total", host.cpu[0]},     {"cpu", cpu, "nice_ticks_total", host.cpu[1]},
        {"cpu", cpu, "system_ticks_total", host.cpu[2]},   {"cpu", cpu, "idle_ticks_total", host.cpu[3]},
        {"cpu", cpu, "iowait_ticks_total", host.cpu[4]},   {"cpu", cpu, "irq_ticks_total", host.cpu[5]},
        {"cpu", cpu, "softirq_ticks_total", host.cpu[6]},  {"cpu", cpu, "steal_ticks_total", host.cpu[7]},
        {"eth0", eth0, "rx_byte_total", e.rx[0]},          {"eth0", eth0, "rx_packet_total", e.rx[1]},
        {"eth0", eth0, "rx_error_total", e.rx[2]},         {"eth0", eth0, "rx_drop_total", e.rx[3]},
        {"eth0", eth0, "tx_byte_total", e.tx[0]},          {"eth0", eth0, "tx_packet_total", e.tx[1]},
        {"eth0", eth0, "tx_error_total", e.tx[2]},         {"eth0", eth0, "tx_drop_total", e.tx[3]},
        {"sda", sda, "read_access_total", a.reads},        {"sda", sda, "read_byte_total", a.sectorsRead * 512},
        {"sda", sda, "write_access_total", a.writes},      {"sda", sda, "write_byte_total", a.sectorsWritten * 512},
        {"sda", sda, "busy_ms_total", a.ioTicksMs},        {"sdb", sdb, "read_access_total", b.reads},
        {"lun", lun, "command_total", l.commands},         {"lun", lun, "read_mbyte_total", l.readMbytes},
        {"lun", lun, "write_mbyte_total", l.writeMbytes},  {"nfs", data["NFS"], "calls_total", host.nfs.calls},
        {"nfs", data["NFS"], "read_byte_total", host.nfs.readBytes},
        {"nfs", data["NFS"], "write_byte_total", host.nfs.writtenBytes},
    };
}

::testing::AssertionResult Carries(const Expected &expected)
{
    const Json::Value &value = expected.record[expected.member];
    if (value.isUInt64() && value.asUInt64() == expected.value)
        return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << expected.where << " " << expected.member << " is " << value
                                         << ", not " << expected.value;
}

bool CarriesAll(const Json::Value &data, const FixtureHost &host)
{
    for (const Expected &expected : ExpectedCounters(data, host))
        if (!Carries(expected))
            return false;
    return true;
}

// Between two samples: eth0's received bytes pass 2^32, sdb was reset (its
// reads go back), the others grow by known amounts.
void Advance(FixtureHost &host)
{
    host.interfaces.at("eth0").rx[0] += 5000;
    host.interfaces.at("eth0").rx[1] += 4;
    host.blocks.at("sda").sectorsRead += 4000;
    host.blocks.at("sda").ioTicksMs += 500;
    host.blocks.at("sdb").reads = 10;
    host.cpu[0] += 150;
    host.cpu[3] += 50;
    host.luns.at(kLun).readMbytes += 3;
    host.luns.at(kLun).commands += 7;
    host.nfs.calls += 100;
    host.nfs.readBytes += 2000000;
    host.Write();
}

Json::Value Parse(const std::string &text)
{
    Json::Value value;
    EXPECT_TRUE(Json::Reader().parse(text, value)) << text;
    return value;
}

// A sampler on the fixture's files whose clock the test moves.
struct SamplerOnFixture {
    explicit SamplerOnFixture(FixtureHost &fixture) : host(fixture) {}
    Json::Value Sample()
    {
        now.monotonicMs += kIntervalMs;
        sampler.Sample();
        return Parse(sampler.StatisticsReply())["data"];
    }

    FixtureHost &host;
    korvsnmpcd::SampleTime now{100000, 1700000000};
    korvsnmpcd::Sampler sampler{korvsnmpcd::SourcePathsUnder(host.ProcRoot(), host.SysRoot()), [this] { return now; }};
};

TEST(KorvsnmpcdCounters, EachCounterIsItsKernelFieldAndTheRatesStayThoseOfTheInterval)
{
    FixtureHost host;
    const bool root = geteuid() == 0;  // mounting makes a device node
    if (root) {
        ASSERT_TRUE(host.Mount("sda1"));
    }
    SamplerOnFixture on(host);
    ASSERT_EQ(host.interfaces.at("eth0").rx[0], kTwoTo32 - 1000);
    Advance(host);
    const Json::Value data = on.Sample();
    ASSERT_EQ(host.interfaces.at("eth0").rx[0], kTwoTo32 + 4000);
    for (const Expected &expected : ExpectedCounters(data, host))
        EXPECT_TRUE(Carries(expected));

    // Each counter record carries every counter of its section; the collector's own total none.
    const struct { Section section; Json::Value record; } sections[] = {
        {Section::Cpu, data["System"][0]},          {Section::Interface, Device(data["Network"], "lo")},
        {Section::Disk, Device(data["DiskIO"], "sdb")}, {Section::Lun, Device(data["iSCSI"], kLun)},
        {Section::Nfs, data["NFS"]}};
    for (const auto &s : sections)
        for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(s.section)) {
            if (statistic->kind == Kind::Counter) {
                EXPECT_TRUE(s.record.isMember(statistic->member)) << statistic->member << " in " << s.record;
            }
        }
    const Json::Value total = Device(data["SpaceIO"], "total");
    for (const korvcatalogue::Statistic *statistic : korvcatalogue::StatisticsOf(Section::Volume)) {
        if (statistic->kind == Kind::Counter) {
            EXPECT_FALSE(total.isMember(statistic->member)) << total;
        }
    }
    if (root) {
        EXPECT_EQ(Device(data["SpaceIO"], "sda1")["read_byte_total"].asUInt64(), 800u * 512) << data["SpaceIO"];
    }

    // Over the 2 s: 5000 bytes, 4000 sectors, 500 of 2000 ms busy, 150 of 200 ticks, 3 MiB, 100 calls.
    const Json::Value eth0 = Device(data["Network"], "eth0");
    const Json::Value sda = Device(data["DiskIO"], "sda");
    const Json::Value sdb = Device(data["DiskIO"], "sdb");
    const Json::Value lun = Device(data["iSCSI"], kLun);
    const struct { const char *where; Json::Value value; uint64_t rate; } rates[] = {
        {"eth0 rx", eth0["rx"], 2500},
        {"eth0 tx", eth0["tx"], 0},
        {"sda read_byte", sda["read_byte"], 1024000},
        {"sda utilization", sda["utilization"], 25},
        {"sdb read_access (went back)", sdb["read_access"], 0},
        {"cpu user", data["System"][0]["user"], 75},
        {"cpu idle", data["System"][0]["idle"], 25},
        {"lun read_byte", lun["read_byte"], 1572864},
        {"lun write_byte", lun["write_byte"], 0},
        {"nfs calls", data["NFS"]["calls"], 50},
        {"nfs read_byte", data["NFS"]["read_byte"], 1000000},
    };
    for (const auto &r : rates)
        EXPECT_EQ(r.value.asUInt64(), r.rate) << r.where;
    // LIO counts no busy time and no reads and writes apart.
    EXPECT_FALSE(lun.isMember("utilization") || lun.isMember("read_access")) << lun;
}

TEST(KorvsnmpcdCounters, LunsComeAndGoWithTheTargetsDevices)
{
    FixtureHost host;
    host.luns.clear();
    host.Write();
    SamplerOnFixture on(host);
    EXPECT_EQ(on.Sample()["iSCSI"], Json::Value(Json::arrayValue));

    // A device without a unit serial is no LUN; a second HBA's device is.
    host.luns["second-uuid"] = {"fileio_1", "lun_b", 1, 2, 3};
    host.Write();
    std::filesystem::create_directories(host.SysRoot() + "/" + korvproto::kLioCoreDirectory + "/fileio_1/no_serial/wwn");
    const Json::Value luns = on.Sample()["iSCSI"];
    ASSERT_EQ(luns.size(), 1u) << luns;
    EXPECT_EQ(luns[0]["device"], "second-uuid");
    EXPECT_EQ(luns[0]["write_mbyte_total"].asUInt64(), 3u);
    EXPECT_EQ(luns[0]["write_byte"].asUInt64(), 0u);  // new: no rate yet

    host.luns.clear();
    host.Write();
    EXPECT_EQ(on.Sample()["iSCSI"], Json::Value(Json::arrayValue));
}

TEST(KorvsnmpcdCounters, AnUnreadableFieldLeavesItsCounterOutLoggedOnce)
{
    FixtureHost host;
    SamplerOnFixture on(host);
    host.WriteFile("proc/net/dev", "Inter-|\n face |\n"
                   "  eth0: x 2 -3 4 0 0 0 0 18446744073709551616 6 7 8 0 0 0 0\n"
                   "  eth1: 10 1 0 0 0 0 0 0 20 2 0 0 0 0 0 0\n");
    host.WriteFile("sys/" + std::string(korvproto::kLioCoreDirectory) + "/iblock_0/lun_a/" +
                       korvproto::kLioCommandsFile, "1.5\n");
    korvtest::ClearLog();
    Json::Value data = on.Sample();
    const Json::Value eth0 = Device(data["Network"], "eth0");
    for (const char *absent : {"rx_byte_total", "rx_error_total", "tx_byte_total"})
        EXPECT_FALSE(eth0.isMember(absent)) << absent << " in " << eth0;
    EXPECT_EQ(eth0["rx_packet_total"].asUInt64(), 2u);
    EXPECT_EQ(eth0["tx_drop_total"].asUInt64(), 8u);
    EXPECT_EQ(eth0["rx"].asUInt64(), 0u);
    EXPECT_FALSE(Device(data["iSCSI"], kLun).isMember("command_total"));
    EXPECT_EQ(Device(data["iSCSI"], kLun)["read_mbyte_total"].asUInt64(), 678u);
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(korvtest::Logged(LOG_WARNING, "sampler",
                                             "Left 4 unreadable counter fields out of the sample, the first: " +
                                                 host.ProcRoot() + "/net/dev line [eth0] field 1 [x]")));

    // The same fault again is not logged again; its end is.
    korvtest::ClearLog();
    on.Sample();
    EXPECT_THAT(korvtest::LoggedMessages(), IsEmpty());
    host.Write();
    data = on.Sample();
    EXPECT_EQ(Device(data["Network"], "eth0")["rx_byte_total"].asUInt64(), kTwoTo32 - 1000);
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(korvtest::Logged(LOG_NOTICE, "sampler", "Every counter field is readable again")));
}

// The built daemon on the fixture's files, sampling every 10 ms: the test
// waits for the sample that shows the files' new state. The library names
// its records after the fixture's description of the host.
TEST(KorvsnmpcdCounters, DaemonReportsTheFixtureCountersExactlyThroughTheLibrary)
{
    FixtureHost host;
    const std::string volume = host.MountKernelDevice();
    const std::string socket = host.Root() + "/korvsnmpcd.sock";
    std::vector<std::string> args = {"--foreground", "--socket", socket, "--interval", "0.01"};
    for (const std::string &arg : host.CollectorArguments())
        args.push_back(arg);
    korvtest::CollectorProcess daemon(KORVSNMPCD_PATH, args, host.Root() + "/korvsnmpcd.log");
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << daemon.Log();
    const auto showsHost = [&host](const Json::Value &data) { return CarriesAll(data, host); };
    ASSERT_FALSE(korvtest::CollectorDataWhen(socket, showsHost).isNull()) << daemon.Log();

    Advance(host);
    const Json::Value data = korvtest::CollectorDataWhen(socket, showsHost);
    ASSERT_FALSE(data.isNull()) << daemon.Log();
    EXPECT_EQ(Device(data["Network"], "eth0")["rx_byte_total"].asUInt64(), kTwoTo32 + 4000);
    EXPECT_EQ(Device(data["DiskIO"], "sdb")["read_access_total"].asUInt64(), 10u);
    EXPECT_EQ(daemon.Stop(SIGTERM), 0) << daemon.Log();

    korvtest::FreshPlatform();
    korvstandin::Host() = host.Description();
    Json::Value reply(Json::objectValue);
    reply["data"] = data;
    Json::Value result;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue), reply, result))
        << ::testing::PrintToString(korvtest::LoggedMessages());
    EXPECT_EQ(result["disk"]["disk"][1]["display_name"], "Disk 2");
    EXPECT_EQ(result["disk"]["disk"][1]["read_access_total"].asUInt64(), 10u);
    EXPECT_EQ(result["network"][1]["rx_byte_total"].asUInt64(), kTwoTo32 + 4000);
    EXPECT_EQ(result["lun"][0]["lun_name"], "lun_a");
    EXPECT_EQ(result["lun"][0]["read_mbyte_total"].asUInt64(), 681u);
    EXPECT_EQ(result["cpu"]["user_ticks_total"].asUInt64(), 1150u);
    if (!volume.empty()) {
        EXPECT_EQ(result["space"]["volume"][0]["display_name"], "volume_" + volume);
        EXPECT_EQ(result["space"]["volume"][0]["write_byte_total"].asUInt64(), 7777u * 512);
    }
    EXPECT_EQ(korvstandin::OutstandingAllocations(), 0);
}

}  // namespace
