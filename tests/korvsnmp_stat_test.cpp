// korvsnmp-stat's command line, its tables, its OpenMetrics text and --watch.
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "collector_process.h"
#include "counters.h"
#include "json_text.h"
#include "exposition/exposition.h"
#include "options.h"
#include "table_format.h"
#include "test_collector.h"
#include "watch.h"

namespace {

using namespace korvstat;
using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

auto Fields(const Options &o)
{
    return std::tie(o.action, o.format, o.resources, o.reason, o.rawNumbers, o.watchSeconds, o.watchCount,
                    o.outputPath);
}

TEST(KorvsnmpStatOptions, CommandLinesThatParse)
{
    const std::pair<std::vector<std::string>, void (*)(Options &)> cases[] = {  // the defaults, changed
        {{}, [](Options &) {}},
        {{"-h"}, [](Options &o) { o.action = Action::Help; }},
        {{"--resource", "cpu,disk", "--format=table", "--watch=0.5", "--bytes"},
         [](Options &o) {
             o.format = Format::Table;
             o.resources = {"cpu", "disk"};
             o.watchSeconds = 0.5;
             o.rawNumbers = true;
         }},
        {{"--resource=nfs", "--format", "openmetrics", "--watch", "2", "--watch-count", "3"},
         [](Options &o) {
             o.format = Format::OpenMetrics;
             o.resources = {"nfs"};
             o.watchSeconds = 2;
             o.watchCount = 3;
         }},
        {{"--format=openmetrics", "--output", "/run/k.prom"},
         [](Options &o) {
             o.format = Format::OpenMetrics;
             o.outputPath = "/run/k.prom";
         }},
        {{"--compact"}, [](Options &o) { o.format = Format::CompactJson; }},
        {{"--reload"}, [](Options &o) { o.action = Action::Reload; }},
        {{"--version"}, [](Options &o) { o.action = Action::Version; }},
        {{"--format", "json", "--compact"}, [](Options &o) { o.format = Format::CompactJson; }},
        {{"--history-mode", "backup window"},
         [](Options &o) {
             o.action = Action::HistoryMode;
             o.reason = "backup window";
         }}};
    for (const auto &[arguments, change] : cases) {
        Options parsed;
        Options expected;
        std::string error;
        ASSERT_TRUE(ParseOptions(arguments, parsed, error)) << error;
        change(expected);
        EXPECT_EQ(Fields(parsed), Fields(expected)) << ::testing::PrintToString(arguments);
    }
}

TEST(KorvsnmpStatOptions, BadCommandLinesSayWhatIsWrong)
{
    const std::pair<std::vector<std::string>, std::string> cases[] = {
        {{"--resource", "cpu,bogus"}, "unknown resource \"bogus\""},
        {{"--resource", ""}, "--resource needs at least one name"},
        {{"--history-mode= \t"}, "--history-mode needs a reason that is not empty"},
        {{"--resource"}, "--resource needs a value"}, {{"--format", "xml"}, "unknown format \"xml\""},
        {{"--verbose"}, "unknown option \"--verbose\""}, {{"-x"}, "unknown option \"-x\""},
        {{"table"}, "unexpected argument \"table\""}, {{"--help=me"}, "--help takes no value"},
        // conflicts: named in a fixed order, whatever the command line's
        {{"--format=openmetrics", "--compact"}, "--compact applies to --format json only"},
        {{"--resource", "disk", "--reload"}, "--reload and --resource cannot be combined"},
        {{"--version", "--help"}, "--help and --version cannot be combined"},
        {{"--format", "table", "--format", "json"}, "--format given more than once"},
        {{"--bytes"}, "--bytes applies to --format table only"},
        {{"--watch-count", "2"}, "--watch-count needs --watch"},
        {{"--output="}, "--output needs a file name, not \"\""},
        {{"--output", "/run/"}, "--output needs a file name, not \"/run/\""},
        {{"--reload", "--output=x"}, "--reload and --output cannot be combined"},
        {{"--watch", "0"}, "--watch needs seconds from 0.1 to 86400, not \"0\""},
        {{"--watch=nan"}, "--watch needs seconds from 0.1 to 86400, not \"nan\""},
        {{"--watch=1e9"}, "--watch needs seconds from 0.1 to 86400, not \"1e9\""},
        {{"--watch=2s"}, "--watch needs seconds from 0.1 to 86400, not \"2s\""},
        {{"--watch=1", "--watch-count=-1"}, "--watch-count needs a number of draws, not \"-1\""},
        {{"--reload", "--output", "f"}, "--reload and --output cannot be combined"}};
    for (const auto &[arguments, expected] : cases) {
        Options options; std::string error;
        EXPECT_FALSE(ParseOptions(arguments, options, error)) << expected;
        EXPECT_EQ(error, expected);
    }
}

std::vector<std::string> Lines(const std::string &text)
{
    std::vector<std::string> lines; std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);) lines.push_back(line);
    return lines;
}

std::string Tables(const Json::Value &result, bool raw)
{ std::ostringstream out; WriteTables(result, raw, out); return out.str(); }

// Every section in the catalogue's order with its titles; values in the
// titles' units; a column that no record has is left out, names stay;
// "total" last even where the result has it first; unknown members last.
TEST(KorvsnmpStatTables, CatalogueColumnsTotalLastAndBytesOnRequest)
{
    const Json::Value result = korvtest::ParseJson(R"({
        "nfs": {"calls": 12, "read_byte": 2048, "calls_total": 99},
        "network": [{"device": "total", "rx": 3072, "tx": 10}, {"device": "eth0", "rx": 3072, "tx": 10}],
        "disk": {"disk": [{"write_byte": 0, "read_byte": 1536, "utilization": 7, "type": "internal",
                           "display_name": "Disk 1", "device": "sda", "read_byte_total": 1572864,
                           "busy_ms_total": 1234, "extra": "x"}],
                 "total": {"device": "total", "utilization": 7, "read_byte": 1536, "write_byte": 0}},
        "lun": [{"uuid": "6e1f", "lun_name": "vm", "write_byte": 4294967295, "read_mbyte_total": 5}],
        "cpu": {"idle": 88, "system": 3, "user": 8, "user_ticks_total": 4200, "zz": 1},
        "memory": {"memory_size": 4294967295, "avail_real": 1024},
        "time": "soon"})");
    EXPECT_THAT(Lines(Tables(result, false)), ElementsAre(
        "Sample time  soon", "",
        "CPU", "%usr  %sys  %idle   usr  zz", "   8     3     88  4200   1", "",
        "Memory", "size  avail", "4.0T   1.0M", "",
        "NFS", "calls/s  rkB/s  calls", "     12   2.00     99", "",
        "Disk", "device  name    type      %util  rkB/s  wkB/s  rbytes  busy  extra",
        "sda     Disk 1  internal      7   1.50   0.00    1.5M  1234  x",
        "total   -       -             7   1.50   0.00       -     -  -", "",
        "Interface", "device  rxkB/s  txkB/s", "eth0      3.00    0.01", "total     3.00    0.01", "",
        "LUN", "uuid  name       wkB/s  rMiB", "6e1f  vm    4194304.00     5", ""));
    EXPECT_THAT(Lines(Tables(result, true)), Contains("4398046510080  1048576"));
    EXPECT_THAT(Lines(Tables(result, true)), Contains("sda     Disk 1  internal      7   1.50   0.00  1572864  1234  x"));
}

TEST(KorvsnmpStatTables, ValuesOfUnexpectedShapesAreShownNotThrown)
{
    const auto out = Tables(korvtest::ParseJson(R"({"cpu": 3, "lun": [1, {"uuid": [2]}], "space": "none",
    "nfs": null, "network": {"device": "x"}, "disk": {"disk": 5, "total": true}, "time": 1e300})"), false);
    EXPECT_THAT(out, HasSubstr("[2]"));
    EXPECT_THAT(out, HasSubstr("Sample time  1.0000000000000001e+300"));
    EXPECT_EQ(Tables(Json::Value(5), false), "5\n");
}

// Human bytes round like df -h.
TEST(KorvsnmpStatTables, HumanBytes)
{
    const std::pair<double, const char *> cases[] = {
        {0, "0"}, {1023, "1023"}, {1024, "1.0K"}, {1536, "1.5K"}, {10239, "10K"}, {1048063, "1023K"},
        {1048575, "1.0M"}, {1572864, "1.5M"}, {4398046510080.0, "4.0T"}, {1.2e21, "1041E"}};
    for (const auto &[bytes, expected] : cases) EXPECT_EQ(HumanBytes(bytes), expected) << bytes;
}

TEST(KorvsnmpStatOpenMetrics, LabelValuesAreEscapedAndValidUtf8)
{
    const std::pair<std::string, std::string> cases[] = {
        {"Disk 1", "Disk 1"}, {"say \"hi\"", "say \\\"hi\\\""},
        {"C:\\share", "C:\\\\share"}, {"two\nlines", "two\\nlines"},
        {"Datenträger 🙂", "Datenträger 🙂"}, {"latin1 \xE4!", "latin1 \xEF\xBF\xBD!"},
        // An overlong '/', a surrogate, a sequence cut short.
        {"\xC0\xAF", "\xEF\xBF\xBD\xEF\xBF\xBD"}, {"\xED\xA0\x80", "\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD"},
        {"cut \xE2\x82", "cut \xEF\xBF\xBD\xEF\xBF\xBD"}};
    for (const auto &[text, expected] : cases) EXPECT_EQ(korvexposition::EscapeLabelValue(text), expected) << text;
}

struct Outcome { int status; std::string out, err; };

// Runs shell `command` with `input` on its standard input.
Outcome RunCommand(const std::string &command, const std::string &input = "")
{
    char in[] = "/tmp/korvsnmp-stat-XXXXXX", out[] = "/tmp/korvsnmp-stat-XXXXXX",
         err[] = "/tmp/korvsnmp-stat-XXXXXX";
    for (char *path : {in, out, err}) close(mkstemp(path));
    std::ofstream(in, std::ios::binary) << input;
    const int status = std::system(("{ " + command + "; } <" + in + " >" + out + " 2>" + err).c_str());
    const Outcome run{WIFEXITED(status) ? WEXITSTATUS(status) : -1, korvtest::ReadWholeFile(out),
                      korvtest::ReadWholeFile(err)};
    for (const char *path : {in, out, err}) unlink(path);
    return run;
}

// Runs the built korvsnmp-stat with `arguments` (shell words, then maybe more
// of the shell's), `env` (shell assignments) before it.
Outcome RunStat(const std::string &arguments, const std::string &env = "")
{ return RunCommand(korvtest::RedirectedChildPrefix() + env + " " KORVSNMP_STAT_PATH " " + arguments); }

std::string OpenMetrics(const Json::Value &result, const korvexposition::NetworkKinds &kinds = {})
{
    std::ostringstream out;
    korvexposition::WriteOpenMetrics(korvexposition::BuildExposition(result, kinds), out);
    return out.str();
}

// The samples that both Prometheus parsers read from `exposition`, as
// "<sample> <unit> <labels> <value>"; fails the test when either parser
// rejects it, names a sample other than its family (a counter's with
// "_total"), or lacks a sample. (promtool reads the classic format only,
// where a counter's HELP names its "_total": it checks the exporter's.)
std::vector<std::string> ParsedSamples(const std::string &exposition)
{
    const Outcome run = RunCommand(KORVSNMP_OPENMETRICS_SAMPLES, exposition);
    EXPECT_EQ(run.status, 0) << run.out << run.err << "\n" << exposition;
    std::vector<std::string> openmetrics, unitless, classic;
    for (const std::string &line : Lines(run.out)) {
        std::istringstream words(line); std::string parser, family, unit, sample, rest;
        std::getline(words >> parser >> family >> unit >> sample, rest);
        EXPECT_THAT(sample, ::testing::AnyOf(family, family + "_total")) << line;
        // The classic parser knows no units and reads every value as a float.
        (parser == "classic" ? classic : unitless).push_back(sample + rest);
        if (parser == "openmetrics") openmetrics.push_back(sample + " " + unit + rest);
    }
    for (const std::string &sample : unitless) EXPECT_THAT(classic, Contains(sample)) << "classic lacks it";
    return openmetrics;
}

// Counters in base units as counter families, shares as ratios, sizes in
// bytes; names as labels, the network rows' kind too; no total row; a
// repeated series and members the catalogue does not know left out.
TEST(KorvsnmpStatOpenMetrics, TheParsersReadEveryFamilyInBaseUnits)
{
    const Json::Value result = korvtest::ParseJson(R"({
        "time": 1795000000, "cpu": {"user": 12, "idle": 88, "user_ticks_total": 250},
        "memory": {"memory_size": 4294967295}, "nfs": {"calls": 12, "calls_total": 7},
        "disk": {"disk": [{"device": "sda", "display_name": "Disk \"1\" \\ a\nb", "type": "usb",
                           "utilization": 7, "read_byte_total": 4096, "busy_ms_total": 1234567, "queue": 2}],
                 "total": {"device": "total", "utilization": 7, "read_byte_total": 4096}},
        "network": [{"device": "total", "rx": 6, "rx_byte_total": 20}, {"device": "eth0", "rx": 3, "rx_byte_total": 10},
                    {"device": "eth0", "rx": 4}, {"device": "bond0", "rx_byte_total": 10}, {"device": "ppp0", "rx": "n/a"}],
        "space": {"volume": [{"device": "dm-0", "display_name": "h\u00e4me \u00ff", "write_byte_total": 512}],
                  "total": {"device": "total", "write_byte_total": 512}},
        "lun": [{"uuid": "6e1f", "lun_name": "vm", "read_access": 4.5, "read_mbyte_total": 3}]})");
    const std::string out = OpenMetrics(result, {{"bond0"}, "ppp"});
    const std::string sda = R"({"device": "sda", "display_name": "Disk \"1\" \\ a\nb", "type": "usb"})";
    EXPECT_THAT(Lines(out).back(), "# EOF");
    EXPECT_THAT(ParsedSamples(out), ElementsAre(
        "korvsnmp_sample_timestamp_seconds seconds {} 1795000000.0",
        R"(korvsnmp_cpu_ratio ratio {"mode": "user"} 0.12)", R"(korvsnmp_cpu_ratio ratio {"mode": "idle"} 0.88)",
        R"(korvsnmp_cpu_seconds_total seconds {"mode": "user"} 2.5)",
        "korvsnmp_memory_size_bytes bytes {} 4398046510080.0",
        "korvsnmp_nfs_calls_per_second - {} 12.0", "korvsnmp_nfs_calls_total - {} 7.0",
        "korvsnmp_disk_utilization_ratio ratio " + sda + " 0.07",
        "korvsnmp_disk_read_bytes_total bytes " + sda + " 4096.0",
        "korvsnmp_disk_io_time_seconds_total seconds " + sda + " 1234.567",
        R"(korvsnmp_network_receive_bytes_per_second bytes_per_second {"device": "eth0", "kind": "interface"} 3.0)",
        R"(korvsnmp_network_receive_bytes_total bytes {"device": "eth0", "kind": "interface"} 10.0)",
        R"(korvsnmp_network_receive_bytes_total bytes {"device": "bond0", "kind": "aggregation"} 10.0)",
        R"(korvsnmp_volume_written_bytes_total bytes {"device": "dm-0", "display_name": "h\u00e4me \u00ff"} 512.0)",
        R"(korvsnmp_lun_reads_per_second - {"lun_name": "vm", "uuid": "6e1f"} 4.5)",
        R"(korvsnmp_lun_read_bytes_total bytes {"lun_name": "vm", "uuid": "6e1f"} 3145728.0)"));
    // A result without numbers: nothing but the end.
    for (const char *json : {"null", "[]", R"({"cpu": [1], "disk": 3, "time": "x"})"})
        EXPECT_EQ(OpenMetrics(korvtest::ParseJson(json)), "# EOF\n") << json;
}

// The last sample line of an exposition, "" when it has none.
std::string LastSample(const std::string &exposition)
{
    const std::vector<std::string> lines = Lines(exposition);
    return lines.size() >= 2 && lines[lines.size() - 2][0] != '#' ? lines[lines.size() - 2] : "";
}

// What a counter's value becomes: exact text in base units, or no sample.
TEST(KorvsnmpStatOpenMetrics, CounterValuesExactOrNone)
{
    const std::tuple<const char *, const char *, std::string> cases[] = {  // member, value, sample
        {"calls_total", "0", "korvsnmp_nfs_calls_total 0"},
        {"calls_total", "18446744073709551615", "korvsnmp_nfs_calls_total 18446744073709551615"},
        {"calls_total", "-1", ""}, {"calls_total", "1.5", ""}, {"calls_total", "2.0", ""},
        {"calls_total", "\"7\"", ""}, {"calls_total", "18446744073709551616", ""},
        {"calls_total", "true", ""}, {"calls_total", "null", ""}, {"calls_total", "[1]", ""},
        {"calls", "-1", "korvsnmp_nfs_calls_per_second -1"}, {"calls", "0.25", "korvsnmp_nfs_calls_per_second 0.25"},
        {"calls", "\"7\"", ""}, {"calls", "false", ""}};
    for (const auto &[member, value, sample] : cases) {
        const std::string json = std::string(R"({"nfs": {")") + member + "\": " + value + "}}";
        EXPECT_EQ(LastSample(OpenMetrics(korvtest::ParseJson(json))), sample) << json;
    }
    const std::tuple<const char *, const char *> scaled[] = {  // disk member and value, sample value
        {R"("busy_ms_total": 1)", "0.001"}, {R"("busy_ms_total": 1000)", "1"},
        {R"("busy_ms_total": 18446744073709551615)", "18446744073709551.615"},
        {R"("utilization": 7)", "0.07"}, {R"("utilization": 100)", "1"}, {R"("utilization": -3)", "-0.03"}};
    for (const auto &[record, value] : scaled) {
        const std::string json = std::string(R"({"disk": {"disk": [{"device": "sda", )") + record + "}]}}";
        EXPECT_THAT(LastSample(OpenMetrics(korvtest::ParseJson(json))),
                    ::testing::EndsWith(std::string("{device=\"sda\"} ") + value)) << json;
    }
    const std::tuple<const char *, const char *> mebibytes[] = {
        {"17592186044415", "18446744073708503040"}, {"17592186044416", "18446744073709551616"}};
    for (const auto &[value, bytes] : mebibytes) {
        const std::string json = std::string(R"({"lun": [{"uuid": "u", "read_mbyte_total": )") + value + "}]}";
        EXPECT_EQ(LastSample(OpenMetrics(korvtest::ParseJson(json))),
                  std::string("korvsnmp_lun_read_bytes_total{uuid=\"u\"} ") + bytes);
    }
}

TEST(KorvsnmpStatWatch, DrawsWaitsAndStopsOnCountOrInterruption)
{
    // {count, waits before the interruption (-1: none), draws, status}
    // The count's draws, then interrupted.
    const std::tuple<unsigned, int, int, int> cases[] = {
        {1, -1, 1, 7}, {3, -1, 3, 7}, {0, 4, 5, 0}, {9, 1, 2, 0}};
    for (const auto &[count, waitsBeforeInterrupt, expectedDraws, expectedStatus] : cases) {
        int draws = 0; std::vector<std::chrono::milliseconds> waits;
        const int status = Watch(
            std::chrono::milliseconds(2500), count, [&] { return ++draws, 7; },
            [&](std::chrono::milliseconds interval) {
                return waits.push_back(interval), static_cast<int>(waits.size()) != waitsBeforeInterrupt + 1;
            });
        EXPECT_EQ(std::make_pair(draws, status), std::make_pair(expectedDraws, expectedStatus));
        EXPECT_EQ(waits, std::vector<std::chrono::milliseconds>(
                             expectedDraws - (expectedStatus == 0 ? 0 : 1), std::chrono::milliseconds(2500)));
    }
}

// A pending SIGINT (SIGTERM: the program's --watch test) ends the wait at
// once, however long the interval; without one, a zero interval returns as a timeout.
TEST(KorvsnmpStatWatch, TheWaitEndsOnAPendingStopSignal)
{
    sigset_t stop, previous, pending;
    sigemptyset(&stop), sigaddset(&stop, SIGINT), sigprocmask(SIG_BLOCK, &stop, &previous), raise(SIGINT);
    EXPECT_FALSE(WaitUnlessInterrupted(std::chrono::hours(1)));
    EXPECT_FALSE(sigpending(&pending) || sigismember(&pending, SIGINT)) << "the signal was taken";
    sigprocmask(SIG_SETMASK, &previous, nullptr);
    EXPECT_TRUE(WaitUnlessInterrupted(std::chrono::milliseconds(0)));
}

const char kCpuAndNfsReply[] =
    R"({"data": {"System": [{"user": 12, "idle": 88}], "NFS": {"read_byte": 5}, "time": 1795000000}})";

TEST(KorvsnmpStatProgram, PrintsTheAssembledResultAsJsonTablesAndOpenMetrics)
{
    korvtest::TestCollector collector;
    for (int i = 0; i < 3; ++i) collector.Script({korvtest::Frame(kCpuAndNfsReply)});

    const Outcome json = RunStat("--resource cpu,nfs --compact");
    const Outcome table = RunStat("--resource=nfs,cpu --format=table", "TZ=America/St_Johns");
    const Outcome metrics = RunStat("--resource cpu --format openmetrics");

    EXPECT_EQ(json.status, 0) << json.err;
    EXPECT_EQ(json.out, R"({"cpu":{"idle":88,"user":12},"nfs":{"read_byte":5},"time":1795000000})" "\n");
    EXPECT_EQ(table.status, 0) << table.err;
    EXPECT_THAT(Lines(table.out), ElementsAre("Sample time  2026-11-18T07:36:40-03:30", "", "CPU",
                "%usr  %idle", "  12     88", "", "NFS", "rkB/s", " 0.00", ""));
    EXPECT_EQ(metrics.status, 0) << metrics.err;
    EXPECT_THAT(ParsedSamples(metrics.out),
                ElementsAre("korvsnmp_sample_timestamp_seconds seconds {} 1795000000.0",
                            R"(korvsnmp_cpu_ratio ratio {"mode": "user"} 0.12)",
                            R"(korvsnmp_cpu_ratio ratio {"mode": "idle"} 0.88)"));
    ASSERT_TRUE(collector.WaitForConnections(3));
    EXPECT_EQ(collector.Requests().at(0),
              korvtest::Frame(std::string("{\"resource\":[\"cpu\",\"nfs\"]}\n") + '\0'));
}

TEST(KorvsnmpStatProgram, ControlRequestsSayWhatHappened)
{
    korvtest::TestCollector collector;
    for (int i = 0; i < 2; ++i) collector.Script({korvtest::Frame(R"({"success":true})")});
    const Outcome reload = RunStat("--reload");
    const Outcome history = RunStat("--history-mode 'backup window'");
    EXPECT_EQ(std::make_pair(reload.status, reload.out), std::make_pair(0, std::string("The collector reloaded.\n")));
    EXPECT_EQ(std::make_pair(history.status, history.out),
              std::make_pair(0, std::string("The collector entered history mode: backup window\n")));
}

TEST(KorvsnmpStatProgram, OutputGoesToTheFileInsteadOfStandardOutput)
{
    korvtest::TestCollector collector;
    collector.Script({korvtest::Frame(kCpuAndNfsReply)});
    const std::string file = "/tmp/korvsnmp-stat-output-" + std::to_string(getpid()) + ".json";
    const Outcome run = RunStat("--resource nfs --compact --output " + file);
    std::ifstream in(file);
    const std::string written{std::istreambuf_iterator<char>(in), {}};
    std::remove(file.c_str());
    EXPECT_EQ(std::make_pair(run.status, run.out), std::make_pair(0, std::string()));
    EXPECT_EQ(written, R"({"nfs":{"read_byte":5},"time":1795000000})" "\n");
}

std::vector<std::string> Entries(const std::string &directory)
{
    std::vector<std::string> names;
    for (const auto &entry : std::filesystem::directory_iterator(directory)) names.push_back(entry.path().filename());
    std::sort(names.begin(), names.end());
    return names;
}

// --output replaces the file by a rename: a reader that has the old file
// open keeps reading it whole, and a failure leaves no file behind.
TEST(KorvsnmpStatProgram, OutputReplacesTheFileAtomically)
{
    korvtest::TestCollector collector;
    for (int i = 0; i < 3; ++i) collector.Script({korvtest::Frame(kCpuAndNfsReply)});
    char directory[] = "/tmp/korvsnmp-stat-output-XXXXXX";
    ASSERT_NE(mkdtemp(directory), nullptr);
    const std::string path = std::string(directory) + "/korvsnmp.prom";
    const std::string taken = std::string(directory) + "/taken.prom";
    std::ofstream(path) << "old\n";
    std::filesystem::create_directories(taken + "/inside");
    std::ifstream reader(path);

    const Outcome run = RunStat("--resource nfs --format openmetrics --output " + path);
    const Outcome missing = RunStat("--resource nfs --output " + std::string(directory) + "/none/x.prom");
    const Outcome renamed = RunStat("--resource nfs --output " + taken);

    EXPECT_EQ(std::make_pair(run.status, run.out + run.err), std::make_pair(0, std::string()));
    std::string old;
    std::getline(reader, old);
    EXPECT_EQ(old, "old");
    EXPECT_THAT(korvtest::ReadWholeFile(path), HasSubstr("\nkorvsnmp_nfs_read_bytes_per_second 5\n"));
    struct stat status {};
    ASSERT_EQ(stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777, 0644u);
    EXPECT_EQ(missing.status, 1);
    EXPECT_EQ(Lines(missing.err).back(), "korvsnmp-stat: cannot create a file beside " + std::string(directory) +
                                             "/none/x.prom: No such file or directory");
    EXPECT_EQ(renamed.status, 1);
    EXPECT_THAT(renamed.err, HasSubstr(" to " + taken + ": Is a directory"));
    EXPECT_THAT(Entries(directory), ElementsAre("korvsnmp.prom", "taken.prom"));
    std::filesystem::remove_all(directory);
}

TEST(KorvsnmpStatProgram, NoCollectorIsAClearLineAndAFailingStatus)
{
    korvtest::NoCollector absent;
    const Outcome run = RunStat("");
    EXPECT_EQ(std::make_pair(run.status, run.out), std::make_pair(1, std::string()));
    EXPECT_THAT(run.err, HasSubstr("Failed to connect to socket: [/tmp/korvsnmpcd.sock]"));  // the library's
    EXPECT_EQ(Lines(run.err).back(), "korvsnmp-stat: no statistics from the collector on /tmp/korvsnmpcd.sock");
}

TEST(KorvsnmpStatProgram, BadCommandLineExitsWithUsageAndVersionAnswers)
{
    const Outcome bad = RunStat("--compact --format table");
    EXPECT_EQ(std::make_pair(bad.status, bad.out), std::make_pair(2, std::string()));
    EXPECT_THAT(bad.err, ::testing::StartsWith(
                             "korvsnmp-stat: --compact applies to --format json only\n\nUsage:"));
    const Outcome version = RunStat("--version");
    EXPECT_EQ(version.status, 0);
    EXPECT_THAT(version.out, ::testing::MatchesRegex("korvsnmp-stat [0-9]+\\.[0-9]+\\.[0-9]+\n"));
}

// --watch draws, then waits; SIGTERM in the wait ends it with status 0. The
// wait has begun once SIGTERM (bit 14 of /proc/PID/status SigBlk) is blocked.
TEST(KorvsnmpStatProgram, WatchRedrawsUntilInterrupted)
{
    korvtest::TestCollector collector; collector.Script({korvtest::Frame(kCpuAndNfsReply)});
    const Outcome run = RunStat("--watch 3600 --resource nfs --compact & p=$!; for i in $(seq 1000); do "
                            "[ $((0x$(sed -n 's/^SigBlk:\\s*//p' /proc/$p/status) >> 14 & 1)) = 1 ] && break; "
                            "sleep 0.005; done; kill -TERM $p; wait $p");
    EXPECT_EQ(run.status, 0) << run.err;
    EXPECT_EQ(run.out, "{\"nfs\":{\"read_byte\":5},\"time\":1795000000}\n");  // no escapes: not a terminal
}

}  // namespace
