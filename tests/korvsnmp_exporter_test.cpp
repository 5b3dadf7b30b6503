// korvsnmp-exporter: its command line, its snapshot served without waiting,
// and the program under a real Prometheus.
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <future>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "collector_process.h"
#include "exporter_options.h"
#include "http_get.h"
#include "json_text.h"
#include "metrics_handler.h"
#include "host_file.h"
#include "snapshot_exporter.h"
#include "test_collector.h"

namespace {

using namespace korvexporter;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using Clock = std::chrono::steady_clock;

TEST(KorvsnmpExporterOptions, CommandLines)
{
    const std::tuple<std::vector<std::string>, std::string, uint32_t> good[] = {  // listen, interval
        {{}, "127.0.0.1:9747", 5}, {{"--listen", "0.0.0.0:80", "--interval=60"}, "0.0.0.0:80", 60},
        {{"--listen=[::1]:0"}, "[::1]:0", 5}, {{"--interval", "3600"}, "127.0.0.1:9747", 3600}};
    for (const auto &[arguments, listen, interval] : good) {
        Options options;
        std::string error;
        EXPECT_TRUE(ParseOptions(arguments, options, error)) << error;
        EXPECT_EQ(std::make_pair(options.listen, options.intervalSeconds), std::make_pair(listen, interval));
    }
    const std::pair<std::vector<std::string>, std::string> bad[] = {
        {{"--listen", "9747"}, "--listen needs ADDRESS:PORT, not \"9747\""},
        {{"--listen", "localhost:65536"}, "--listen needs ADDRESS:PORT, not \"localhost:65536\""},
        {{"--listen", "::1:80"}, "--listen needs ADDRESS:PORT, not \"::1:80\""},
        {{"--listen", "a:80,b:81"}, "--listen needs ADDRESS:PORT, not \"a:80,b:81\""},
        {{"--listen", "a:-1"}, "--listen needs ADDRESS:PORT, not \"a:-1\""},
        {{"--interval", "0"}, "--interval needs whole seconds from 1 to 3600, not \"0\""},
        {{"--interval", "1.5"}, "--interval needs whole seconds from 1 to 3600, not \"1.5\""},
        {{"--interval=1", "--interval=2"}, "\"--interval=2\" given more than once"},
        {{"--interval"}, "a value is missing for \"--interval\""}, {{"--port"}, "unknown option \"--port\""},
        {{"serve"}, "unexpected argument \"serve\""}};
    for (const auto &[arguments, expected] : bad) {
        Options options;
        std::string error;
        EXPECT_FALSE(ParseOptions(arguments, options, error)) << expected;
        EXPECT_EQ(error, expected);
    }
}

std::string Scrape(const SnapshotExporter &exporter)
{
    return exporter.Render(korvexposition::TextFormat::Classic);
}

std::vector<std::string> SampleLines(const std::string &text)
{
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);)
        if (!line.empty() && line[0] != '#') lines.push_back(line);
    return lines;
}

// The snapshot as a scrape sees it, on a clock of the test's: nothing but
// the sampling's own before a sample; the result's families with their age
// after one; the old result, older, after a failed one.
TEST(KorvsnmpExporterSnapshot, ServesTheLastResultWithItsAge)
{
    const Clock::time_point start{};
    Clock::time_point now = start;
    std::vector<bool> replies = {false, true, false};
    size_t taken = 0;
    SnapshotExporter exporter(
        std::chrono::seconds(5),
        [&](Json::Value &result, korvexposition::NetworkKinds &) {
            result = korvtest::ParseJson(R"({"nfs": {"calls_total": 7}, "disk": {"disk": [{"device": "sda",
                "display_name": "Disk 1", "busy_ms_total": 1500}]}})");
            return replies.at(taken++);
        },
        [&] { return now; });
    EXPECT_THAT(SampleLines(Scrape(exporter)), ElementsAre(
        "korvsnmp_failed_samples_total 0", "korvsnmp_sample_interval_seconds 5", "korvsnmp_collector_up 0"));
    exporter.SampleOnce();
    EXPECT_THAT(SampleLines(Scrape(exporter)), ElementsAre(
        "korvsnmp_failed_samples_total 1", "korvsnmp_sample_interval_seconds 5", "korvsnmp_collector_up 0"));
    now = start + std::chrono::seconds(10);
    exporter.SampleOnce();
    now = start + std::chrono::milliseconds(12500);
    const std::vector<std::string> served = {
        "korvsnmp_nfs_calls_total 7", "korvsnmp_disk_io_time_seconds_total{device=\"sda\",display_name=\"Disk 1\"} 1.5"};
    EXPECT_THAT(SampleLines(Scrape(exporter)), ElementsAre(served[0], served[1], "korvsnmp_snapshot_age_seconds 2.5",
        "korvsnmp_failed_samples_total 1", "korvsnmp_sample_interval_seconds 5", "korvsnmp_collector_up 1"));
    now = start + std::chrono::seconds(40);
    exporter.SampleOnce();
    EXPECT_THAT(SampleLines(Scrape(exporter)), ElementsAre(served[0], served[1], "korvsnmp_snapshot_age_seconds 30",
        "korvsnmp_failed_samples_total 2", "korvsnmp_sample_interval_seconds 5", "korvsnmp_collector_up 0"));
    EXPECT_THAT(Scrape(exporter), HasSubstr("# TYPE korvsnmp_disk_io_time_seconds_total counter\n"));
    const std::string openMetrics = exporter.Render(korvexposition::TextFormat::OpenMetrics);
    EXPECT_THAT(openMetrics, HasSubstr("# TYPE korvsnmp_disk_io_time_seconds counter\n# UNIT "
                                       "korvsnmp_disk_io_time_seconds seconds\n"));
    EXPECT_THAT(openMetrics, ::testing::EndsWith("\nkorvsnmp_collector_up 0\n# EOF\n"));
}

TEST(KorvsnmpExporterSnapshot, TheScraperChoosesTheFormat)
{
    const std::pair<const char *, korvexposition::TextFormat> cases[] = {
        {nullptr, korvexposition::TextFormat::Classic}, {"*/*", korvexposition::TextFormat::Classic},
        {"text/plain;version=0.0.4", korvexposition::TextFormat::Classic},
        {"application/openmetrics-text;version=1.0.0,application/openmetrics-text;version=0.0.1;q=0.75,"
         "text/plain;version=0.0.4;q=0.5,*/*;q=0.1", korvexposition::TextFormat::OpenMetrics}};
    for (const auto &[accept, format] : cases) EXPECT_EQ(FormatFor(accept), format) << (accept ? accept : "none");
}

// A stop breaks off a sample that waits on the collector, as the library's
// select() does, rather than waiting for it to end.
TEST(KorvsnmpExporterSnapshot, StopBreaksOffASampleUnderWay)
{
    std::promise<void> entered;
    int waitError = 0;
    SnapshotExporter exporter(std::chrono::milliseconds(1), [&](Json::Value &, korvexposition::NetworkKinds &) {
        entered.set_value();
        waitError = poll(nullptr, 0, -1) < 0 ? errno : 0;
        return false;
    });
    exporter.Start();
    entered.get_future().wait();
    exporter.Stop();
    EXPECT_EQ(waitError, EINTR);
    EXPECT_THAT(Scrape(exporter), HasSubstr("korvsnmp_failed_samples_total 1\n"));
}

struct Outcome {
    int status;
    std::string output;
};

Outcome RunShell(const std::string &command, const std::string &input)
{
    char in[] = "/tmp/korvsnmp-exporter-XXXXXX";
    close(mkstemp(in));
    std::ofstream(in, std::ios::binary) << input;
    FILE *pipe = popen((command + " <" + in + " 2>&1").c_str(), "r");
    std::string output;
    char buffer[4096];
    for (size_t got; (got = fread(buffer, 1, sizeof buffer, pipe)) > 0;) output.append(buffer, got);
    const int status = pclose(pipe);
    unlink(in);
    return {WIFEXITED(status) ? WEXITSTATUS(status) : -1, output};
}

// The value of the first sample of a Prometheus API query's answer, "" when
// there is none.
std::string QueryValue(int port, const std::string &query)
{
    const korvtest::HttpReply reply = korvtest::HttpGet(port, "/api/v1/query?query=" + korvtest::UrlEncode(query));
    Json::Value answer;
    if (reply.status != 200 || !Json::Reader().parse(reply.body, answer) || !answer.isObject()) return "";
    const Json::Value &result = answer["data"]["result"];
    return result.isArray() && !result.empty() ? result[0]["value"][1].asString() : "";
}

bool PrometheusInstalled() { return access("/usr/bin/prometheus", X_OK) == 0; }

// korvsnmpcd replays the large appliance; the exporter samples it every
// second; Debian's Prometheus scrapes the exporter every second with the
// shipped rules loaded, and finds it up and the disks by their names.
TEST(KorvsnmpExporterProgram, PrometheusScrapesTheLargeAppliance)
{
    if (!PrometheusInstalled()) GTEST_SKIP() << "Debian's prometheus is not installed";
    const std::string &socket = korvtest::PrivateCollectorPath();
    korvtest::CollectorProcess collector(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay",
                                         KORVSNMP_EXAMPLES_DIR "/large-appliance.reply.json"}, socket + ".log");
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << collector.Log();
    std::vector<std::string> command = korvtest::RedirectedChildVariables();
    command.insert(command.end(), {std::string(korvstandin::kHostFileVariable) + "=" KORVSNMP_EXAMPLES_DIR
                                   "/large-appliance.host.json", KORVSNMP_EXPORTER_PATH, "--listen", "127.0.0.1:0",
                                   "--interval", "1"});
    korvtest::CollectorProcess exporter("/usr/bin/env", command, socket + ".exporter");
    int port = 0;
    ASSERT_TRUE(korvtest::Eventually([&] {
        return std::sscanf(exporter.Log().c_str(), "korvsnmp-exporter: korvsnmp-exporter:%*d Serving "
                           "http://127.0.0.1:%d/metrics", &port) == 1;
    })) << exporter.Log();

    const korvtest::HttpReply scrape = korvtest::HttpGet(port, "/metrics");
    EXPECT_EQ(scrape.status, 200);
    EXPECT_THAT(scrape.body, HasSubstr("\nkorvsnmp_disk_utilization_ratio{device=\"sda\",display_name=\"Disk 1\","
                                       "type=\"internal\"} 0.01\n"));
    const Outcome lint = RunShell("promtool check metrics", scrape.body);
    EXPECT_EQ(std::make_pair(lint.status, lint.output), std::make_pair(0, std::string()));
    // One formatter: the OpenMetrics scrape is korvsnmp-stat's text, then the sampling's own families.
    const korvtest::HttpReply openMetrics =
        korvtest::HttpGet(port, "/metrics", "Accept: application/openmetrics-text;version=1.0.0\r\n");
    std::vector<std::string> stat = korvtest::RedirectedChildVariables();
    stat.insert(stat.end(), {std::string(korvstandin::kHostFileVariable) + "=" KORVSNMP_EXAMPLES_DIR
                             "/large-appliance.host.json", KORVSNMP_STAT_PATH, "--format", "openmetrics"});
    korvtest::CollectorProcess statRun("/usr/bin/env", stat, socket + ".stat");
    ASSERT_EQ(statRun.WaitForExit(), 0) << statRun.Log();
    const std::string statText = statRun.Log();
    ASSERT_THAT(statText, ::testing::EndsWith("\n# EOF\n"));
    EXPECT_EQ(openMetrics.body.substr(0, statText.size() - 6), statText.substr(0, statText.size() - 6));
    EXPECT_THAT(openMetrics.body.substr(statText.size() - 6), ::testing::StartsWith(
        "# HELP korvsnmp_snapshot_age_seconds "));
    EXPECT_EQ(korvtest::HttpGet(port, "/other").status, 404);

    char directory[] = "/tmp/korvsnmp-prometheus-XXXXXX";
    ASSERT_NE(mkdtemp(directory), nullptr);
    const std::string config = std::string(directory) + "/prometheus.yml";
    std::ofstream(config) << "global:\n  scrape_interval: 1s\n  evaluation_interval: 1s\n"
                          << "rule_files: ['" KORVSNMP_RULES_FILE "']\n"
                          << "scrape_configs:\n  - job_name: korvsnmp\n    static_configs:\n"
                          << "      - targets: ['127.0.0.1:" << port << "']\n";
    const int apiPort = korvtest::FreeLoopbackPort();
    korvtest::CollectorProcess prometheus("/usr/bin/prometheus", {"--config.file=" + config,
        "--storage.tsdb.path=" + std::string(directory) + "/data", "--web.listen-address=127.0.0.1:" +
        std::to_string(apiPort)}, std::string(directory) + ".log");
    // Its start and first scrape take a few seconds on a busy machine.
    bool up = false;
    for (int round = 0; round < 6 && !up; ++round)
        up = korvtest::Eventually([&] { return QueryValue(apiPort, "up{job=\"korvsnmp\"}") == "1"; });
    EXPECT_TRUE(up) << prometheus.Log();
    EXPECT_EQ(QueryValue(apiPort, "korvsnmp_disk_utilization_ratio{display_name=\"Disk 12\",device=\"sdl\"}"),
              "0.12");
    EXPECT_EQ(QueryValue(apiPort, "count(korvsnmp_network_receive_bytes_per_second{kind=\"aggregation\"})"), "2");
    EXPECT_EQ(prometheus.Stop(SIGTERM), 0) << prometheus.Log();
    EXPECT_EQ(exporter.Stop(SIGTERM), 0) << exporter.Log();
    EXPECT_EQ(collector.Stop(SIGTERM), 0) << collector.Log();
    std::filesystem::remove_all(directory);
}

}  // namespace
