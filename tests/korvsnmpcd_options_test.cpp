// korvsnmpcd's command line, its daemon mode (descriptors, process id file,
// where it logs) and its recorded replies (--record, --replay).
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <climits>
#include <cstring>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/value.h>

#include "collector_process.h"
#include "protocol/collector_protocol.h"
#include "command_line.h"

namespace {

using korvtest::CollectorProcess;
using ::testing::HasSubstr;
using ::testing::IsEmpty;
using Clock = std::chrono::steady_clock;

constexpr int kUsageError = 2;
std::string RequestFrame(const char *member, const char *value)
{
    Json::Value request;
    request[member] = value;
    return korvproto::EncodeRequestFrame(request);
}
const std::string kStatistics = RequestFrame("resource", "all");
const std::string kReload = RequestFrame("request", "reload");

std::string TestPath(const char *tag)
{
    return "/tmp/korvsnmpcd-opt-" + std::to_string(getpid()) + "-" + tag;
}

TEST(KorvsnmpcdOptions, BadArgumentsSayWhatIsWrong)
{
    struct Case {
        std::vector<const char *> args;
        const char *error;
    } cases[] = {
        {{"--interval", "0"}, "--interval [0] is out of range: from 0.01 to 3600 seconds"},
        {{"--interval", "abc"}, "--interval [abc] is not a number of seconds"},
        {{"--interval", "5000"}, "--interval [5000] is out of range: from 0.01 to 3600 seconds"},
        {{"--interval", "1s"}, "--interval [1s] is not a number of seconds"},
        {{"--client-timeout"}, "--client-timeout needs a value"},
        {{"--max-connections=0"}, "--max-connections [0] is not a whole number from 1 to 1000000"},
        {{"--socket="}, "--socket needs a non-empty path"},
        {{"--daemon=yes"}, "--daemon takes no value"},
        {{"--verbose"}, "unknown option [--verbose]"},
        {{"extra"}, "unexpected argument [extra]"},
        {{"--daemon", "--foreground"}, "--daemon and --foreground exclude each other"},
    };
    for (const Case &c : cases) {
        std::vector<const char *> argv = {"korvsnmpcd"};
        argv.insert(argv.end(), c.args.begin(), c.args.end());
        korvsnmpcd::Options options;
        std::string error;
        EXPECT_FALSE(korvsnmpcd::ParseOptions(static_cast<int>(argv.size()), argv.data(), options, error))
            << c.error;
        EXPECT_EQ(error, c.error);
    }
}

TEST(KorvsnmpcdProgram, ExitStatusAndOutputOfTheCommandLine)
{
    const std::string log = TestPath("cli.log");
    struct Case {
        std::vector<std::string> args;
        int status;
        std::string output;
    } cases[] = {
        {{"--interval", "abc"}, kUsageError,
         "korvsnmpcd: --interval [abc] is not a number of seconds\nTry 'korvsnmpcd --help'.\n"},
        {{"--version"}, 0, std::string("korvsnmpcd ") + KORVSNMP_PROJECT_VERSION + "\n"},
        // Without a terminal or --foreground, messages go to syslog only.
        {{"--replay", "/nonexistent/reply.json"}, 1, ""},
        {{"--probe", "--socket", "/nonexistent/k.sock"}, 1, ""},  // nothing listens there
    };
    for (const Case &c : cases) {
        CollectorProcess program(KORVSNMPCD_PATH, c.args, log);
        EXPECT_EQ(program.WaitForExit(), c.status) << c.args[0];
        EXPECT_EQ(program.Log(), c.output) << c.args[0];
    }
    CollectorProcess foreground(KORVSNMPCD_PATH, {"--foreground", "--replay", "/nonexistent/r.json"}, log);
    EXPECT_EQ(foreground.WaitForExit(), 1);
    EXPECT_THAT(foreground.Log(),
                HasSubstr("Cannot read the reply to replay from [/nonexistent/r.json]"));
}

// A datagram socket bound to `path`, as a service manager's notification socket.
int NotificationSocket(const std::string &path)
{
    unlink(path.c_str());
    int fd = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    if (fd >= 0 && bind(fd, reinterpret_cast<sockaddr *>(&address), sizeof address) == 0)
        return fd;
    if (fd >= 0)
        close(fd);
    return -1;
}

// Whether `pid` runs, as a process that has not exited.
bool Running(pid_t pid)
{
    std::string stat = korvtest::ReadWholeFile("/proc/" + std::to_string(pid) + "/stat");
    size_t state = stat.rfind(')');
    return state != std::string::npos && state + 2 < stat.size() && stat[state + 2] != 'Z';
}

TEST(KorvsnmpcdProgram, DaemonKeepsNoneOfItsCallersDescriptors)
{
    constexpr int kCallersPipe = 251;  // as a calling script might hold one
    const std::string socket = TestPath("daemon.sock");
    const std::string pidFile = TestPath("daemon.pid");
    int ends[2];
    ASSERT_EQ(pipe2(ends, O_CLOEXEC), 0);
    int readEnd = ends[0];
    pid_t daemon = -1;
    {
        CollectorProcess caller(KORVSNMPCD_PATH,
                                {"--daemon", "--socket", socket, "--pidfile", pidFile},
                                TestPath("daemon.log"), ends[1], kCallersPipe);
        close(ends[1]);
        ASSERT_EQ(caller.WaitForExit(), 0) << caller.Log();  // it returns once the daemon is ready
        daemon = std::stoi(korvtest::ReadWholeFile(pidFile));
        ASSERT_GT(daemon, 1);
    }
    EXPECT_TRUE(Running(daemon));
    EXPECT_EQ(korvtest::ExchangeWith(socket, kReload), "{\"success\":true}");
    CollectorProcess probe(KORVSNMPCD_PATH, {"--probe", "--socket", socket}, TestPath("probe.log"));
    EXPECT_EQ(probe.WaitForExit(), 0);

    // Neither the caller nor the daemon holds the pipe's write end: it reads as ended at once.
    pollfd ended = {readEnd, POLLIN, 0};
    EXPECT_EQ(poll(&ended, 1, 2000), 1);
    char byte;
    EXPECT_EQ(read(readEnd, &byte, 1), 0);
    close(readEnd);

    const std::string fds = "/proc/" + std::to_string(daemon) + "/fd/";
    EXPECT_NE(access((fds + std::to_string(kCallersPipe)).c_str(), F_OK), 0);
    for (int stream : {0, 1, 2}) {
        char target[PATH_MAX] = {};
        EXPECT_GT(readlink((fds + std::to_string(stream)).c_str(), target, sizeof target - 1), 0);
        EXPECT_STREQ(target, "/dev/null") << "descriptor " << stream;
    }

    ASSERT_EQ(kill(daemon, SIGTERM), 0);  // by its id, from the process id file
    Clock::time_point giveUp = Clock::now() + korvtest::kProcessWait;
    while (access(pidFile.c_str(), F_OK) == 0 && Clock::now() < giveUp)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    EXPECT_NE(access(pidFile.c_str(), F_OK), 0) << "process id file left behind";
    while (Running(daemon) && Clock::now() < giveUp)
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    EXPECT_FALSE(Running(daemon));
    if (Running(daemon))
        kill(daemon, SIGKILL);  // leave nothing behind when SIGTERM did not stop it
    EXPECT_NE(access(socket.c_str(), F_OK), 0);
}

TEST(KorvsnmpcdProgram, TellsTheServiceManagerOnceItListens)
{
    const std::string manager = TestPath("notify.sock");
    const std::string socket = TestPath("notified.sock");
    int listener = NotificationSocket(manager);
    ASSERT_GE(listener, 0);
    setenv("NOTIFY_SOCKET", manager.c_str(), 1);
    CollectorProcess daemon(KORVSNMPCD_PATH, {"--socket", socket}, TestPath("notified.log"));
    unsetenv("NOTIFY_SOCKET");
    pollfd notified = {listener, POLLIN, 0};
    ASSERT_EQ(poll(&notified, 1, 10000), 1) << daemon.Log();
    char message[64] = {};
    EXPECT_EQ(recv(listener, message, sizeof message - 1, 0), 7);
    EXPECT_STREQ(message, "READY=1");
    EXPECT_EQ(access(socket.c_str(), F_OK), 0) << "ready before it listens";
    EXPECT_EQ(daemon.Stop(SIGTERM), 0);
    close(listener);
    unlink(manager.c_str());
}

TEST(KorvsnmpcdReplay, RecordedReplyIsServedAndFollowsItsFile)
{
    const std::string socket = TestPath("replay.sock");
    const std::string recorded = TestPath("recorded.json");
    unlink(recorded.c_str());
    std::string live;
    {
        CollectorProcess recorder(KORVSNMPCD_PATH, {"--socket", socket, "--record", recorded},
                                  TestPath("record.log"));
        ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << recorder.Log();
        EXPECT_EQ(korvtest::ExchangeWith(socket, kReload), "{\"success\":true}");
        EXPECT_NE(access(recorded.c_str(), F_OK), 0) << "a control reply was recorded";
        live = korvtest::ExchangeWith(socket, kStatistics);
        ASSERT_THAT(live, HasSubstr("{\"data\":"));
        EXPECT_EQ(korvtest::ReadWholeFile(recorded), live + "\n");
        ASSERT_EQ(unlink(recorded.c_str()), 0);
        EXPECT_FALSE(korvtest::ExchangeWith(socket, kStatistics).empty());
        EXPECT_NE(access(recorded.c_str(), F_OK), 0) << "only the next reply is recorded";
        EXPECT_EQ(recorder.Stop(SIGTERM), 0);
    }

    const std::string replayed = TestPath("replayed.json");
    std::ofstream(replayed) << live;
    CollectorProcess replay(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay", replayed},
                            TestPath("replay.log"));
    ASSERT_TRUE(korvtest::WaitUntilConnectable(socket)) << replay.Log();
    EXPECT_EQ(korvtest::ExchangeWith(socket, kStatistics), live);
    EXPECT_EQ(korvtest::ExchangeWith(socket, kReload), "{\"success\":true}");

    struct Change {
        const char *content;
        const char *served;  // after the change
    } changes[] = {
        {"{\n  \"data\" : { \"time\" : 2 }\n}\n", "{\"data\":{\"time\":2}}"},  // compacted
        {"{\"data\":{\"time\":3}}", "{\"data\":{\"time\":3}}"},  // the same size, a later time
        {"{\"data\":{\"time\":4}} trailing", "{\"data\":{\"time\":3}}"},  // bad: the last good one
    };
    for (const Change &change : changes) {
        std::ofstream(replayed, std::ios::trunc) << change.content;
        // A later modification time whatever the clock's granularity.
        struct stat now;
        ASSERT_EQ(stat(replayed.c_str(), &now), 0);
        timespec times[2] = {now.st_atim, {now.st_mtim.tv_sec + 1, now.st_mtim.tv_nsec}};
        ASSERT_EQ(utimensat(AT_FDCWD, replayed.c_str(), times, 0), 0);
        EXPECT_EQ(korvtest::ExchangeWith(socket, kStatistics), change.served) << change.content;
    }
    EXPECT_EQ(replay.Stop(SIGTERM), 0);
    EXPECT_THAT(replay.Log(), HasSubstr("[" + replayed + "] holds no JSON object to replay"));
    unlink(replayed.c_str());
}

}  // namespace
