// The collector control requests: their exact frames and the verdict on
// every shape of reply; and the real collector socket, which no test touches.
#include <fcntl.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <cstring>
#include <memory>
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

using korvtest::Answer;

using korvtest::Logged;
using korvtest::LoggedMessages;
using ::testing::Matcher;

const char kUnit[] = "transmitor";
const char kReload[] = "{\"request\":\"reload\"}";

Matcher<korvtest::LogEntry> Error(const std::string &text) { return Logged(LOG_ERR, kUnit, text); }

const std::string kSendFailed =
    std::string("Failed to send request to korvsnmpcd, request: [") + kReload + "]";

std::string Refused(const std::string &reply)
{
    return std::string("Failed to send request: [") + kReload + "], result: [" + reply + "]";
}

struct ControlCase {
    const char *name;
    const char *reason;          // EnterHistoryMode(reason); null: Reload()
    std::optional<Answer> answer;  // none: no collector listens
    bool accepted;
    std::string request;         // the bytes on the wire
    std::vector<Matcher<korvtest::LogEntry>> messages;
};

const std::string kReloadFrame("\x00\x00\x00\x16{\"request\":\"reload\"}\n\x00", 26);

Answer Reply(const std::string &body) { return {korvtest::Frame(body)}; }

ControlCase Refusal(const char *name, const std::string &reply)
{
    return {name, nullptr, Reply(reply), false, kReloadFrame, {Error(Refused(reply))}};
}

void PrintTo(const ControlCase &c, std::ostream *out) { *out << c.name; }

class ControlRequestTest : public ::testing::TestWithParam<ControlCase> {};

TEST_P(ControlRequestTest, FrameVerdictAndMessages)
{
    const ControlCase &c = GetParam();
    korvtest::ClearLog();
    std::optional<korvtest::TestCollector> collector;
    std::optional<korvtest::NoCollector> absent;
    if (c.answer) {
        collector.emplace();
        collector->Script(*c.answer);
    } else {
        absent.emplace();
    }

    const bool accepted =
        c.reason != nullptr ? Transmitor::EnterHistoryMode(c.reason) : Transmitor::Reload();

    EXPECT_EQ(accepted, c.accepted);
    EXPECT_THAT(LoggedMessages(), ::testing::ElementsAreArray(c.messages));
    if (collector) {
        ASSERT_TRUE(collector->WaitForConnections(1));
        EXPECT_EQ(collector->Requests().at(0), c.request);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Replies, ControlRequestTest,
    ::testing::Values(
        ControlCase{"Reload", nullptr, Reply("{\"success\":true}"), true, kReloadFrame, {}},
        ControlCase{"HistoryModeReasonBeforeRequest", "test", Reply("{\"success\":true}"), true,
                    std::string("\x00\x00\x00\x2c{\"reason\":\"test\",\"request\":\"history_mode\"}"
                                "\n\x00", 48),
                    {}},
        ControlCase{"HistoryModeEmptyReason", "", Reply("{\"success\":true}"), true,
                    std::string("\x00\x00\x00\x28{\"reason\":\"\",\"request\":\"history_mode\"}"
                                "\n\x00", 44),
                    {}},
        Refusal("False", "{\"success\":false}"), Refusal("NumberOne", "{\"success\":1}"),
        Refusal("StringTrue", "{\"success\":\"true\"}"), Refusal("Array", "[true]"),
        Refusal("NoSuccessMember", "{\"result\":true}"), Refusal("Scalar", "true"),
        ControlCase{"EmptyReply", "backup", Reply(""), false,
                    std::string("\x00\x00\x00\x2e{\"reason\":\"backup\","
                                "\"request\":\"history_mode\"}\n\x00", 50),
                    {Error("Error: wrong member data inside"),
                     Error("Failed to get response from korvsnmpcd, request: "
                           "[{\"reason\":\"backup\",\"request\":\"history_mode\"}]")}},
        ControlCase{"ReplyNotJson", nullptr, Reply("{\"success\":"), false, kReloadFrame,
                    {::testing::Field(&korvtest::LogEntry::text,
                                      ::testing::HasSubstr(" Error: cannot convert the string to "
                                                           "json format * Line 1, Column 12")),
                     Error(std::string("Failed to get response from korvsnmpcd, request: [") +
                           kReload + "]")}},
        ControlCase{"CollectorHangsUp", nullptr, Answer{""}, false, kReloadFrame,
                    {Error("client Failed to read action"),
                     Error("Error: cannot received the data"), Error(kSendFailed)}},
        ControlCase{"NoCollector", nullptr, std::nullopt, false, "",
                    {Logged(LOG_INFO, "socket_init",
                            "Failed to connect to socket: [/tmp/korvsnmpcd.sock], reason: "
                            "[No such file or directory]"),
                     Error(kSendFailed)}}),
    [](const auto &info) { return std::string(info.param.name); });

sockaddr_un RealCollectorAddress()
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, korvproto::kCollectorSocketPath);
    return address;
}

bool RealCollectorAnswers()
{
    korvproto::UniqueFd probe(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_un address = RealCollectorAddress();
    return korvtest_connect_unredirected(probe.Get(), reinterpret_cast<const sockaddr *>(&address),
                                         sizeof address) == 0;
}

// Runs this test program's exchange tests (korvsnmp-stat's included) in a
// child; its exit status.
int RunExchangeTests()
{
    std::string self = "/proc/self/exe";
    std::string filter =
        "--gtest_filter=Transmitor*:Replies/ControlRequestTest.*:KorvsnmpStatProgram.*:WholeRoad*";
    char *argv[] = {self.data(), filter.data(), nullptr};
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    pid_t child = -1;
    int spawned = posix_spawn(&child, argv[0], &actions, nullptr, argv, environ);
    posix_spawn_file_actions_destroy(&actions);
    int status = 0;
    if (spawned != 0 || waitpid(child, &status, 0) != child)
        return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

// A collector on the real socket path, ours or a live one, is neither
// removed nor cut off by the tests that exchange with a test collector.
TEST(RealCollectorSocket, ExchangeTestsLeaveItInPlaceAndAnswering)
{
    const char *path = korvproto::kCollectorSocketPath;
    korvproto::UniqueFd ours;
    struct stat before;
    // Our own listener's file goes with the test, if it is still ours.
    auto removeOurs = [&](void *) {
        struct stat now;
        if (ours.Valid() && lstat(path, &now) == 0 && now.st_ino == before.st_ino)
            unlink(path);
    };
    std::unique_ptr<void, decltype(removeOurs)> cleanup(&ours, removeOurs);
    if (lstat(path, &before) == 0) {
        if (!RealCollectorAnswers())
            GTEST_SKIP() << path << " exists but nothing answers there; not touching it";
    } else {
        ours = korvproto::UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = RealCollectorAddress();
        const auto *named = reinterpret_cast<const sockaddr *>(&address);
        ASSERT_EQ(bind(ours.Get(), named, sizeof address), 0);
        ASSERT_EQ(listen(ours.Get(), 64), 0);
        ASSERT_EQ(lstat(path, &before), 0);
    }

    EXPECT_EQ(RunExchangeTests(), 0);

    struct stat after;
    ASSERT_EQ(lstat(path, &after), 0) << path << " was removed";
    EXPECT_EQ(after.st_ino, before.st_ino) << path << " was replaced";
    EXPECT_TRUE(RealCollectorAnswers());
}

}  // namespace
