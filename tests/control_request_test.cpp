// The collector control requests: their exact frames and the verdict on
// every shape of reply; and the real collector socket, which no test touches.
#include <spawn.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cstring>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korvsnmp/transmitor.h"
#include "connect_redirect.h"
#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "syslog_capture.h"
#include "test_collector.h"

extern char **environ;

namespace {

using korvtest::Logged;
using ::testing::Matcher;

const char kReload[] = "{\"request\":\"reload\"}";
const std::string kReloadFrame("\x00\x00\x00\x16{\"request\":\"reload\"}\n\x00", 26);

Matcher<korvtest::LogEntry> Error(const std::string &text) { return Logged(LOG_ERR, "transmitor", text); }

struct ControlCase {
    const char *name;
    const char *reason;                // EnterHistoryMode(reason); null: Reload()
    std::optional<std::string> reply;  // its body; none: no collector listens
    std::string request;               // the bytes on the wire
    std::vector<Matcher<korvtest::LogEntry>> messages;  // none: the request was accepted
};

ControlCase Refusal(const char *name, const std::string &reply) {
    return {name, nullptr, reply, kReloadFrame,
            {Error(std::string("Failed to send request: [") + kReload + "], result: [" + reply + "]")}}; }

void PrintTo(const ControlCase &c, std::ostream *out) { *out << c.name; }

class ControlRequestTest : public ::testing::TestWithParam<ControlCase> {};

TEST_P(ControlRequestTest, FrameVerdictAndMessages)
{
    const ControlCase &c = GetParam();
    korvtest::ClearLog();
    std::optional<korvtest::TestCollector> collector;
    if (c.reply) collector.emplace().Script({korvtest::Frame(*c.reply)});
    else korvtest::NoCollector{};
    EXPECT_EQ(c.reason ? Transmitor::EnterHistoryMode(c.reason) : Transmitor::Reload(), c.messages.empty());
    EXPECT_THAT(korvtest::LoggedMessages(), ::testing::ElementsAreArray(c.messages));
    if (!collector) return;
    ASSERT_TRUE(collector->WaitForConnections(1));
    EXPECT_EQ(collector->Requests().at(0), c.request);
}

INSTANTIATE_TEST_SUITE_P(
    Replies, ControlRequestTest,
    ::testing::ValuesIn(std::vector<ControlCase>{
        {"Reload", nullptr, "{\"success\":true}", kReloadFrame, {}},
        {"HistoryModeReasonBeforeRequest", "test", "{\"success\":true}",
         std::string("\x00\x00\x00\x2c{\"reason\":\"test\",\"request\":\"history_mode\"}\n\x00", 48), {}},
        Refusal("False", "{\"success\":false}"), Refusal("NumberOne", "{\"success\":1}"),
        Refusal("StringTrue", "{\"success\":\"true\"}"), Refusal("Array", "[true]"),
        Refusal("NoSuccessMember", "{\"result\":true}"), Refusal("Scalar", "true"),
        {"EmptyReplyToAnEmptyReason", "", "",
         std::string("\x00\x00\x00\x28{\"reason\":\"\",\"request\":\"history_mode\"}\n\x00", 44),
         {Error("Error: wrong member data inside"),
          Error("Failed to get response from korvsnmpcd, request: "
                "[{\"reason\":\"\",\"request\":\"history_mode\"}]")}},
        {"NoCollector", nullptr, std::nullopt, "",
         {Logged(LOG_INFO, "socket_init",
                 "Failed to connect to socket: [/tmp/korvsnmpcd.sock], reason: [No such file or directory]"),
          Error(std::string("Failed to send request to korvsnmpcd, request: [") + kReload + "]")}}}),
    [](const auto &info) { return std::string(info.param.name); });

// Binds `fd` on, or connects it to, the real collector path; 0 on success.
int OnRealPath(int fd, bool bindIt)
{
    sockaddr_un a{AF_UNIX, {}};
    std::strcpy(a.sun_path, korvproto::kCollectorSocketPath);
    const auto *named = reinterpret_cast<const sockaddr *>(&a);
    return bindIt ? bind(fd, named, sizeof a) : korvtest_connect_unredirected(fd, named, sizeof a);
}

bool RealCollectorAnswers()
{ return OnRealPath(korvproto::UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)).Get(), false) == 0; }

// Runs this test program's exchange tests (korvsnmp-stat's included) in a
// child; its exit status.
int RunExchangeTests()
{
    char self[] = "/proc/self/exe", filter[] = "--gtest_filter=Transmitor*:*/Transmitor*:"
        "Replies/ControlRequestTest.*:KorvsnmpStatProgram.*:WholeRoad*";
    char *argv[] = {self, filter, nullptr};
    pid_t child = -1;
    int status = 0;
    if (posix_spawn(&child, self, nullptr, nullptr, argv, environ) != 0 ||
        waitpid(child, &status, 0) != child)
        return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// A collector on the real socket path, ours or a live one, is neither
// removed nor cut off by the tests that exchange with a test collector.
TEST(RealCollectorSocket, ExchangeTestsLeaveItInPlaceAndAnswering)
{
    const char *path = korvproto::kCollectorSocketPath;
    korvproto::UniqueFd ours;
    struct stat before {}, after {};
    if (lstat(path, &before) != 0) {
        ours = korvproto::UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        ASSERT_EQ(OnRealPath(ours.Get(), true), 0);
        EXPECT_EQ(listen(ours.Get(), 64), 0);  // on failure too, our file is removed below
        EXPECT_EQ(lstat(path, &before), 0);
    } else if (!RealCollectorAnswers())
        GTEST_SKIP() << path << " exists but nothing answers there; not touching it";

    EXPECT_EQ(RunExchangeTests(), 0);

    const bool inPlace = lstat(path, &after) == 0 && after.st_ino == before.st_ino;
    EXPECT_TRUE(inPlace) << path << " was removed or replaced";
    EXPECT_TRUE(RealCollectorAnswers());
    if (ours.Valid() && inPlace)  // our own listener's file goes with the test
        unlink(path);
}

}  // namespace
