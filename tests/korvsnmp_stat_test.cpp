// korvsnmp-stat's command line, its tables, its OpenMetrics text and --watch.
#include <signal.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "counters.h"
#include "json_text.h"
#include "openmetrics_format.h"
#include "options.h"
#include "table_format.h"
#include "test_collector.h"
#include "watch.h"

namespace {

using korvstat::Action;
using korvstat::Format;
using korvstat::Options;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

struct OptionsCase {
    std::vector<std::string> arguments;
    Action action;
    Format format;
    std::vector<std::string> resources;
    std::string reason;
};

TEST(KorvsnmpStatOptions, CommandLinesThatParse)
{
    const OptionsCase cases[] = {
        {{}, Action::Statistics, Format::PrettyJson, {"all"}, ""},
        {{"--resource", "cpu,disk", "--format", "table"}, Action::Statistics, Format::Table,
         {"cpu", "disk"}, ""},
        {{"--resource=cpu,disk", "--format=openmetrics"}, Action::Statistics, Format::OpenMetrics,
         {"cpu", "disk"}, ""},
        {{"--compact"}, Action::Statistics, Format::CompactJson, {"all"}, ""},
        {{"--format", "json", "--compact"}, Action::Statistics, Format::CompactJson, {"all"}, ""},
        {{"--reload"}, Action::Reload, Format::PrettyJson, {"all"}, ""},
        {{"--history-mode", "backup window"}, Action::HistoryMode, Format::PrettyJson, {"all"},
         "backup window"},
        {{"--history-mode=backup=nightly"}, Action::HistoryMode, Format::PrettyJson, {"all"},
         "backup=nightly"},
        {{"-h"}, Action::Help, Format::PrettyJson, {"all"}, ""},
        {{"--version"}, Action::Version, Format::PrettyJson, {"all"}, ""},
    };
    for (const OptionsCase &c : cases) {
        Options options;
        std::string error;
        ASSERT_TRUE(korvstat::ParseOptions(c.arguments, options, error)) << error;
        EXPECT_EQ(options.action, c.action);
        EXPECT_EQ(options.format, c.format);
        EXPECT_EQ(options.resources, c.resources);
        EXPECT_EQ(options.reason, c.reason);
    }
}

TEST(KorvsnmpStatOptions, WatchAndBytesTakeTheirValues)
{
    Options options;
    std::string error;
    ASSERT_TRUE(korvstat::ParseOptions({"--watch=0.5", "--format", "table", "--bytes"}, options, error))
        << error;
    EXPECT_EQ(options.watchSeconds, 0.5);
    EXPECT_EQ(options.watchCount, 0u);
    EXPECT_TRUE(options.rawNumbers);
    ASSERT_TRUE(korvstat::ParseOptions({"--watch", "2", "--watch-count", "3"}, options, error)) << error;
    EXPECT_EQ(options.watchSeconds, 2);
    EXPECT_EQ(options.watchCount, 3u);
}

TEST(KorvsnmpStatOptions, BadCommandLinesSayWhatIsWrong)
{
    const std::pair<std::vector<std::string>, std::string> cases[] = {
        {{"--resource", "cpu,bogus"}, "unknown resource \"bogus\""},
        {{"--resource", ""}, "--resource needs at least one name"},
        {{"--resource"}, "--resource needs a value"},
        {{"--history-mode"}, "--history-mode needs a value"},
        {{"--history-mode", ""}, "--history-mode needs a reason that is not empty"},
        {{"--history-mode= \t"}, "--history-mode needs a reason that is not empty"},
        {{"--format", "xml"}, "unknown format \"xml\""},
        {{"--verbose"}, "unknown option \"--verbose\""},
        {{"-x"}, "unknown option \"-x\""},
        {{"table"}, "unexpected argument \"table\""},
        {{"--compact=yes"}, "--compact takes no value"},
        {{"--help=me"}, "--help takes no value"},
        // conflicts, in either order
        {{"--compact", "--format", "table"}, "--compact applies to --format json only"},
        {{"--format=openmetrics", "--compact"}, "--compact applies to --format json only"},
        {{"--reload", "--resource", "disk"}, "--reload and --resource cannot be combined"},
        {{"--resource", "disk", "--reload"}, "--reload and --resource cannot be combined"},
        {{"--history-mode", "x", "--format", "table"}, "--history-mode and --format cannot be combined"},
        {{"--reload", "--history-mode", "x"}, "--reload and --history-mode cannot be combined"},
        {{"--version", "--help"}, "--help and --version cannot be combined"},
        {{"--watch", "1", "--reload"}, "--reload and --watch cannot be combined"},
        {{"--bytes"}, "--bytes applies to --format table only"},
        {{"--format", "table", "--format", "json"}, "--format given more than once"},
        {{"--watch-count", "2"}, "--watch-count needs --watch"},
        // watch intervals
        {{"--watch", "0"}, "--watch needs seconds from 0.1 to 86400, not \"0\""},
        {{"--watch", "abc"}, "--watch needs seconds from 0.1 to 86400, not \"abc\""},
        {{"--watch=nan"}, "--watch needs seconds from 0.1 to 86400, not \"nan\""},
        {{"--watch=1e9"}, "--watch needs seconds from 0.1 to 86400, not \"1e9\""},
        {{"--watch=2s"}, "--watch needs seconds from 0.1 to 86400, not \"2s\""},
        {{"--watch=1", "--watch-count=-1"}, "--watch-count needs a number of draws, not \"-1\""},
    };
    for (const auto &[arguments, expected] : cases) {
        Options options;
        std::string error;
        EXPECT_FALSE(korvstat::ParseOptions(arguments, options, error)) << expected;
        EXPECT_EQ(error, expected);
    }
}

std::vector<std::string> Lines(const std::string &text)
{
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);)
        lines.push_back(line);
    return lines;
}

// Sets TZ for one scope, for local times that the test can spell out.
class ScopedTimeZone {
public:
    explicit ScopedTimeZone(const char *zone)
    {
        const char *old = getenv("TZ");
        had_ = old != nullptr;
        if (had_)
            old_ = old;
        setenv("TZ", zone, 1);
        tzset();
    }
    ~ScopedTimeZone()
    {
        if (had_)
            setenv("TZ", old_.c_str(), 1);
        else
            unsetenv("TZ");
        tzset();
    }

private:
    bool had_ = false;
    std::string old_;
};

// The counter tables of the three kinds of record agree: names, then
// utilization, reads, writes, with units; "total" last even where the
// result has it first; members of unknown meaning last.
TEST(KorvsnmpStatTables, EveryCounterTableHasOneColumnOrderAndTotalLast)
{
    const Json::Value result = korvtest::ParseJson(R"({
        "network": [{"device": "total", "rx": 3072, "tx": 10}, {"device": "eth0", "rx": 3072, "tx": 10}],
        "disk": {"disk": [{"write_byte": 0, "read_byte": 1536, "utilization": 7, "type": "internal",
                           "display_name": "Disk 1", "device": "sda", "write_access": 2,
                           "read_access": 3, "extra": "x"}],
                 "total": {"device": "total", "utilization": 7, "read_byte": 1536, "read_access": 3,
                           "write_access": 2, "write_byte": 0}},
        "space": {"volume": [{"device": "dm-0", "display_name": "home", "read_byte": 1048575}],
                  "total": {"device": "total", "read_byte": 1048575}},
        "lun": [{"uuid": "6e1f", "lun_name": "vm", "write_byte": 4294967295}],
        "time": 1795000000})");
    ScopedTimeZone zone("Asia/Kolkata");

    std::ostringstream out;
    korvstat::WriteTables(result, false, out);

    EXPECT_THAT(Lines(out.str()), ElementsAre(
        "Sample time  2026-11-18T16:36:40+05:30",
        "",
        "Network interfaces",
        "device  rx (B/s)  tx (B/s)",
        "eth0        3.0K        10",
        "total       3.0K        10",
        "",
        "Disks",
        "device  display_name  type      utilization (%)  read_access (/s)  read_byte (B/s)  "
        "write_access (/s)  write_byte (B/s)  extra",
        "sda     Disk 1        internal                7                 3             1.5K  "
        "                2                 0  x",
        "total   -             -                       7                 3             1.5K  "
        "                2                 0  -",
        "",
        "Volumes",
        "device  display_name  utilization (%)  read_access (/s)  read_byte (B/s)  write_access (/s)  "
        "write_byte (B/s)",
        "dm-0    home                        -                 -             1.0M                  -  "
        "               -",
        "total   -                           -                 -             1.0M                  -  "
        "               -",
        "",
        "iSCSI LUNs",
        "uuid  lun_name  utilization (%)  read_access (/s)  read_byte (B/s)  write_access (/s)  "
        "write_byte (B/s)",
        "6e1f  vm                      -                 -                -                  -  "
        "            4.0G",
        ""));
}

TEST(KorvsnmpStatTables, CpuAndMemoryInAFixedOrderWithBytesOnRequest)
{
    const Json::Value result = korvtest::ParseJson(R"({
        "cpu": {"idle": 88, "iowait": 1, "nice": 0, "steal": 0, "system": 3, "user": 8, "zz": 1},
        "memory": {"avail_real": 1024, "avail_swap": 0, "buffer": 1, "cached": 2, "free_real": 3,
                   "memory_size": 4294967295, "total_real": 2048, "total_swap": 0},
        "nfs": {"calls": 12, "read_byte": 2048, "write_byte": 0},
        "time": "soon"})");

    std::ostringstream human, raw;
    korvstat::WriteTables(result, false, human);
    korvstat::WriteTables(result, true, raw);

    EXPECT_THAT(Lines(human.str()), ElementsAre(
        "Sample time  soon", "",
        "CPU", "state   share (%)", "user            8", "system          3", "nice            0",
        "idle           88", "iowait          1", "steal           0", "zz              1", "",
        "Memory", "member       size (B)", "memory_size      4.0T", "total_real       2.0M",
        "avail_real       1.0M", "free_real        3.0K", "buffer           1.0K", "cached           2.0K",
        "total_swap          0", "avail_swap          0", "",
        "NFS", "read_byte (B/s)  write_byte (B/s)  calls (/s)",
        "           2.0K                 0          12", ""));
    EXPECT_THAT(Lines(raw.str()), ::testing::Contains("memory_size  4398046510080"));
    EXPECT_THAT(Lines(raw.str()), ::testing::Contains("           2048                 0          12"));
}

TEST(KorvsnmpStatTables, ValuesOfUnexpectedShapesAreShownNotThrown)
{
    const Json::Value result =
        korvtest::ParseJson(R"({"cpu": 3, "lun": [1, {"uuid": [2]}], "space": "none", "nfs": null,
                   "network": {"device": "x"}, "disk": {"disk": 5, "total": true},
                   "time": 1e300})");
    std::ostringstream out;
    korvstat::WriteTables(result, false, out);
    EXPECT_THAT(out.str(), HasSubstr("[2]"));
    EXPECT_THAT(out.str(), HasSubstr("Sample time  1.0000000000000001e+300"));
    std::ostringstream scalar;
    korvstat::WriteTables(Json::Value(5), false, scalar);
    EXPECT_EQ(scalar.str(), "5\n");
}

TEST(KorvsnmpStatTables, HumanBytesRoundLikeDf)
{
    const std::pair<double, const char *> cases[] = {
        {0, "0"},           {1023, "1023"},         {1024, "1.0K"},        {1536, "1.5K"},
        {10239, "10K"},     {1048063, "1023K"},     {1048575, "1.0M"},     {1572864, "1.5M"},
        {4398046510080.0, "4.0T"}, {1.2e21, "1041E"},
    };
    for (const auto &[bytes, expected] : cases)
        EXPECT_EQ(korvstat::HumanBytes(bytes), expected) << bytes;
}

TEST(KorvsnmpStatTables, ExactTextScalesKibibytesWithoutOverflow)
{
    using korvstat::Unit;
    const std::tuple<const char *, Unit, const char *> cases[] = {
        {"4294967295", Unit::KiB, "4398046510080"},
        {"18446744073709551615", Unit::KiB, "1.888946593147858e+22"},
        {"18446744073709551615", Unit::PerSecond, "18446744073709551615"},
        {"-3", Unit::KiB, "-3072"},
        {"0.5", Unit::KiB, "512"},
        {"true", Unit::PerSecond, ""},
        {"\"7\"", Unit::PerSecond, ""},
    };
    for (const auto &[json, unit, expected] : cases)
        EXPECT_EQ(korvstat::ExactText(korvtest::ParseJson(json), unit), expected) << json;
}

TEST(KorvsnmpStatOpenMetrics, LabelValuesAreEscapedAndValidUtf8)
{
    const std::pair<std::string, std::string> cases[] = {
        {"Disk 1", "Disk 1"},
        {"say \"hi\"", "say \\\"hi\\\""},
        {"C:\\share", "C:\\\\share"},
        {"two\nlines", "two\\nlines"},
        {"Datenträger 🙂", "Datenträger 🙂"},
        {"latin1 \xE4!", "latin1 \xEF\xBF\xBD!"},
        {"\xC0\xAF", "\xEF\xBF\xBD\xEF\xBF\xBD"},              // overlong '/'
        {"\xED\xA0\x80", "\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD"},  // a surrogate
        {"cut \xE2\x82", "cut \xEF\xBF\xBD\xEF\xBF\xBD"},      // sequence cut short
    };
    for (const auto &[text, expected] : cases)
        EXPECT_EQ(korvstat::EscapeLabelValue(text), expected) << text;
}

struct CommandRun {
    int status;
    std::string out;
};

// Runs a shell command with `input` on its standard input.
CommandRun RunWithInput(const std::string &command, const std::string &input)
{
    char pattern[] = "/tmp/korvsnmp-stat-in-XXXXXX";
    const int fd = mkstemp(pattern);
    EXPECT_EQ(write(fd, input.data(), input.size()), static_cast<ssize_t>(input.size()));
    close(fd);
    CommandRun run{-1, ""};
    FILE *pipe = popen((command + " <" + pattern + " 2>&1").c_str(), "r");
    if (pipe != nullptr) {
        char buffer[4096];
        for (size_t n; (n = fread(buffer, 1, sizeof buffer, pipe)) > 0;)
            run.out.append(buffer, n);
        const int status = pclose(pipe);
        run.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    unlink(pattern);
    return run;
}

// The samples that both Prometheus parsers read from `exposition`, as
// "<family> <unit> <sample> <labels> <value>"; fails the test when either
// parser rejects it or they disagree on a sample.
std::vector<std::string> ParsedSamples(const std::string &exposition)
{
    const CommandRun run = RunWithInput(KORVSNMP_OPENMETRICS_SAMPLES, exposition);
    EXPECT_EQ(run.status, 0) << run.out << "\n" << exposition;
    std::vector<std::string> openmetrics, classic;
    for (const std::string &line : Lines(run.out)) {
        const size_t space = line.find(' ');
        (line.compare(0, space, "openmetrics") == 0 ? openmetrics : classic)
            .push_back(line.substr(space + 1));
    }
    // The classic parser knows no units and reads every value as a float.
    for (std::string &sample : openmetrics) {
        std::istringstream words(sample);
        std::string family, unit;
        words >> family >> unit;
        std::string rest = sample.substr(family.size() + unit.size() + 2);
        const std::string classicForm = family + " - " + rest;
        EXPECT_THAT(classic, ::testing::Contains(classicForm)) << "classic parser lacks " << sample;
    }
    return openmetrics;
}

TEST(KorvsnmpStatOpenMetrics, TheParsersReadEveryNamedRecord)
{
    const Json::Value result = korvtest::ParseJson(R"({
        "memory": {"total_real": 2048, "memory_size": 4294967295},
        "network": [{"device": "total", "rx": 6, "tx": 0}, {"device": "eth0", "rx": 3, "tx": 0},
                    {"device": "eth0", "rx": 3, "tx": 0}, {"device": "ppp0", "rx": "n/a"}],
        "disk": {"disk": [{"device": "sda", "display_name": "Disk \"1\" \\ a\nb", "type": "usb",
                           "utilization": 7, "read_byte": 1536, "queue-depth": 2, "note": "x"}],
                 "total": {"device": "total", "utilization": 7, "read_byte": 1536}},
        "space": {"volume": [{"device": "dm-0", "display_name": "h\u00e4me \u00ff", "write_byte": 1}],
                  "total": {"device": "total", "write_byte": 1}},
        "lun": [{"uuid": "6e1f", "lun_name": "vm", "read_access": 4.5}],
        "nfs": {"calls": 12},
        "time": 1795000000})");
    std::ostringstream out;
    korvstat::WriteOpenMetrics(result, out);

    EXPECT_THAT(Lines(out.str()).back(), "# EOF");
    EXPECT_THAT(ParsedSamples(out.str()), ElementsAre(
        "korvsnmp_memory_size_bytes bytes korvsnmp_memory_size_bytes {} 4398046510080.0",
        "korvsnmp_memory_total_real_bytes bytes korvsnmp_memory_total_real_bytes {} 2097152.0",
        "korvsnmp_network_receive_bytes_per_second bytes_per_second "
        "korvsnmp_network_receive_bytes_per_second {\"device\": \"total\"} 6.0",
        "korvsnmp_network_receive_bytes_per_second bytes_per_second "
        "korvsnmp_network_receive_bytes_per_second {\"device\": \"eth0\"} 3.0",
        "korvsnmp_network_transmit_bytes_per_second bytes_per_second "
        "korvsnmp_network_transmit_bytes_per_second {\"device\": \"total\"} 0.0",
        "korvsnmp_network_transmit_bytes_per_second bytes_per_second "
        "korvsnmp_network_transmit_bytes_per_second {\"device\": \"eth0\"} 0.0",
        "korvsnmp_disk_utilization_percent percent korvsnmp_disk_utilization_percent "
        "{\"device\": \"sda\", \"display_name\": \"Disk \\\"1\\\" \\\\ a\\nb\", \"type\": \"usb\"} 7.0",
        "korvsnmp_disk_utilization_percent percent korvsnmp_disk_utilization_percent "
        "{\"device\": \"total\"} 7.0",
        "korvsnmp_disk_read_bytes_per_second bytes_per_second korvsnmp_disk_read_bytes_per_second "
        "{\"device\": \"sda\", \"display_name\": \"Disk \\\"1\\\" \\\\ a\\nb\", \"type\": \"usb\"} 1536.0",
        "korvsnmp_disk_read_bytes_per_second bytes_per_second korvsnmp_disk_read_bytes_per_second "
        "{\"device\": \"total\"} 1536.0",
        "korvsnmp_disk_queue_depth - korvsnmp_disk_queue_depth "
        "{\"device\": \"sda\", \"display_name\": \"Disk \\\"1\\\" \\\\ a\\nb\", \"type\": \"usb\"} 2.0",
        "korvsnmp_volume_write_bytes_per_second bytes_per_second korvsnmp_volume_write_bytes_per_second "
        "{\"device\": \"dm-0\", \"display_name\": \"h\\u00e4me \\u00ff\"} 1.0",
        "korvsnmp_volume_write_bytes_per_second bytes_per_second korvsnmp_volume_write_bytes_per_second "
        "{\"device\": \"total\"} 1.0",
        "korvsnmp_lun_read_accesses_per_second accesses_per_second "
        "korvsnmp_lun_read_accesses_per_second {\"device\": \"6e1f\", \"display_name\": \"vm\"} 4.5",
        "korvsnmp_nfs_calls_per_second calls_per_second korvsnmp_nfs_calls_per_second {} 12.0",
        "korvsnmp_sample_timestamp_seconds seconds korvsnmp_sample_timestamp_seconds {} 1795000000.0"));
}

TEST(KorvsnmpStatOpenMetrics, NothingButEofForAResultWithoutNumbers)
{
    const char *const cases[] = {"null", "[]", R"({"cpu": [1], "disk": 3, "time": "x"})"};
    for (const char *json : cases) {
        std::ostringstream out;
        korvstat::WriteOpenMetrics(korvtest::ParseJson(json), out);
        EXPECT_EQ(out.str(), "# EOF\n") << json;
    }
}

TEST(KorvsnmpStatWatch, DrawsWaitsAndStopsOnCountOrInterruption)
{
    struct Case {
        unsigned count;
        int waitsBeforeInterrupt;  // -1: never interrupted
        int draws;
        int status;
    };
    const Case cases[] = {
        {1, -1, 1, 7},  // one draw, no wait, its status
        {3, -1, 3, 7},
        {0, 4, 5, 0},   // no limit: until interrupted, then 0
        {9, 1, 2, 0},
    };
    for (const Case &c : cases) {
        int draws = 0;
        std::vector<std::chrono::milliseconds> waits;
        const int status = korvstat::Watch(
            std::chrono::milliseconds(2500), c.count, [&] { return ++draws, 7; },
            [&](std::chrono::milliseconds interval) {
                waits.push_back(interval);
                return static_cast<int>(waits.size()) != c.waitsBeforeInterrupt + 1;
            });
        EXPECT_EQ(draws, c.draws);
        EXPECT_EQ(status, c.status);
        EXPECT_EQ(waits.size(), static_cast<size_t>(c.draws - (c.status == 0 ? 0 : 1)));
        for (auto interval : waits)
            EXPECT_EQ(interval.count(), 2500);
    }
}

// A signal pending before the wait ends it at once, however long the
// interval; without one, a zero interval returns as a timeout.
TEST(KorvsnmpStatWatch, TheWaitEndsOnAPendingStopSignal)
{
    for (int signal : {SIGINT, SIGTERM}) {
        sigset_t stop, previous;
        sigemptyset(&stop);
        sigaddset(&stop, signal);
        sigprocmask(SIG_BLOCK, &stop, &previous);
        raise(signal);
        EXPECT_FALSE(korvstat::WaitUnlessInterrupted(std::chrono::hours(1)));
        sigset_t pending;
        sigpending(&pending);
        EXPECT_FALSE(sigismember(&pending, signal)) << "the signal was taken";
        sigprocmask(SIG_SETMASK, &previous, nullptr);
    }
    EXPECT_TRUE(korvstat::WaitUnlessInterrupted(std::chrono::milliseconds(0)));
}

}  // namespace

namespace {

struct ProgramRun {
    int status;
    std::string out;
    std::string err;
};

// Runs the built korvsnmp-stat with `arguments` (shell words), `environment`
// (shell assignments) before it.
ProgramRun RunStat(const std::string &arguments, const std::string &environment = "")
{
    char pattern[] = "/tmp/korvsnmp-stat-err-XXXXXX";
    int errFd = mkstemp(pattern);
    close(errFd);
    const std::string command =
        korvtest::RedirectedChildPrefix() + environment + " " + KORVSNMP_STAT_PATH + " " + arguments +
        " 2>" + pattern;
    ProgramRun run{-1, "", ""};
    FILE *pipe = popen(command.c_str(), "r");
    if (pipe == nullptr)
        return run;
    char buffer[4096];
    for (size_t n; (n = fread(buffer, 1, sizeof buffer, pipe)) > 0;)
        run.out.append(buffer, n);
    int status = pclose(pipe);
    run.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    std::ifstream err(pattern);
    run.err.assign(std::istreambuf_iterator<char>(err), std::istreambuf_iterator<char>());
    unlink(pattern);
    return run;
}

const char kCpuAndNfsReply[] =
    R"({"data": {"System": [{"user": 12, "idle": 88}], "NFS": {"read_byte": 5}, "time": 1795000000}})";

TEST(KorvsnmpStatProgram, PrintsTheAssembledResultAsJsonTablesAndOpenMetrics)
{
    korvtest::TestCollector collector;
    for (int i = 0; i < 3; ++i)
        collector.Script({korvtest::Frame(kCpuAndNfsReply)});

    ProgramRun json = RunStat("--resource cpu,nfs --compact");
    ProgramRun table = RunStat("--resource=nfs,cpu --format=table", "TZ=America/St_Johns");
    ProgramRun metrics = RunStat("--resource cpu --format openmetrics");

    EXPECT_EQ(json.status, 0) << json.err;
    EXPECT_EQ(json.out,
              "{\"cpu\":{\"idle\":88,\"user\":12},\"nfs\":{\"read_byte\":5},\"time\":1795000000}\n");
    EXPECT_EQ(table.status, 0) << table.err;
    EXPECT_THAT(Lines(table.out),
                ElementsAre("Sample time  2026-11-18T07:36:40-03:30", "", "CPU", "state  share (%)",
                            "user          12", "idle          88", "", "NFS",
                            "read_byte (B/s)  write_byte (B/s)  calls (/s)",
                            "              5                 -           -", ""));
    EXPECT_EQ(metrics.status, 0) << metrics.err;
    EXPECT_THAT(ParsedSamples(metrics.out),
                ElementsAre("korvsnmp_cpu_user_percent percent korvsnmp_cpu_user_percent {} 12.0",
                            "korvsnmp_cpu_idle_percent percent korvsnmp_cpu_idle_percent {} 88.0",
                            "korvsnmp_sample_timestamp_seconds seconds "
                            "korvsnmp_sample_timestamp_seconds {} 1795000000.0"));
    ASSERT_TRUE(collector.WaitForConnections(3));
    EXPECT_EQ(collector.Requests().at(0),
              korvtest::Frame(std::string("{\"resource\":[\"cpu\",\"nfs\"]}\n") + '\0'));
}

TEST(KorvsnmpStatProgram, NoCollectorIsAClearLineAndAFailingStatus)
{
    korvtest::NoCollector absent;

    ProgramRun run = RunStat("");

    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(run.out, "");
    EXPECT_THAT(run.err, HasSubstr("Failed to connect to socket: [/tmp/korvsnmpcd.sock]"));  // the library's
    EXPECT_THAT(Lines(run.err).back(),
                ::testing::Eq("korvsnmp-stat: no statistics from the collector on /tmp/korvsnmpcd.sock"));
}

TEST(KorvsnmpStatProgram, BadCommandLinesExitWithUsageAndVersionAnswers)
{
    const std::pair<const char *, const char *> cases[] = {
        {"--format xml", "korvsnmp-stat: unknown format \"xml\"\n\nUsage:"},
        {"--compact --format table", "korvsnmp-stat: --compact applies to --format json only\n\nUsage:"},
        {"--reload --resource disk", "korvsnmp-stat: --reload and --resource cannot be combined\n\nUsage:"},
        {"--history-mode ''", "korvsnmp-stat: --history-mode needs a reason that is not empty\n\nUsage:"},
    };
    for (const auto &[arguments, message] : cases) {
        ProgramRun run = RunStat(arguments);
        EXPECT_EQ(run.status, 2) << arguments;
        EXPECT_EQ(run.out, "");
        EXPECT_THAT(run.err, ::testing::StartsWith(message));
    }
    ProgramRun version = RunStat("--version");
    EXPECT_EQ(version.status, 0);
    EXPECT_THAT(version.out, ::testing::MatchesRegex("korvsnmp-stat [0-9]+\\.[0-9]+\\.[0-9]+\n"));
}

// Whether `pid` blocks `signal` now (/proc/PID/status, SigBlk).
bool Blocks(pid_t pid, int signal)
{
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);)
        if (line.rfind("SigBlk:", 0) == 0)
            return (std::stoull(line.substr(7), nullptr, 16) >> (signal - 1)) & 1;
    return false;
}

// --watch draws, then waits; SIGTERM in the wait ends it with status 0.
TEST(KorvsnmpStatProgram, WatchRedrawsUntilInterrupted)
{
    korvtest::TestCollector collector;
    collector.Script({korvtest::Frame(kCpuAndNfsReply)});
    // The child's environment: ours, with the redirection to the test collector.
    std::vector<std::string> variables = korvtest::RedirectedChildVariables();
    for (char **variable = environ; *variable != nullptr; ++variable) {
        const std::string entry = *variable;
        const std::string key = entry.substr(0, entry.find('=') + 1);
        if (std::none_of(variables.begin(), variables.end(),
                         [&](const std::string &v) { return v.rfind(key, 0) == 0; }))
            variables.push_back(entry);
    }
    std::vector<char *> envp;
    for (std::string &variable : variables)
        envp.push_back(variable.data());
    envp.push_back(nullptr);
    const char *const argv[] = {KORVSNMP_STAT_PATH, "--watch", "3600", "--resource", "nfs",
                                "--compact", nullptr};
    int output[2];
    ASSERT_EQ(pipe(output), 0);
    const pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        dup2(output[1], STDOUT_FILENO);
        close(output[0]);
        close(output[1]);
        execve(KORVSNMP_STAT_PATH, const_cast<char *const *>(argv), envp.data());
        _exit(127);
    }
    close(output[1]);

    ASSERT_TRUE(collector.WaitForConnections(1));
    // The interval's wait has begun once SIGTERM is blocked; poll for it.
    for (int polls = 0; polls < 5000 && !Blocks(child, SIGTERM); ++polls)
        usleep(1000);
    EXPECT_TRUE(Blocks(child, SIGTERM));
    kill(child, SIGTERM);
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    std::string out;
    char buffer[4096];
    for (ssize_t n; (n = read(output[0], buffer, sizeof buffer)) > 0;)
        out.append(buffer, static_cast<size_t>(n));
    close(output[0]);

    ASSERT_TRUE(WIFEXITED(status)) << "ended by signal " << WTERMSIG(status);
    EXPECT_EQ(WEXITSTATUS(status), 0);
    EXPECT_EQ(out, "{\"nfs\":{\"read_byte\":5},\"time\":1795000000}\n");  // no escapes: not a terminal
}

}  // namespace
