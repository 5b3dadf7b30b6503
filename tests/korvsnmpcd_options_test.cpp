// korvsnmpcd's command line, its daemon mode (descriptors, process id file,
// where it logs) and its recorded replies (--record, --replay).
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include "collector_process.h"
#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "json_text.h"

namespace {

using korvtest::CollectorProcess;
using ::testing::Eq;
using ::testing::HasSubstr;

const std::string kStatistics = korvproto::EncodeRequestFrame(korvtest::ParseJson("{\"resource\":[\"all\"]}"));
const std::string kReload = korvproto::EncodeRequestFrame(korvtest::ParseJson("{\"request\":\"reload\"}"));

std::string TestPath(const char *tag) { return "/tmp/korvsnmpcd-opt-" + std::to_string(getpid()) + "-" + tag; }

// A bad argument: what is wrong, on stderr, and the usage error status.
::testing::Matcher<std::string> Refused(const std::string &error) {
    return Eq("korvsnmpcd: " + error + "\nTry 'korvsnmpcd --help'.\n"); }

TEST(KorvsnmpcdProgram, ExitStatusAndOutputOfTheCommandLine)
{
    constexpr int kUsageError = 2;
    const struct { std::vector<std::string> args; int status; ::testing::Matcher<std::string> output; }
        cases[] = {
        {{"--interval", "0"}, kUsageError, Refused("--interval [0] is out of range: from 0.01 to 3600 seconds")},
        {{"--interval", "abc"}, kUsageError, Refused("--interval [abc] is not a number of seconds")},
        {{"--interval", "5000"}, kUsageError, Refused("--interval [5000] is out of range: from 0.01 to 3600 seconds")},
        {{"--interval", "1s"}, kUsageError, Refused("--interval [1s] is not a number of seconds")},
        {{"--client-timeout"}, kUsageError, Refused("--client-timeout needs a value")},
        {{"--max-connections=0"}, kUsageError, Refused("--max-connections [0] is not a whole number from 1 to 1000000")},
        {{"--socket="}, kUsageError, Refused("--socket needs a non-empty path")},
        {{"--proc-root="}, kUsageError, Refused("--proc-root needs a non-empty path")},
        {{"--sys-root"}, kUsageError, Refused("--sys-root needs a value")},
        {{"--daemon=yes"}, kUsageError, Refused("--daemon takes no value")},
        {{"--verbose"}, kUsageError, Refused("unknown option [--verbose]")},
        {{"extra"}, kUsageError, Refused("unexpected argument [extra]")},
        {{"--daemon", "--foreground"}, kUsageError, Refused("--daemon and --foreground exclude each other")},
        {{"--replay", "r.json", "--simulate", "s.json"}, kUsageError, Refused("--replay and --simulate exclude each other")},
        {{"--foreground", "--simulate", "/nonexistent/s.json"}, 1,
         HasSubstr("Cannot read the appliance [/nonexistent/s.json]")},
        {{"--version"}, 0, Eq(std::string("korvsnmpcd ") + KORVSNMP_PROJECT_VERSION + "\n")},
        // What stops it from starting goes to stderr, with or without --foreground or --daemon.
        {{"--replay", "/nonexistent/reply.json"}, 1,
         HasSubstr("Cannot read the reply to replay from [/nonexistent/reply.json]")},
        {{"--daemon", "--replay", "/nonexistent/reply.json"}, 1,
         HasSubstr("Cannot read the reply to replay from [/nonexistent/reply.json]")},
        {{"--foreground", "--replay", "/nonexistent/r.json"}, 1,
         HasSubstr("Cannot read the reply to replay from [/nonexistent/r.json]")},
        {{"--probe", "--socket", "/nonexistent/k.sock"}, 1, Eq("")}};  // nothing listens there
    for (const auto &c : cases) {
        // A bad argument wrongly accepted must not start a daemon on the fixed path.
        std::vector<std::string> args = {"--socket", TestPath("cli.sock")};  // a later --socket wins
        args.insert(args.end(), c.args.begin(), c.args.end());
        CollectorProcess program(KORVSNMPCD_PATH, args, TestPath("cli.log"));
        EXPECT_EQ(program.WaitForExit(), c.status) << c.args[0];
        EXPECT_THAT(program.Log(), c.output) << c.args[0];
    }
}

// Whether `pid` runs, as a process that has not exited.
bool Running(pid_t pid)
{
    std::string stat = korvtest::ReadWholeFile("/proc/" + std::to_string(pid) + "/stat");
    return stat.rfind(") ") != std::string::npos && stat[stat.rfind(") ") + 2] != 'Z';
}

TEST(KorvsnmpcdProgram, DaemonKeepsNoneOfItsCallersDescriptors)
{
    constexpr int kCallersPipe = 251;  // as a calling script might hold one
    const std::string socket = TestPath("daemon.sock"), pidFile = TestPath("daemon.pid");
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    korvproto::UniqueFd readEnd(ends[0]);
    CollectorProcess caller(KORVSNMPCD_PATH, {"--daemon", "--socket", socket, "--pidfile", pidFile},
                            TestPath("daemon.log"), ends[1], kCallersPipe);
    close(ends[1]);
    ASSERT_EQ(caller.WaitForExit(), 0) << caller.Log();  // it returns once the daemon is ready
    const pid_t daemon = std::stoi(korvtest::ReadWholeFile(pidFile));
    ASSERT_GT(daemon, 1);
    EXPECT_TRUE(Running(daemon));
    EXPECT_EQ(korvtest::ExchangeWith(socket, kReload), "{\"success\":true}");
    CollectorProcess probe(KORVSNMPCD_PATH, {"--probe", "--socket", socket}, TestPath("probe.log"));
    EXPECT_EQ(probe.WaitForExit(), 0);

    // Neither the caller nor the daemon holds the pipe's write end: it reads as ended at once.
    pollfd ended = {readEnd.Get(), POLLIN, 0};
    EXPECT_TRUE(poll(&ended, 1, 2000) == 1 && (ended.revents & POLLHUP)) << ended.revents;
    const std::string fds = "/proc/" + std::to_string(daemon) + "/fd/";
    EXPECT_NE(access((fds + std::to_string(kCallersPipe)).c_str(), F_OK), 0);
    std::error_code ec;
    for (const char *stream : {"0", "1", "2"})
        EXPECT_EQ(std::filesystem::read_symlink(fds + stream, ec).string(), "/dev/null") << stream;

    ASSERT_EQ(kill(daemon, SIGTERM), 0);  // by its id, from the process id file
    EXPECT_TRUE(korvtest::Eventually([&] { return access(pidFile.c_str(), F_OK) != 0 && !Running(daemon); }))
        << "process id file left behind, or the daemon still runs";
    if (Running(daemon)) kill(daemon, SIGKILL);  // leave nothing behind when SIGTERM did not stop it
    EXPECT_NE(access(socket.c_str(), F_OK), 0);
}

TEST(KorvsnmpcdReplay, ReadyToTheServiceManagerRecordedReplyServedAndFollowingItsFile)
{
    const std::string socket = TestPath("replay.sock"), recorded = TestPath("recorded.json"),
                      manager = TestPath("notify.sock"), replayed = TestPath("replayed.json");
    for (const std::string &path : {recorded, manager}) unlink(path.c_str());
    korvproto::UniqueFd listener(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const sockaddr_un address = korvtest::SocketAddress(manager);
    ASSERT_EQ(bind(listener.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address), 0);
    setenv("NOTIFY_SOCKET", manager.c_str(), 1);
    CollectorProcess recorder(KORVSNMPCD_PATH, {"--socket", socket, "--record", recorded}, TestPath("record.log"));
    unsetenv("NOTIFY_SOCKET");
    pollfd notified = {listener.Get(), POLLIN, 0};
    char message[64] = {};
    ASSERT_EQ(poll(&notified, 1, 10000), 1) << recorder.Log();
    EXPECT_EQ(recv(listener.Get(), message, sizeof message - 1, 0), 7);
    EXPECT_STREQ(message, "READY=1");
    EXPECT_EQ(access(socket.c_str(), F_OK), 0) << "ready before it listens";
    EXPECT_EQ(korvtest::ExchangeWith(socket, kReload), "{\"success\":true}");
    EXPECT_NE(access(recorded.c_str(), F_OK), 0) << "a control reply was recorded";
    const std::string live = korvtest::ExchangeWith(socket, kStatistics);
    ASSERT_THAT(live, HasSubstr("{\"data\":"));
    EXPECT_EQ(korvtest::ReadWholeFile(recorded), live + "\n");
    ASSERT_EQ(unlink(recorded.c_str()), 0);
    EXPECT_FALSE(korvtest::ExchangeWith(socket, kStatistics).empty());
    EXPECT_NE(access(recorded.c_str(), F_OK), 0) << "only the next reply is recorded";
    EXPECT_EQ(recorder.Stop(SIGTERM), 0);

    std::ofstream(replayed) << live;
    CollectorProcess replay(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay", replayed},
                            TestPath("replay.log"));
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << replay.Log();
    EXPECT_EQ(korvtest::ExchangeWith(socket, kStatistics), live);
    EXPECT_EQ(korvtest::ExchangeWith(socket, kReload), "{\"success\":true}");
    const struct { const char *content, *served; } changes[] = {  // served: after the change
        {"{\n  \"data\" : { \"time\" : 2 }\n}\n", "{\"data\":{\"time\":2}}"},  // compacted
        {"{\"data\":{\"time\":3}}", "{\"data\":{\"time\":3}}"},               // the same size, a later time
        {"{\"data\":{\"time\":4}} trailing", "{\"data\":{\"time\":3}}"}};    // bad: the last good one
    for (const auto &change : changes) {
        std::ofstream(replayed, std::ios::trunc) << change.content;
        // A later modification time than the last one, whatever the clock's granularity.
        const timespec times[2] = {{0, UTIME_OMIT}, {time(nullptr) + 1 + (&change - changes), 0}};
        ASSERT_EQ(utimensat(AT_FDCWD, replayed.c_str(), times, 0), 0);
        EXPECT_EQ(korvtest::ExchangeWith(socket, kStatistics), change.served) << change.content;
    }
    EXPECT_EQ(replay.Stop(SIGTERM), 0);
    EXPECT_THAT(replay.Log(), HasSubstr("[" + replayed + "] holds no JSON object to replay"));
    for (const std::string &path : {replayed, manager}) unlink(path.c_str());
}

}  // namespace
