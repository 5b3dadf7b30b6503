// korvsnmp-stat --top in a real terminal: tmux runs it in a pane of 80x24,
// then of 200x50, against the large appliance that korvsnmpcd replays; the
// screen is read back with capture-pane and the keys typed with send-keys.
#include <signal.h>
#include <stdlib.h>
#include <unistd.h>

#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include "collector_process.h"
#include "host_file.h"
#include "json_text.h"
#include "options.h"
#include "korv_standin.h"
#include "korvsnmp/korvsnmp.h"
#include "platform_test.h"
#include "shell_command.h"
#include "test_collector.h"
#include "top_layout.h"

namespace {

using ::testing::Contains;
using ::testing::Each;
using ::testing::HasSubstr;
using ::testing::StartsWith;

constexpr char kHostFile[] = KORVSNMP_EXAMPLES_DIR "/large-appliance.host.json";
constexpr char kReplyFile[] = KORVSNMP_EXAMPLES_DIR "/large-appliance.reply.json";
constexpr char kTmux[] = "/usr/bin/tmux";
constexpr char kPane[] = "top";

std::vector<std::string> Lines(const std::string &text)
{
    std::vector<std::string> lines;
    std::istringstream stream(text);
    for (std::string line; std::getline(stream, line);)
        lines.push_back(line);
    return lines;
}

// A tmux server of its own (its socket in a private directory, no
// configuration), stopped by its process id.
class Tmux {
public:
    explicit Tmux(const std::string &directory)
        : socket_(directory + "/tmux.sock"), status_(directory + "/tmux.status")
    {
    }
    ~Tmux()
    {
        if (pid_ > 0 && kill(pid_, SIGTERM) == 0)
            korvtest::Eventually([&] { return kill(pid_, 0) != 0; });
        unlink(socket_.c_str());
        unlink(status_.c_str());
    }

    std::string Run(const std::string &arguments) const
    {
        return korvtest::RunCommand(std::string(kTmux) + " -S " + korvtest::ShellQuoted(socket_) +
                                    " -f /dev/null " + arguments);
    }

    // Starts `command` (run by sh) in a new detached pane of `width` x
    // `height`; its exit status goes to a file for Exit().
    bool Start(const std::string &command, int width, int height)
    {
        unlink(status_.c_str());
        Run("new-session -d -s " + std::string(kPane) + " -x " + std::to_string(width) + " -y " +
            std::to_string(height) + " " +
            korvtest::ShellQuoted(command + "; echo $? > " + korvtest::ShellQuoted(status_)));
        pid_ = atoi(Run("display-message -p -t " + std::string(kPane) + " '#{pid}'").c_str());
        return pid_ > 0;
    }

    std::vector<std::string> Screen() const { return Lines(Run("capture-pane -p -t " + std::string(kPane))); }

    // The first screen on which `line` of the screen holds `part`, or the last one seen.
    std::vector<std::string> ScreenWhere(size_t line, const std::string &part) const
    {
        std::vector<std::string> screen;
        korvtest::Eventually([&] {
            screen = Screen();
            return screen.size() > line && screen[line].find(part) != std::string::npos;
        });
        return screen;
    }

    void Keys(const std::string &keys) const { Run("send-keys -t " + std::string(kPane) + " " + keys); }

    // The exit status of the pane's program, "" while it runs.
    std::string Exit() const
    {
        std::string exit;
        korvtest::Eventually([&] { return !(exit = korvtest::ReadWholeFile(status_)).empty(); });
        return exit;
    }

private:
    std::string socket_, status_;
    int pid_ = -1;
};

// Every line of `screen` at most `width` characters wide.
std::vector<size_t> LineWidths(const std::vector<std::string> &screen)
{
    std::vector<size_t> widths;
    for (const std::string &line : screen)
        widths.push_back(korvstat::top::Width(line));
    return widths;
}

// The live view in `tmux`, as the redirected child that reaches this
// process's private collector path, on the large appliance's host.
bool StartView(Tmux &tmux, int width, int height)
{
    return tmux.Start(korvtest::RedirectedChildPrefix() + std::string(korvstandin::kHostFileVariable) + "=" +
                          korvtest::ShellQuoted(kHostFile) + " " KORVSNMP_STAT_PATH " --top --watch 0.5",
                      width, height);
}

std::string PrivateDirectory()
{
    const std::string &socket = korvtest::PrivateCollectorPath();
    return socket.substr(0, socket.rfind('/'));
}

TEST(KorvsnmpTopOptions, TopTakesAnIntervalAndNoOutputOptions)
{
    korvstat::Options options;
    std::string error;
    ASSERT_TRUE(korvstat::ParseOptions({"--top", "--watch=0.5"}, options, error)) << error;
    EXPECT_TRUE(options.top);
    EXPECT_EQ(options.watchSeconds, 0.5);
    const std::pair<std::vector<std::string>, std::string> refused[] = {
        {{"--top", "--format", "table"}, "--top and --format cannot be combined"},
        {{"--top", "--resource=disk"}, "--top and --resource cannot be combined"},
        {{"--bytes", "--top"}, "--top and --bytes cannot be combined"},
        {{"--top", "--compact"}, "--top and --compact cannot be combined"},
        {{"--top", "--watch=1", "--watch-count=2"}, "--top and --watch-count cannot be combined"},
        {{"--top", "--output", "top.txt"}, "--top and --output cannot be combined"},
        {{"--top", "--reload"}, "--reload and --top cannot be combined"},
        {{"--top=yes"}, "--top takes no value"},
        {{"--top", "--top"}, "--top given more than once"}};
    for (const auto &[arguments, expected] : refused) {
        korvstat::Options refusedOptions;
        EXPECT_FALSE(korvstat::ParseOptions(arguments, refusedOptions, error)) << expected;
        EXPECT_EQ(error, expected);
    }
}

TEST(KorvsnmpTopOptions, WithoutATerminalTheViewSaysSoAndFails)
{
    korvtest::CollectorProcess view(KORVSNMP_STAT_PATH, {"--top"}, PrivateDirectory() + "/top.out");
    EXPECT_EQ(view.WaitForExit(), 1);
    EXPECT_EQ(view.Log(), "korvsnmp-stat: --top needs a terminal\n");
}

using KorvsnmpTop = korvtest::PlatformTest;

TEST_F(KorvsnmpTop, FitsTheTerminalShowsTheBusiestDiskFirstFollowsAResizeAndQuitsWithQ)
{
    ASSERT_EQ(access(kTmux, X_OK), 0) << "tmux is not installed";
    // The busiest disk as the library names it in this process, from the same files.
    setenv(korvstandin::kHostFileVariable, kHostFile, 1);
    korvstandin::UseProcessHost();
    Json::Value result;
    ASSERT_TRUE(SNMPParseReplyData(Json::Value(Json::objectValue),
                                   korvtest::ParseJson(korvtest::ReadWholeFile(kReplyFile)), result));
    const Json::Value *busiest = nullptr;
    for (const Json::Value &disk : result["disk"]["disk"])
        if (busiest == nullptr || disk["utilization"].asDouble() > (*busiest)["utilization"].asDouble())
            busiest = &disk;
    ASSERT_NE(busiest, nullptr);
    const std::string busiestName = (*busiest)["display_name"].asString();

    const std::string &socket = korvtest::PrivateCollectorPath();
    korvtest::CollectorProcess collector(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay", kReplyFile},
                                         socket + ".log");
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << collector.Log();

    Tmux tmux(PrivateDirectory());
    ASSERT_TRUE(StartView(tmux, 80, 24));

    const size_t titles = korvstat::top::kTitleLine;
    std::vector<std::string> screen = tmux.ScreenWhere(titles + 1, busiestName + " ");
    ASSERT_EQ(screen.size(), 24u) << ::testing::PrintToString(screen);
    EXPECT_THAT(LineWidths(screen), Each(::testing::Le(80u))) << ::testing::PrintToString(screen);
    EXPECT_THAT(screen[0], StartsWith("korvsnmp-stat --top  20"));
    EXPECT_THAT(screen[1], StartsWith("[1 Disks]"));
    EXPECT_THAT(screen[1], HasSubstr("rows 1-21 of 72"));
    for (const char *title : {"name", "%util", "r/s", "rkB/s", "w/s", "wkB/s"})
        EXPECT_THAT(screen[titles], HasSubstr(title));
    EXPECT_THAT(screen[titles + 1], HasSubstr(busiestName + " "));
    EXPECT_THAT(screen[titles + 1], HasSubstr("[#"));

    // Larger: the columns dropped at 80 come back, and more rows.
    tmux.Run("resize-window -t " + std::string(kPane) + " -x 200 -y 50");
    screen = tmux.ScreenWhere(1, "rows 1-47 of 72");
    ASSERT_EQ(screen.size(), 50u) << ::testing::PrintToString(screen);
    EXPECT_THAT(LineWidths(screen), Each(::testing::Le(200u))) << ::testing::PrintToString(screen);
    EXPECT_THAT(screen[titles], StartsWith("device name"));
    EXPECT_THAT(screen[titles], HasSubstr(" type "));
    EXPECT_THAT(screen[titles + 1], HasSubstr(busiestName + " "));

    // Another section, then q.
    tmux.Keys("4");
    screen = tmux.ScreenWhere(1, "[4 LUNs]");
    EXPECT_THAT(screen[1], HasSubstr("of 512"));
    EXPECT_THAT(screen, Contains(StartsWith("uuid")));
    tmux.Keys("q");
    EXPECT_EQ(tmux.Exit(), "0\n");
    EXPECT_EQ(collector.Stop(SIGTERM), 0) << collector.Log();
}

// The keys answer while the collector holds the sample: the sampler waits, not the view.
TEST_F(KorvsnmpTop, AStalledCollectorHoldsNeitherTheKeysNorTheExit)
{
    korvtest::TestCollector collector;
    collector.Script({"", false});
    Tmux tmux(PrivateDirectory());
    ASSERT_TRUE(StartView(tmux, 80, 24));
    EXPECT_THAT(tmux.ScreenWhere(0, "waiting for the first sample")[0], HasSubstr("waiting for the first sample"));
    tmux.Keys("4");
    const std::vector<std::string> screen = tmux.ScreenWhere(1, "[4 LUNs]");
    ASSERT_GT(screen.size(), 1u);
    EXPECT_THAT(screen[1], StartsWith(" 1 Disks  2 Interfaces  3 Volumes [4 LUNs]  rows 0 of 0"));
    tmux.Keys("q");
    EXPECT_EQ(tmux.Exit(), "0\n");
    EXPECT_TRUE(collector.WaitForConnections(1));
}

TEST_F(KorvsnmpTop, AFailedSampleIsSaidOnTheFirstLine)
{
    const korvtest::NoCollector none;
    Tmux tmux(PrivateDirectory());
    ASSERT_TRUE(StartView(tmux, 120, 30));
    const std::string failure = "no statistics from the collector on /tmp/korvsnmpcd.sock (the last sample stays)";
    EXPECT_THAT(tmux.ScreenWhere(0, "no statistics")[0], StartsWith("korvsnmp-stat --top  -  " + failure));
    tmux.Keys("q");
    EXPECT_EQ(tmux.Exit(), "0\n");
}

}  // namespace
