// korvsnmpcd --simulate: samples drawn from an appliance's average reply,
// on a clock that the test moves.
#include <syslog.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <fstream>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include "json_text.h"
#include "simulation.h"
#include "syslog_capture.h"

namespace {

using korvtest::Logged;
using ::testing::ElementsAre;

// Two disks, three interfaces with the same traffic, two volumes and their
// total, a LUN, NFS, CPU shares, and one counter that the file already has.
constexpr char kAppliance[] = R"({"data": {
  "System": [{"user": 12, "system": 5, "idle": 83}],
  "Memory": [{"total_real": 16777216, "avail_real": 9000000}],
  "Network": [{"device": "eth0", "rx": 123456, "tx": 654321}, {"device": "eth1", "rx": 123456, "tx": 654321},
              {"device": "eth2", "rx": 123456, "tx": 654321}],
  "DiskIO": [{"device": "sda", "utilization": 40, "read_access": 30, "read_byte": 40960, "write_access": 50,
              "write_byte": 81920, "read_byte_total": 5000},
             {"device": "sdb", "utilization": 90, "read_access": 3, "read_byte": 4096, "write_access": 5,
              "write_byte": 8192}],
  "SpaceIO": [{"device": "dm-0", "utilization": 20, "read_access": 300, "read_byte": 409600,
               "write_access": 500, "write_byte": 819200},
              {"device": "dm-1", "utilization": 60, "read_access": 30, "read_byte": 40960, "write_access": 50,
               "write_byte": 81920},
              {"device": "total", "utilization": 1, "read_access": 1, "read_byte": 1, "write_access": 1,
               "write_byte": 1}],
  "iSCSI": [{"device": "6001405f-0000-4000-8000-100000000000", "utilization": 10, "read_access": 90,
             "read_byte": 104857600, "write_access": 10, "write_byte": 10485760}],
  "NFS": {"calls": 30, "read_byte": 1048576, "write_byte": 524288},
  "time": 1795000000}})";

constexpr double kStart = 1800000000.25;

class SimulationTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        korvtest::ClearLog();
        Write(kAppliance);
    }
    void TearDown() override { std::remove(path_.c_str()); }

    void Write(const std::string &text)
    {
        std::ofstream(path_, std::ios::binary | std::ios::trunc) << text;
    }

    Json::Value Reply() { return korvtest::ParseJson(simulation_.Reply())["data"]; }

    // The next sample, `seconds` after the previous one.
    Json::Value Next(double seconds)
    {
        now_ += seconds;
        simulation_.Tick();
        return Reply();
    }

    const std::string path_ = "/tmp/korvsnmpcd-simulation-" + std::to_string(getpid()) + ".json";
    double now_ = kStart;
    korvsnmpcd::Simulation simulation_{path_, [this] { return now_; }};
};

TEST_F(SimulationTest, RefusesFilesWithoutAReply)
{
    const struct {
        const char *text;
        const char *message;
    } cases[] = {
        {"[1, 2]", "holds no reply with a \"data\" object: "},
        {"{\"data\": []}", "holds no reply with a \"data\" object: "},
        {"{\"data\": {}} {}", "holds no reply with a \"data\" object: * Line 1, Column 14\n"
                               "  Extra non-whitespace after JSON value.\n"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.text);
        korvtest::ClearLog();
        Write(c.text);
        EXPECT_FALSE(simulation_.Load());
        EXPECT_THAT(korvtest::LoggedMessages(),
                    ElementsAre(Logged(LOG_ERR, "simulation", "The appliance [" + path_ + "] " + c.message)));
    }
    std::remove(path_.c_str());
    korvtest::ClearLog();
    EXPECT_FALSE(simulation_.Load());
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, "simulation", "Cannot read the appliance [" + path_ + "]")));
}

TEST_F(SimulationTest, FirstSampleAlreadyHasRatesThatDifferBetweenDevices)
{
    ASSERT_TRUE(simulation_.Load());
    const Json::Value data = Reply();
    std::set<unsigned> rx;
    for (const Json::Value &interface : data["Network"])
        rx.insert(interface["rx"].asUInt());
    EXPECT_EQ(rx.size(), 3u);
    EXPECT_EQ(rx.count(0), 0u);
    EXPECT_EQ(data["time"].asUInt64(), 1800000000u);
    EXPECT_EQ(korvtest::JsonText(data["Memory"]), korvtest::Canonical(R"([{"total_real": 16777216, "avail_real": 9000000}])"));
    // A counter that the file has starts from its value.
    EXPECT_EQ(data["DiskIO"][0]["read_byte_total"].asUInt64(), 5000u);
}

TEST_F(SimulationTest, RatesMoveFromSampleToSample)
{
    ASSERT_TRUE(simulation_.Load());
    const Json::Value first = Reply();
    const Json::Value second = Next(1);
    const struct {
        const char *section;
        const char *rate;
    } rates[] = {{"Network", "rx"}, {"Network", "tx"}, {"DiskIO", "read_byte"}, {"DiskIO", "write_access"},
                 {"SpaceIO", "read_byte"}, {"iSCSI", "write_byte"}};
    for (const auto &r : rates)
        for (Json::ArrayIndex i = 0; i < first[r.section].size(); ++i)
            EXPECT_NE(first[r.section][i][r.rate].asUInt(), second[r.section][i][r.rate].asUInt())
                << r.section << "[" << i << "]." << r.rate;
    EXPECT_NE(first["NFS"]["calls"].asUInt(), second["NFS"]["calls"].asUInt());
    EXPECT_EQ(second["time"].asUInt64(), 1800000001u);
}

TEST_F(SimulationTest, CountersGrowByWhatTheRatesSay)
{
    constexpr double kInterval = 2.5;
    const struct {
        const char *section;
        const char *counter;
        const char *rate;
        double perRateSecond;  // what the counter grows by per unit of the rate and second
    } cases[] = {
        {"DiskIO", "read_access_total", "read_access", 1},
        {"DiskIO", "read_byte_total", "read_byte", 1},
        {"DiskIO", "write_access_total", "write_access", 1},
        {"DiskIO", "write_byte_total", "write_byte", 1},
        {"DiskIO", "busy_ms_total", "utilization", 10},
        {"SpaceIO", "write_byte_total", "write_byte", 1},
        {"SpaceIO", "busy_ms_total", "utilization", 10},
        {"Network", "rx_byte_total", "rx", 1},
        {"Network", "tx_byte_total", "tx", 1},
        {"Network", "tx_packet_total", "tx", 1.0 / 1200},
        {"Network", "rx_error_total", "rx", 0},
        {"iSCSI", "read_mbyte_total", "read_byte", 1.0 / 1048576},
        {"iSCSI", "write_mbyte_total", "write_byte", 1.0 / 1048576},
        {"System", "user_ticks_total", "user", 8},
        {"System", "idle_ticks_total", "idle", 8},
    };
    ASSERT_TRUE(simulation_.Load());
    const Json::Value before = Next(1);
    const Json::Value after = Next(kInterval);
    for (const auto &c : cases) {
        for (Json::ArrayIndex i = 0; i < before[c.section].size(); ++i) {
            SCOPED_TRACE(std::string(c.section) + "[" + std::to_string(i) + "]." + c.counter);
            const Json::Value &was = before[c.section][i];
            const Json::Value &is = after[c.section][i];
            if (is["device"] == "total")
                continue;  // the volumes' sums
            ASSERT_TRUE(is.isMember(c.counter));
            const double growth = static_cast<double>(is[c.counter].asUInt64() - was[c.counter].asUInt64());
            EXPECT_NEAR(growth, is[c.rate].asDouble() * c.perRateSecond * kInterval, 1.0);
        }
    }
    const double calls = static_cast<double>(after["NFS"]["calls_total"].asUInt64() -
                                             before["NFS"]["calls_total"].asUInt64());
    EXPECT_NEAR(calls, after["NFS"]["calls"].asDouble() * kInterval, 1.0);
    // SCSI commands: every read and write.
    const Json::Value &lun = after["iSCSI"][0];
    const double commands =
        static_cast<double>(lun["command_total"].asUInt64() - before["iSCSI"][0]["command_total"].asUInt64());
    EXPECT_NEAR(commands, (lun["read_access"].asDouble() + lun["write_access"].asDouble()) * kInterval, 1.0);
}

TEST_F(SimulationTest, SharesStayPercentagesAndAddUp)
{
    ASSERT_TRUE(simulation_.Load());
    for (int sample = 0; sample < 200; ++sample) {
        const Json::Value data = Next(7);
        const Json::Value &cpu = data["System"][0];
        EXPECT_EQ(cpu["user"].asUInt() + cpu["system"].asUInt() + cpu["idle"].asUInt(), 100u);
        for (const Json::Value &disk : data["DiskIO"])
            EXPECT_LE(disk["utilization"].asUInt(), 100u);
    }
}

TEST_F(SimulationTest, VolumeTotalSumsTheVolumes)
{
    ASSERT_TRUE(simulation_.Load());
    const Json::Value spaces = Next(1)["SpaceIO"];
    ASSERT_EQ(spaces.size(), 3u);
    const Json::Value &total = spaces[2];
    EXPECT_EQ(total["device"].asString(), "total");
    for (const char *member : {"read_access", "read_byte", "write_access", "write_byte"})
        EXPECT_EQ(total[member].asUInt(), spaces[0][member].asUInt() + spaces[1][member].asUInt()) << member;
    for (const char *member : {"read_byte_total", "busy_ms_total"})
        EXPECT_NEAR(static_cast<double>(total[member].asUInt64()),
                    static_cast<double>(spaces[0][member].asUInt64() + spaces[1][member].asUInt64()), 1.0)
            << member;
    EXPECT_NEAR(total["utilization"].asDouble(),
                (spaces[0]["utilization"].asDouble() + spaces[1]["utilization"].asDouble()) / 2, 0.5);
}

}  // namespace
