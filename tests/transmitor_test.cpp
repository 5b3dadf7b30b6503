// The collector client: replies of every shape, the waits, and every failure
// path's message, result and descriptor.
#include <fcntl.h>
#include <sys/resource.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <syslog.h>
#include <unistd.h>

#include <string>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "korvsnmp/transmitor.h"
#include "json_text.h"
#include "select_hook.h"
#include "syslog_capture.h"
#include "test_collector.h"
#include "allocation_failure.h"

namespace {

using korvtest::Frame, korvtest::FrameClaiming, korvtest::Logged, korvtest::LoggedMessages;
using Mode = korvtest::SelectMode;

const char kReceiveFailed[] = "Error: cannot received the data";
const char kTransmitFailed[] = "Error: cannot transmit the data";
const char kSelectFailed[] = "select() failed. ret=[-1]";

Json::Value SampleRequest() { return korvtest::ParseJson(R"({"resource":["cpu","disk"]})"); }

bool IsOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

// Matches this unit's error messages, in order.
auto Errors(const std::vector<std::string> &texts)
{
    std::vector<::testing::Matcher<korvtest::LogEntry>> matchers;
    for (const std::string &text : texts) matchers.push_back(Logged(LOG_ERR, "transmitor", text));
    return ::testing::ElementsAreArray(matchers);
}

struct ExchangeCase {
    const char *name;
    korvtest::Answer answer;
    int result;
    std::string data;  // dataStr afterwards; it held "earlier"
    std::vector<std::string> messages;
    Mode sending = Mode::Real;    // the wait before the request
    Mode receiving = Mode::Real;  // the wait before the reply
};

class TransmitorExchangeTest : public ::testing::TestWithParam<ExchangeCase> {};

// Whatever the collector does, the exchange ends with the connection closed on
// both ends, a half reply is never kept, a failed wait keeps the earlier
// reply, and the waits asked for are 10.5 s to send and 90 s to receive.
TEST_P(TransmitorExchangeTest, ResultDataMessagesAndWaits)
{
    const ExchangeCase &c = GetParam();
    korvtest::ClearLog();
    korvtest::TestCollector collector;
    collector.Script(c.answer);
    Transmitor transmitor("host");
    transmitor.dataStr = "earlier";
    korvtest::SelectHook waits(c.sending, c.receiving);
    const int descriptors = korvtest::OpenDescriptorCount();
    EXPECT_EQ(transmitor.Transmit(SampleRequest()), c.result);
    EXPECT_EQ(transmitor.dataStr, c.data);
    EXPECT_EQ(transmitor.socketFd, -1);
    ASSERT_TRUE(collector.WaitForConnections(1));  // the collector has closed its end too
    EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors);
    EXPECT_THAT(LoggedMessages(), Errors(c.messages));
    const bool requestSent = c.sending == Mode::Real;
    EXPECT_EQ(collector.Requests().at(0).empty(), !requestSent);
    const auto calls = waits.Calls();
    ASSERT_EQ(calls.size(), requestSent ? 2u : 1u);
    const auto wait = [](const auto &w) { return std::make_tuple(w.readSet, w.writeSet, w.exceptSet,
        w.timeout.tv_sec, w.timeout.tv_usec, w.nfds > 0); };
    EXPECT_EQ(wait(calls[0]), std::make_tuple(false, true, false, 10L, 500000L, true));
    EXPECT_EQ(calls.back().nfds, calls[0].nfds);
    if (requestSent) { EXPECT_EQ(wait(calls[1]), std::make_tuple(true, false, false, 90L, 0L, true)); }
}

const std::string kLargeBody(2500, 'x');
const std::string kWithNul("{\"ok\":true}\0", 12);
const korvtest::Answer kSilent{"", /*hangUp=*/false};
const char kReadAction[] = "client Failed to read action";
const char kCutShort[] = "client Failed to read the reply body, ";

INSTANTIATE_TEST_SUITE_P(Exchanges, TransmitorExchangeTest, ::testing::ValuesIn(std::vector<ExchangeCase>{
        {"Plain", {Frame("{\"ok\":true}")}, 0, "{\"ok\":true}", {}},
        {"TrailingNul", {Frame(kWithNul)}, 0, kWithNul, {}},
        {"LargerThanOneRead", {Frame(kLargeBody)}, 0, kLargeBody, {}},
        {"LengthZero", {FrameClaiming(0, "")}, 0, "", {}},
        {"LengthWithTopBitSet", {FrameClaiming(0x80000010u, "{\"ok\":1}")}, 0, "", {}},
        // Broken frames: no half reply is kept.
        {"BodyCutShort", {FrameClaiming(2500, std::string(100, 'x'))}, -1, "",
         {kCutShort + std::string("2400 of 2500 bytes missing"), kReceiveFailed}},
        {"LengthFarBeyondTheBody", {FrameClaiming(0x7fffffffu, "{}")}, -1, "",
         {kCutShort + std::string("2147483645 of 2147483647 bytes missing"), kReceiveFailed}},
        {"PrefixCutShort", {std::string("\0\0", 2)}, -1, "", {kReadAction, kReceiveFailed}},
        // Failed waits, before anything is read: the earlier reply stays.
        {"SendTimeOut", kSilent, -1, "earlier", {"select() failed. ret=[0]", kTransmitFailed}, Mode::TimeOut},
        {"SendError", kSilent, -1, "earlier", {kSelectFailed, kTransmitFailed}, Mode::Fail},
        {"SendNotMarked", kSilent, -1, "earlier", {"socket is unwritable", kTransmitFailed},
         Mode::ReadyUnmarked},
        {"ReceiveError", kSilent, -1, "earlier", {kSelectFailed, kReceiveFailed}, Mode::Real, Mode::Fail},
        {"ReceiveTimeOutNoOwnMessage", kSilent, -1, "earlier", {kReceiveFailed}, Mode::Real, Mode::TimeOut}}),
    [](const auto &info) { return std::string(info.param.name); });

// A fresh object without a name: every call refuses, touching nothing it is
// given and connecting nowhere, until a name is set; a name once set stays.
TEST(TransmitorTest, FreshTransmitorRefusesEverythingUntilANameIsSet)
{
    korvtest::ClearLog();
    korvtest::TestCollector collector;
    collector.Script({Frame("{}")});
    Transmitor t("");
    std::string text = "untouched";
    Json::Value value = 5;
    EXPECT_THAT((std::vector<int>{t.GetDataStr(text), t.GetDataJson(value), t.ReceiveData(),
                 t.TransmitData(SampleRequest()), t.Transmit(SampleRequest()), t.SetHostName("")}),
                ::testing::Each(-1));  // called in this order
    EXPECT_EQ(text, "untouched");
    EXPECT_EQ(value, Json::Value(5));
    const char noData[] = "Error: wrong member data inside";
    EXPECT_THAT(LoggedMessages(), Errors({noData, noData, "Bad parameter", "Bad parameter", "wrong parameter",
                                          "Error: Wrong parameter"}));

    ASSERT_EQ(t.SetHostName("nas"), 0);
    EXPECT_EQ(t.Transmit(SampleRequest()), 0);
    ASSERT_TRUE(collector.WaitForConnections(1));
    EXPECT_EQ(collector.Requests().size(), 1u);  // the refused calls never connected
    EXPECT_EQ(t.SetHostName(""), -1);
    EXPECT_EQ(t.hostName, "nas");
}

// Text that the reader refuses or gives up on (by throwing) stays, and is not converted.
TEST(TransmitorTest, TextThatIsNotJsonIsKeptButNotConverted)
{
    const std::pair<std::string, const char *> cases[] = {
        {"not json", "\\* Line 1, Column 1.*Syntax error.*"}, {std::string(100000, '['), ".+"},
        {std::string(100000, '[') + std::string(100000, ']'), ".+"}};
    for (const auto &[text, errors] : cases) {
        SCOPED_TRACE(text.substr(0, 10));
        korvtest::ClearLog();
        Transmitor transmitor("host");
        transmitor.dataStr = text;
        Json::Value value;
        std::string kept;
        EXPECT_EQ(transmitor.GetDataJson(value), -1);
        EXPECT_EQ(transmitor.GetDataStr(kept), 0);
        EXPECT_EQ(kept, text);
        ASSERT_EQ(LoggedMessages().size(), 1u);
        EXPECT_EQ(LoggedMessages()[0].priority, LOG_ERR);
        EXPECT_THAT(LoggedMessages()[0].text, ::testing::MatchesRegex(
            std::string("transmitor:[0-9]+ Error: cannot convert the string to json format ") + errors));
    }
}

// The collector goes away before or while the request is written: a send
// failure, neither a SIGPIPE that would end the caller nor a short write taken
// for a whole one.
TEST(TransmitorTest, CollectorGoneWhileSendingIsASendFailure)
{
    const Json::Value request(std::string(8 << 20, 'x'));  // far more than the socket buffers hold
    for (size_t peerReads : {0, 4}) {
        SCOPED_TRACE(peerReads);
        korvtest::ClearLog();
        int ends[2];
        ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
        std::string prefix(peerReads, '\0');
        std::thread peer([&] { EXPECT_EQ(read(ends[1], prefix.data(), peerReads), ssize_t(peerReads));
                               close(ends[1]); });
        if (peerReads == 0) peer.join();
        Transmitor transmitor("host");
        transmitor.socketFd = ends[0];
        EXPECT_EQ(transmitor.TransmitData(request), -1);
        if (peer.joinable()) peer.join();
        EXPECT_EQ(prefix, FrameClaiming((8 << 20) + 4, "").substr(0, peerReads));  // quotes, \n, NUL
        EXPECT_EQ(transmitor.socketFd, -1);
        EXPECT_FALSE(IsOpen(ends[0]));
        EXPECT_THAT(LoggedMessages(), Errors({"Failed to send command."}));
    }
}

// A descriptor held goes with the object; one beyond FD_SETSIZE fails a send
// or receive instead of corrupting memory.
TEST(TransmitorTest, HeldDescriptorIsClosedByDestructorAndBeyondFdSetSizeByAFailure)
{
    const int high = FD_SETSIZE + 6;
    rlimit limit;
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &limit), 0);
    limit.rlim_cur = std::max<rlim_t>(limit.rlim_cur, high + 1);  // for the rest of the program
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &limit), 0) << "cannot allow descriptor " << high;
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    for (bool sending : {true, false}) {
        korvtest::ClearLog();
        ASSERT_EQ(dup2(ends[0], high), high);
        Transmitor transmitor("host");
        transmitor.socketFd = high;
        EXPECT_EQ(sending ? transmitor.TransmitData(SampleRequest()) : transmitor.ReceiveData(), -1);
        EXPECT_EQ(transmitor.socketFd, -1);
        EXPECT_FALSE(IsOpen(high));
        EXPECT_THAT(LoggedMessages(), Errors({"socket descriptor " + std::to_string(high) +
            " is beyond select()'s limit of " + std::to_string(FD_SETSIZE)}));
    }
    { Transmitor held("nas"); held.socketFd = ends[0]; }  // the object takes the descriptor along
    EXPECT_FALSE(IsOpen(ends[0]));
    close(ends[1]);
}

// Both are informational: no collector, or no descriptor left for the socket.
TEST(TransmitorTest, ConnectAndSocketFailuresAreInformationalAndLeakNothing)
{
    korvtest::ClearLog();
    const int descriptors = korvtest::OpenDescriptorCount();
    korvtest::NoCollector absent;
    Transmitor transmitor("nas");
    EXPECT_EQ(transmitor.Transmit(SampleRequest()), -1);
    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors);
    rlimit saved;
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &saved), 0);
    const rlimit exhausted = {0, saved.rlim_max};  // no new descriptor at all
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &exhausted), 0);
    EXPECT_EQ(SocketInit(), -1);
    setrlimit(RLIMIT_NOFILE, &saved);
    EXPECT_THAT(LoggedMessages(), ::testing::ElementsAre(Logged(LOG_INFO, "socket_init",
        "Failed to connect to socket: [/tmp/korvsnmpcd.sock], reason: [No such file or directory]"),
        Logged(LOG_INFO, "socket_init", "Failed to create socket session, reason: [Too many open files]")));
}

// Every allocation of a whole exchange fails in turn: the exception reaches
// the caller, and the connection is closed all the same.
TEST(TransmitorTest, AllocationFailureAnywhereLeavesNoConnection)
{
    korvtest::TestCollector collector;
    Transmitor transmitor("host");
    const int descriptors = korvtest::OpenDescriptorCount();
    const Json::Value request = SampleRequest();
    bool completed = false;
    int failures = 0;
    for (int nth = 1; !completed; ++nth) {
        collector.Script({Frame(std::string(3000, 'x'))});
        int result = -2;
        {
            korvtest::ThrowingAllocationFailure failure(nth);
            try { result = transmitor.Transmit(request); } catch (const std::bad_alloc &) { ++failures; }
            completed = !failure.Triggered();
        }
        ASSERT_TRUE(collector.WaitForConnections(static_cast<size_t>(nth))) << nth;
        EXPECT_EQ(transmitor.socketFd, -1) << nth;
        EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors) << nth;
        EXPECT_EQ(result, completed ? 0 : -2) << nth;
    }
    EXPECT_GE(failures, 3);  // the request frame, the body and the reply text at least
    EXPECT_EQ(transmitor.dataStr, std::string(3000, 'x'));
}

}  // namespace
