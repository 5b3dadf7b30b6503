// korvsnmp-stat's command line and its tables.
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <iterator>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <json/reader.h>

#include "options.h"
#include "table_format.h"
#include "test_collector.h"

namespace {

using korvstat::Action;
using korvstat::Format;
using korvstat::Options;
using ::testing::ElementsAre;

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
        {{"--compact"}, Action::Statistics, Format::CompactJson, {"all"}, ""},
        {{"--format", "table", "--format", "json"}, Action::Statistics, Format::PrettyJson, {"all"}, ""},
        {{"--reload"}, Action::Reload, Format::PrettyJson, {"all"}, ""},
        {{"--history-mode", "backup window"}, Action::HistoryMode, Format::PrettyJson, {"all"},
         "backup window"},
        {{"-h"}, Action::Help, Format::PrettyJson, {"all"}, ""},
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

TEST(KorvsnmpStatOptions, BadCommandLinesSayWhatIsWrong)
{
    const std::pair<std::vector<std::string>, std::string> cases[] = {
        {{"--resource", "cpu,bogus"}, "unknown resource \"bogus\""},
        {{"--resource", ""}, "--resource needs at least one name"},
        {{"--resource"}, "--resource needs a value"},
        {{"--history-mode"}, "--history-mode needs a value"},
        {{"--format", "xml"}, "unknown format \"xml\""},
        {{"--verbose"}, "unknown argument \"--verbose\""},
    };
    for (const auto &[arguments, expected] : cases) {
        Options options;
        std::string error;
        EXPECT_FALSE(korvstat::ParseOptions(arguments, options, error));
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

TEST(KorvsnmpStatTables, SectionsAreAlignedTablesWithPreferredColumnsFirst)
{
    Json::Value result;
    ASSERT_TRUE(Json::Reader().parse(R"({
        "disk": {"disk": [{"device": "sda", "display_name": "Disk 1", "type": "internal",
                           "utilization": 7, "read_byte": 123456, "extra": "x"}],
                 "total": {"device": "total", "utilization": 7, "read_byte": 123456}},
        "network": [{"device": "total", "rx": 5, "tx": 10}, {"device": "eth0", "rx": 5, "tx": 10}],
        "time": 1795000000})", result));

    std::ostringstream out;
    korvstat::WriteTables(result, out);

    EXPECT_THAT(Lines(out.str()),
                ElementsAre("Network interfaces",
                            "device  rx  tx",
                            "total    5  10",
                            "eth0     5  10",
                            "",
                            "Disks",
                            "display_name  type      device  utilization  read_byte  extra",
                            "Disk 1        internal  sda               7     123456  x",
                            "-             -         total             7     123456  -",
                            "",
                            "Time  1795000000"));
}

TEST(KorvsnmpStatTables, ValuesOfUnexpectedShapesAreShownNotThrown)
{
    Json::Value result;
    ASSERT_TRUE(Json::Reader().parse(
        R"({"cpu": 3, "lun": [1, {"uuid": [2]}], "space": "none", "nfs": null})", result));
    std::ostringstream out;
    korvstat::WriteTables(result, out);
    EXPECT_THAT(out.str(), ::testing::HasSubstr("[2]"));
    std::ostringstream scalar;
    korvstat::WriteTables(Json::Value(5), scalar);
    EXPECT_EQ(scalar.str(), "5\n");
}

}  // namespace

namespace {

struct ProgramRun {
    int status;
    std::string out;
    std::string err;
};

// Runs the built korvsnmp-stat with `arguments` (shell words).
ProgramRun RunStat(const std::string &arguments)
{
    char pattern[] = "/tmp/korvsnmp-stat-err-XXXXXX";
    int errFd = mkstemp(pattern);
    close(errFd);
    const std::string command =
        korvtest::RedirectedChildPrefix() + KORVSNMP_STAT_PATH + " " + arguments + " 2>" + pattern;
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
    R"({"data": {"System": [{"user": 12, "idle": 88}], "NFS": {"read": 5}, "time": 1795000000}})";

TEST(KorvsnmpStatProgram, PrintsTheAssembledResultAsJsonAndTables)
{
    korvtest::TestCollector collector;
    for (int i = 0; i < 2; ++i)
        collector.Script({korvtest::Frame(kCpuAndNfsReply)});

    ProgramRun json = RunStat("--resource cpu,nfs --compact");
    ProgramRun table = RunStat("--resource nfs,cpu --format table");

    EXPECT_EQ(json.status, 0) << json.err;
    EXPECT_EQ(json.out, "{\"cpu\":{\"idle\":88,\"user\":12},\"nfs\":{\"read\":5},\"time\":1795000000}\n");
    EXPECT_EQ(table.status, 0) << table.err;
    EXPECT_THAT(Lines(table.out), ElementsAre("CPU", "member  value", "idle    88", "user    12", "",
                                              "NFS", "member  value", "read    5", "",
                                              "Time  1795000000"));
    ASSERT_TRUE(collector.WaitForConnections(2));
    EXPECT_EQ(collector.Requests().at(0),
              korvtest::Frame(std::string("{\"resource\":[\"cpu\",\"nfs\"]}\n") + '\0'));
}

TEST(KorvsnmpStatProgram, NoCollectorIsAClearLineAndAFailingStatus)
{
    korvtest::NoCollector absent;

    ProgramRun run = RunStat("");

    EXPECT_EQ(run.status, 1);
    EXPECT_EQ(run.out, "");
    EXPECT_THAT(run.err, ::testing::HasSubstr(
                             "Failed to connect to socket: [/tmp/korvsnmpcd.sock]"));  // the library's
    EXPECT_THAT(Lines(run.err).back(),
                ::testing::Eq("korvsnmp-stat: no statistics from the collector on /tmp/korvsnmpcd.sock"));
}

TEST(KorvsnmpStatProgram, BadCommandLineExitsWithUsage)
{
    ProgramRun run = RunStat("--format xml");
    EXPECT_EQ(run.status, 2);
    EXPECT_THAT(run.err, ::testing::StartsWith("korvsnmp-stat: unknown format \"xml\"\n\nUsage:"));
}

}  // namespace
