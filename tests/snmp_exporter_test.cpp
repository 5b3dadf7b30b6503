// The shipped snmp_exporter module at work: Debian's prometheus-snmp-exporter
// with tools/snmp_exporter/snmp.yml scrapes a private snmpd whose AgentX
// subagent (korvsnmp-agentx) serves the large appliance that korvsnmpcd
// replays. Each disk's series carry its names as labels, with the values
// that the library gives for the same files; counters stay counters and
// rates gauges.
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <map>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include "catalogue/statistics_catalogue.h"
#include "collector_process.h"
#include "host_file.h"
#include "json_text.h"
#include "korv_standin.h"
#include "korvsnmp/korvsnmp.h"
#include "platform_test.h"
#include "private_snmpd.h"
#include "protocol/unique_fd.h"
#include "test_collector.h"

namespace {

using ::testing::HasSubstr;

constexpr char kHostFile[] = KORVSNMP_EXAMPLES_DIR "/large-appliance.host.json";
constexpr char kReplyFile[] = KORVSNMP_EXAMPLES_DIR "/large-appliance.reply.json";
constexpr char kExporter[] = "/usr/bin/prometheus-snmp-exporter";
constexpr char kModule[] = "korvsnmp";
constexpr std::chrono::seconds kScrapeBound{120};  // a walk through AgentX, sanitizer build included

// The body of an HTTP/1.0 GET of `path` from 127.0.0.1:`port`, or "" when
// there is no answer within kScrapeBound or its status is not 200.
std::string HttpGet(uint16_t port, const std::string &path)
{
    korvproto::UniqueFd fd(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address{AF_INET, htons(port), {htonl(INADDR_LOOPBACK)}, {}};
    if (connect(fd.Get(), reinterpret_cast<sockaddr *>(&address), sizeof address) != 0)
        return "";
    const std::string request = "GET " + path + " HTTP/1.0\r\nHost: 127.0.0.1\r\n\r\n";
    if (send(fd.Get(), request.data(), request.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(request.size()))
        return "";
    std::string response;
    char buffer[65536];
    const auto end = std::chrono::steady_clock::now() + kScrapeBound;
    for (pollfd readable{fd.Get(), POLLIN, 0}; std::chrono::steady_clock::now() < end;) {
        if (poll(&readable, 1, 100) <= 0)
            continue;
        const ssize_t got = read(fd.Get(), buffer, sizeof buffer);
        if (got <= 0)
            break;
        response.append(buffer, static_cast<size_t>(got));
    }
    const size_t body = response.find("\r\n\r\n");
    if (response.rfind("HTTP/1.0 200", 0) != 0 && response.rfind("HTTP/1.1 200", 0) != 0)
        return "";
    return body == std::string::npos ? "" : response.substr(body + 4);
}

// "name{labels} value" lines of `text` by name and labels, and its "# TYPE" lines by family.
struct Exposition {
    std::map<std::string, std::string> samples;  // "name{labels}" -> value
    std::map<std::string, std::string> types;

    explicit Exposition(const std::string &text)
    {
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) {
            if (line.rfind("# TYPE ", 0) == 0) {
                const size_t space = line.find(' ', 7);
                types[line.substr(7, space - 7)] = line.substr(space + 1);
            } else if (!line.empty() && line[0] != '#') {
                const size_t space = line.rfind(' ');
                samples[line.substr(0, space)] = line.substr(space + 1);
            }
        }
    }

    // The value of the one sample of `name` whose labels hold `label`, or "" (none, or several).
    std::string ValueOf(const std::string &name, const std::string &label) const
    {
        std::string value;
        int found = 0;
        for (const auto &[series, sampleValue] : samples)
            if (series.rfind(name + "{", 0) == 0 && series.find(label) != std::string::npos) {
                value = sampleValue;
                ++found;
            }
        return found == 1 ? value : "";
    }
};

// The record of `records` whose `member` is `name`, or nullptr.
const Json::Value *Named(const Json::Value &records, const char *member, const std::string &name)
{
    for (const Json::Value &record : records)
        if (record[member] == name)
            return &record;
    return nullptr;
}

using SnmpExporter = korvtest::PlatformTest;

TEST_F(SnmpExporter, TheShippedModuleLabelsEachDiskWithItsNamesAndKeepsCountersCounters)
{
    ASSERT_EQ(access(kExporter, X_OK), 0) << "prometheus-snmp-exporter is not installed";
    setenv(korvstandin::kHostFileVariable, kHostFile, 1);
    korvstandin::UseProcessHost();
    Json::Value result;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue),
                                   korvtest::ParseJson(korvtest::ReadWholeFile(kReplyFile)), result));
    const Json::Value *disk1 = Named(result["disk"]["disk"], "display_name", "Disk 1");
    const Json::Value *lun1 = Named(result["lun"], "lun_name", "LUN-1");
    ASSERT_NE(disk1, nullptr);
    ASSERT_NE(lun1, nullptr);

    const std::string &socket = korvtest::PrivateCollectorPath();
    const std::string directory = socket.substr(0, socket.rfind('/'));
    korvtest::CollectorProcess collector(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay", kReplyFile},
                                         socket + ".log");
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << collector.Log();
    korvtest::PrivateSnmpd snmpd(directory);
    ASSERT_TRUE(snmpd.Start()) << "snmpd did not start: " << snmpd.Log();
    korvtest::CollectorProcess subagent("/usr/bin/env",
                                        snmpd.SubagentCommand(KORVSNMP_AGENTX_PATH, kHostFile, {"--interval", "3600"}),
                                        directory + "/agentx.out");
    const std::string sampleTime = "korvSampleTime.0 = " + result["time"].asString() + "\n";
    ASSERT_TRUE(korvtest::PollUntil([&] {
        return snmpd.Client(KORVSNMP_MIB_DIRS, "snmpget", "korvSampleTime.0") == sampleTime;
    })) << subagent.Log();

    const uint16_t port = korvtest::FreeTcpPort();
    korvtest::CollectorProcess exporter(kExporter, {"--config.file=" KORVSNMP_SNMP_EXPORTER_CONFIG,
                                                    "--web.listen-address=127.0.0.1:" + std::to_string(port)},
                                        directory + "/exporter.out");
    ASSERT_TRUE(korvtest::PollUntil([&] { return !HttpGet(port, "/").empty(); })) << exporter.Log();
    const std::string text = HttpGet(port, "/snmp?module=" + std::string(kModule) +
                                               "&target=127.0.0.1:" + std::to_string(snmpd.Port()));
    const Exposition exposition(text);

    // Disk 1's rates under its display name and kernel name, the library's values.
    const std::string label = "korvDiskDisplayName=\"Disk 1\"";
    for (const char *member : {"utilization", "read_access", "read_byte", "write_access", "write_byte"}) {
        const std::string &object = korvcatalogue::Find(korvcatalogue::Section::Disk, member)->snmpObject;
        EXPECT_EQ(exposition.ValueOf(object, label), (*disk1)[member].asString()) << object << "\n" << text;
        EXPECT_EQ(exposition.types.at(object), "gauge") << object;
    }
    EXPECT_THAT(text, HasSubstr("korvDiskDevice=\"" + (*disk1)["device"].asString() + "\""));
    EXPECT_EQ(exposition.ValueOf("korvLunUtilization", "korvLunName=\"LUN-1\""),
              (*lun1)["utilization"].asString());
    // Every object that the MIB has: a counter as a counter, the rest as gauges (the totals'
    // CounterBasedGauge64 sums are rates); names, enumerations and indexes as labels only.
    size_t checked = 0;
    for (const korvcatalogue::Statistic &statistic : korvcatalogue::Statistics()) {
        using korvcatalogue::Kind;
        using korvcatalogue::Syntax;
        const bool label = statistic.kind == Kind::Name || statistic.kind == Kind::Enumeration ||
                           statistic.kind == Kind::Index;
        const auto type = exposition.types.find(statistic.snmpObject);
        if (label) {
            EXPECT_EQ(type, exposition.types.end()) << statistic.snmpObject;
        } else if (type != exposition.types.end()) {
            const bool counter = statistic.syntax == Syntax::Counter32 || statistic.syntax == Syntax::Counter64;
            EXPECT_EQ(type->second, counter ? "counter" : "gauge") << statistic.snmpObject;
            ++checked;
        }
    }
    // Every family of the module is one of the catalogue's (the others are the exporter's own).
    const auto ours = std::count_if(exposition.types.begin(), exposition.types.end(),
                                    [](const auto &type) { return type.first.rfind("korv", 0) == 0; });
    EXPECT_EQ(checked, static_cast<size_t>(ours));
    EXPECT_EQ(exposition.types.at("korvFailedSamples"), "counter");
    EXPECT_EQ(exposition.types.at("korvDiskTotalReadByte"), "gauge");
    EXPECT_EQ(exporter.Stop(SIGTERM), 128 + SIGTERM) << exporter.Log();  // it takes the signal's default
    EXPECT_EQ(subagent.Stop(SIGTERM), 0) << subagent.Log();
    EXPECT_EQ(collector.Stop(SIGTERM), 0) << collector.Log();
}

}  // namespace
