// The collector control requests: their exact frames and the verdict on
// every shape of reply.
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

using korvtest::Frame;
using korvtest::Logged;
using korvtest::LoggedMessages;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

const char kUnit[] = "transmitor";
const std::string kReloadText = "{\"request\":\"reload\"}";

class ControlRequestTest : public ::testing::Test {
protected:
    void SetUp() override { korvtest::ClearLog(); }
};

TEST_F(ControlRequestTest, ReloadPutsTwentySixBytesOnTheWire)
{
    korvtest::TestCollector collector;
    collector.Script({Frame("{\"success\":true}")});

    EXPECT_TRUE(Transmitor::Reload());

    ASSERT_TRUE(collector.WaitForConnections(1));
    const std::string expected("\x00\x00\x00\x16{\"request\":\"reload\"}\n\x00", 26);
    EXPECT_EQ(collector.Requests().at(0), expected);
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

TEST_F(ControlRequestTest, HistoryModePutsTheReasonBeforeTheRequest)
{
    korvtest::TestCollector collector;
    collector.Script({Frame("{\"success\":true}")});
    collector.Script({Frame("{\"success\":true}")});

    EXPECT_TRUE(Transmitor::EnterHistoryMode("test"));
    EXPECT_TRUE(Transmitor::EnterHistoryMode(""));

    ASSERT_TRUE(collector.WaitForConnections(2));
    const std::string test("\x00\x00\x00\x2c{\"reason\":\"test\",\"request\":\"history_mode\"}\n\x00", 48);
    const std::string empty("\x00\x00\x00\x28{\"reason\":\"\",\"request\":\"history_mode\"}\n\x00", 44);
    EXPECT_EQ(collector.Requests().at(0), test);
    EXPECT_EQ(collector.Requests().at(1), empty);
}

struct RefusalCase {
    const char *name;
    std::string reply;
    std::string replyText;  // as the message renders it
};

class ControlRefusalTest : public ControlRequestTest,
                           public ::testing::WithParamInterface<RefusalCase> {};

TEST_P(ControlRefusalTest, AnythingButBooleanTrueIsARefusal)
{
    korvtest::TestCollector collector;
    collector.Script({Frame(GetParam().reply)});

    EXPECT_FALSE(Transmitor::Reload());

    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit,
                                   "Failed to send request: [" + kReloadText + "], result: [" +
                                       GetParam().replyText + "]")));
}

INSTANTIATE_TEST_SUITE_P(
    Replies, ControlRefusalTest,
    ::testing::Values(RefusalCase{"False", "{\"success\":false}", "{\"success\":false}"},
                      RefusalCase{"NumberOne", "{\"success\":1}", "{\"success\":1}"},
                      RefusalCase{"StringTrue", "{\"success\":\"true\"}", "{\"success\":\"true\"}"},
                      RefusalCase{"Array", "[true]", "[true]"},
                      RefusalCase{"NoSuccessMember", "{\"result\":true}", "{\"result\":true}"},
                      RefusalCase{"Scalar", "true", "true"}),
    [](const auto &info) { return std::string(info.param.name); });

TEST_F(ControlRequestTest, EmptyReplyIsNoResponse)
{
    korvtest::TestCollector collector;
    collector.Script({Frame("")});

    EXPECT_FALSE(Transmitor::EnterHistoryMode("backup"));

    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit, "Error: wrong member data inside"),
                            Logged(LOG_ERR, kUnit,
                                   "Failed to get response from korvsnmpcd, request: "
                                   "[{\"reason\":\"backup\",\"request\":\"history_mode\"}]")));
}

TEST_F(ControlRequestTest, ReplyThatIsNotJsonIsNoResponse)
{
    korvtest::TestCollector collector;
    collector.Script({Frame("{\"success\":")});

    EXPECT_FALSE(Transmitor::Reload());

    auto messages = LoggedMessages();
    ASSERT_EQ(messages.size(), 2u);
    EXPECT_THAT(messages[0].text, ::testing::HasSubstr(" Error: cannot convert the string to json format "));
    EXPECT_THAT(messages[1], Logged(LOG_ERR, kUnit,
                                    "Failed to get response from korvsnmpcd, request: [" + kReloadText + "]"));
}

TEST_F(ControlRequestTest, NoCollectorIsASendFailureAfterTheConnectMessage)
{
    korvtest::NoCollector absent;

    EXPECT_FALSE(Transmitor::Reload());

    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_INFO, "socket_init",
                                   "Failed to connect to socket: [/tmp/korvsnmpcd.sock], reason: "
                                   "[No such file or directory]"),
                            Logged(LOG_ERR, kUnit,
                                   "Failed to send request to korvsnmpcd, request: [" + kReloadText + "]")));
}

TEST_F(ControlRequestTest, CollectorHangingUpIsASendFailure)
{
    korvtest::TestCollector collector;
    collector.Script({""});

    EXPECT_FALSE(Transmitor::Reload());

    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_ERR, kUnit, "client Failed to read action"),
                            Logged(LOG_ERR, kUnit, "Error: cannot received the data"),
                            Logged(LOG_ERR, kUnit,
                                   "Failed to send request to korvsnmpcd, request: [" + kReloadText + "]")));
}

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
        "--gtest_filter=Transmitor*:ControlRequestTest.*:KorvsnmpStatProgram.*:WholeRoad*";
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
        ASSERT_EQ(bind(ours.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address), 0);
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
