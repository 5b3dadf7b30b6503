// The collector client: frames on the wire, replies of every shape, the
// waits, and every failure path's message, result and descriptor.
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
#include "select_hook.h"
#include "syslog_capture.h"
#include "test_collector.h"
#include "allocation_failure.h"

namespace {

using korvtest::Answer;
using korvtest::Frame;
using korvtest::FrameClaiming;
using korvtest::Logged;
using korvtest::LoggedMessages;
using korvtest::SelectMode;
using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::StartsWith;

const char kUnit[] = "transmitor";

Json::Value SampleRequest()
{
    Json::Value request(Json::objectValue);
    request["resource"].append("cpu");
    request["resource"].append("disk");
    return request;
}

bool IsOpen(int fd) { return fcntl(fd, F_GETFD) != -1; }

class TransmitorTest : public ::testing::Test {
protected:
    void SetUp() override { korvtest::ClearLog(); }
};

struct ReplyCase {
    const char *name;
    std::string answer;
    std::string expectedData;
};

class TransmitorReplyTest : public TransmitorTest,
                            public ::testing::WithParamInterface<ReplyCase> {};

TEST_P(TransmitorReplyTest, ReplyBodyStandsWholeInTheDataText)
{
    korvtest::TestCollector collector;
    collector.Script({GetParam().answer});
    Transmitor transmitor("host");
    const int descriptors = korvtest::OpenDescriptorCount();

    EXPECT_EQ(transmitor.Transmit(SampleRequest()), 0);

    EXPECT_EQ(transmitor.dataStr, GetParam().expectedData);
    EXPECT_EQ(transmitor.socketFd, -1);
    ASSERT_TRUE(collector.WaitForConnections(1));  // the collector has closed its end too
    EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors);
    EXPECT_THAT(LoggedMessages(), IsEmpty());
}

const std::string kLargeBody(2500, 'x');

INSTANTIATE_TEST_SUITE_P(
    Replies, TransmitorReplyTest,
    ::testing::Values(ReplyCase{"Plain", Frame("{\"ok\":true}"), "{\"ok\":true}"},
                      ReplyCase{"TrailingNul", Frame(std::string("{\"ok\":true}\0", 12)),
                                std::string("{\"ok\":true}\0", 12)},
                      ReplyCase{"LargerThanOneRead", Frame(kLargeBody), kLargeBody},
                      ReplyCase{"LengthZero", FrameClaiming(0, ""), ""},
                      ReplyCase{"LengthWithTopBitSet", FrameClaiming(0x80000010u, "{\"ok\":1}"), ""}),
    [](const auto &info) { return std::string(info.param.name); });

TEST_F(TransmitorTest, EmptyLengthLeavesTheConnectionOpenAndNoReply)
{
    korvtest::TestCollector collector;
    collector.Script({FrameClaiming(0x80000000u, "ignored")});
    Transmitor transmitor("host");
    transmitor.dataStr = "earlier";
    transmitor.socketFd = SocketInit();
    ASSERT_GE(transmitor.socketFd, 0);

    ASSERT_EQ(transmitor.TransmitData(SampleRequest()), 0);
    EXPECT_EQ(transmitor.ReceiveData(), 0);

    EXPECT_TRUE(IsOpen(transmitor.socketFd));
    EXPECT_EQ(transmitor.dataStr, "");
    std::string text = "untouched";
    EXPECT_EQ(transmitor.GetDataStr(text), -1);
    EXPECT_EQ(text, "untouched");
    Json::Value value = 5;
    EXPECT_EQ(transmitor.GetDataJson(value), -1);
    EXPECT_EQ(value, Json::Value(5));
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "Error: wrong member data inside"),
                                              Logged(LOG_ERR, kUnit, "Error: wrong member data inside")));
}

// Text that the reader refuses or gives up on stays, and is not converted.
TEST_F(TransmitorTest, TextThatIsNotJsonIsKeptButNotConverted)
{
    const std::pair<std::string, const char *> cases[] = {
        {"not json", "\\* Line 1, Column 1.*Syntax error.*"},  // the reader's own report
        {std::string(100000, '['), ".+"},  // the reader gives up by throwing
        {std::string(100000, '[') + std::string(100000, ']'), ".+"}};
    for (const auto &[text, errors] : cases) {
        SCOPED_TRACE(text.substr(0, 10));
        korvtest::ClearLog();
        Transmitor transmitor("host");
        transmitor.dataStr = text;
        Json::Value value;
        EXPECT_EQ(transmitor.GetDataJson(value), -1);
        std::string kept;
        EXPECT_EQ(transmitor.GetDataStr(kept), 0);
        EXPECT_EQ(kept, text);
        ASSERT_EQ(LoggedMessages().size(), 1u);
        EXPECT_EQ(LoggedMessages()[0].priority, LOG_ERR);
        EXPECT_THAT(LoggedMessages()[0].text,
                    ::testing::MatchesRegex(std::string("transmitor:[0-9]+ Error: cannot convert "
                                                        "the string to json format ") + errors));
    }
}

struct FailedReceiveCase {
    const char *name;
    Answer answer;
    std::vector<std::string> messages;  // of this unit, in order
};

class TransmitorFailedReceiveTest : public TransmitorTest,
                                    public ::testing::WithParamInterface<FailedReceiveCase> {};

TEST_P(TransmitorFailedReceiveTest, FailsClosesAndKeepsNoHalfReply)
{
    korvtest::TestCollector collector;
    collector.Script(GetParam().answer);
    Transmitor transmitor("host");
    transmitor.dataStr = "earlier";
    const int descriptors = korvtest::OpenDescriptorCount();

    EXPECT_EQ(transmitor.Transmit(SampleRequest()), -1);

    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_EQ(transmitor.dataStr, "");
    ASSERT_TRUE(collector.WaitForConnections(1));  // the collector has closed its end too
    EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors);
    std::vector<::testing::Matcher<korvtest::LogEntry>> expected;
    for (const std::string &message : GetParam().messages)
        expected.push_back(Logged(LOG_ERR, kUnit, message));
    EXPECT_THAT(LoggedMessages(), ::testing::ElementsAreArray(expected));
}

INSTANTIATE_TEST_SUITE_P(
    BrokenFrames, TransmitorFailedReceiveTest,
    ::testing::Values(
        FailedReceiveCase{"BodyCutShort",
                          {FrameClaiming(2500, std::string(100, 'x'))},
                          {"client Failed to read the reply body, 2400 of 2500 bytes missing",
                           "Error: cannot received the data"}},
        FailedReceiveCase{"LengthFarBeyondTheBody",
                          {FrameClaiming(0x7fffffffu, "{}")},
                          {"client Failed to read the reply body, 2147483645 of 2147483647 bytes "
                           "missing",
                           "Error: cannot received the data"}},
        FailedReceiveCase{"PrefixCutShort",
                          {std::string("\0\0", 2)},
                          {"client Failed to read action", "Error: cannot received the data"}},
        FailedReceiveCase{"ClosedWithoutAnswer",
                          {""},
                          {"client Failed to read action", "Error: cannot received the data"}}),
    [](const auto &info) { return std::string(info.param.name); });

struct WaitCase {
    const char *name;
    SelectMode sending;    // the wait before the request
    SelectMode receiving;  // the wait before the reply
    std::vector<std::string> messages;  // of this unit, in order
};

void PrintTo(const WaitCase &c, std::ostream *out) { *out << c.name; }

class TransmitorWaitTest : public TransmitorTest, public ::testing::WithParamInterface<WaitCase> {};

// A failed wait ends the exchange before any reply byte is read: the earlier
// reply stays, the connection is closed, and only what the wait found is logged.
TEST_P(TransmitorWaitTest, FailedWaitKeepsTheEarlierReply)
{
    const WaitCase &c = GetParam();
    korvtest::TestCollector collector;
    collector.Script({"", /*hangUp=*/false});
    Transmitor transmitor("host");
    transmitor.dataStr = "earlier";
    korvtest::SelectHook waits(c.sending, c.receiving);

    EXPECT_EQ(transmitor.Transmit(SampleRequest()), -1);

    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_EQ(transmitor.dataStr, "earlier");
    std::vector<::testing::Matcher<korvtest::LogEntry>> expected;
    for (const std::string &message : c.messages)
        expected.push_back(Logged(LOG_ERR, kUnit, message));
    EXPECT_THAT(LoggedMessages(), ::testing::ElementsAreArray(expected));
    ASSERT_TRUE(collector.WaitForConnections(1));
    const bool requestSent = c.sending == SelectMode::Real;
    EXPECT_EQ(collector.Requests().at(0).empty(), !requestSent);

    auto calls = waits.Calls();
    ASSERT_EQ(calls.size(), requestSent ? 2u : 1u);
    EXPECT_TRUE(calls[0].writeSet && !calls[0].readSet && !calls[0].exceptSet);
    EXPECT_EQ(calls[0].timeout.tv_sec, 10);
    EXPECT_EQ(calls[0].timeout.tv_usec, 500000);
    EXPECT_GT(calls[0].nfds, 0);
    if (requestSent) {
        EXPECT_TRUE(calls[1].readSet && !calls[1].writeSet && !calls[1].exceptSet);
        EXPECT_EQ(calls[1].timeout.tv_sec, 90);
        EXPECT_EQ(calls[1].timeout.tv_usec, 0);
        EXPECT_EQ(calls[1].nfds, calls[0].nfds);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Waits, TransmitorWaitTest,
    ::testing::Values(
        WaitCase{"SendTimeOut", SelectMode::TimeOut, SelectMode::Real,
                 {"select() failed. ret=[0]", "Error: cannot transmit the data"}},
        WaitCase{"SendError", SelectMode::Fail, SelectMode::Real,
                 {"select() failed. ret=[-1]", "Error: cannot transmit the data"}},
        WaitCase{"SendNotMarked", SelectMode::ReadyUnmarked, SelectMode::Real,
                 {"socket is unwritable", "Error: cannot transmit the data"}},
        WaitCase{"ReceiveError", SelectMode::Real, SelectMode::Fail,
                 {"select() failed. ret=[-1]", "Error: cannot received the data"}},
        WaitCase{"ReceiveTimeOutHasNoMessageOfItsOwn", SelectMode::Real, SelectMode::TimeOut,
                 {"Error: cannot received the data"}}),
    [](const auto &info) { return std::string(info.param.name); });

TEST_F(TransmitorTest, CollectorGoneBeforeTheRequestIsASendFailureNotASignal)
{
    korvtest::TestCollector collector;
    collector.Script({"", true, /*readRequest=*/false});
    Transmitor transmitor("host");
    transmitor.socketFd = SocketInit();
    ASSERT_GE(transmitor.socketFd, 0);
    ASSERT_TRUE(collector.WaitForConnections(1));

    EXPECT_EQ(transmitor.TransmitData(SampleRequest()), -1);  // SIGPIPE would end the test program

    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "Failed to send command.")));
}

TEST_F(TransmitorTest, ShortWriteOfTheTextIsASendFailure)
{
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    std::string prefix(4, '\0');
    std::thread peer([&] {
        ASSERT_EQ(read(ends[1], prefix.data(), prefix.size()), 4);
        close(ends[1]);
    });
    Transmitor transmitor("host");
    transmitor.socketFd = ends[0];
    Json::Value request(std::string(8 << 20, 'x'));  // far more than the socket buffers hold

    EXPECT_EQ(transmitor.TransmitData(request), -1);
    peer.join();

    EXPECT_EQ(prefix, FrameClaiming((8 << 20) + 4, "").substr(0, 4));  // quotes, line feed, NUL
    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_FALSE(IsOpen(ends[0]));
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "Failed to send command.")));
}

TEST_F(TransmitorTest, ReceiveWithoutAConnectionIsABadParameter)
{
    Transmitor transmitor("host");
    transmitor.dataStr = "earlier";

    EXPECT_EQ(transmitor.ReceiveData(), -1);
    EXPECT_EQ(transmitor.TransmitData(SampleRequest()), -1);

    EXPECT_EQ(transmitor.dataStr, "earlier");
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "Bad parameter"),
                                              Logged(LOG_ERR, kUnit, "Bad parameter")));
}

// Raises the descriptor limit for its lifetime, so that descriptors beyond
// FD_SETSIZE can exist.
class DescriptorLimit {
public:
    explicit DescriptorLimit(rlim_t wanted)
    {
        getrlimit(RLIMIT_NOFILE, &saved_);
        rlimit raised = saved_;
        if (raised.rlim_cur < wanted && wanted <= raised.rlim_max) {
            raised.rlim_cur = wanted;
            setrlimit(RLIMIT_NOFILE, &raised);
        }
        rlimit now;
        getrlimit(RLIMIT_NOFILE, &now);
        ok_ = now.rlim_cur >= wanted;
    }
    ~DescriptorLimit() { setrlimit(RLIMIT_NOFILE, &saved_); }
    bool ok() const { return ok_; }

private:
    rlimit saved_;
    bool ok_;
};

TEST_F(TransmitorTest, DescriptorBeyondFdSetSizeFailsInsteadOfCorruptingMemory)
{
    const int high = FD_SETSIZE + 6;
    DescriptorLimit limit(high + 1);
    if (!limit.ok())
        GTEST_SKIP() << "cannot raise the descriptor limit beyond " << high;
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    const std::string expected = "socket descriptor " + std::to_string(high) +
                                 " is beyond select()'s limit of " + std::to_string(FD_SETSIZE);

    for (bool sending : {true, false}) {
        korvtest::ClearLog();
        ASSERT_EQ(dup2(ends[0], high), high);
        Transmitor transmitor("host");
        transmitor.socketFd = high;

        EXPECT_EQ(sending ? transmitor.TransmitData(SampleRequest()) : transmitor.ReceiveData(), -1);

        EXPECT_EQ(transmitor.socketFd, -1);
        EXPECT_FALSE(IsOpen(high));
        EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, expected)));
    }
    close(ends[0]);
    close(ends[1]);
}

TEST_F(TransmitorTest, EmptyHostNameRefusesWithoutConnectingUntilOneIsSet)
{
    korvtest::TestCollector collector;
    collector.Script({Frame("{}")});
    Transmitor transmitor("");

    EXPECT_EQ(transmitor.Transmit(SampleRequest()), -1);
    EXPECT_EQ(transmitor.SetHostName(""), -1);
    EXPECT_EQ(transmitor.hostName, "");
    EXPECT_THAT(LoggedMessages(), ElementsAre(Logged(LOG_ERR, kUnit, "wrong parameter"),
                                              Logged(LOG_ERR, kUnit, "Error: Wrong parameter")));

    ASSERT_EQ(transmitor.SetHostName("nas"), 0);
    EXPECT_EQ(transmitor.hostName, "nas");
    EXPECT_EQ(transmitor.Transmit(SampleRequest()), 0);
    ASSERT_TRUE(collector.WaitForConnections(1));
    EXPECT_EQ(collector.Requests().size(), 1u);  // the refused call never connected
    EXPECT_EQ(transmitor.dataStr, "{}");
    EXPECT_EQ(transmitor.SetHostName(""), -1);  // a name once set stays
    EXPECT_EQ(transmitor.hostName, "nas");
}

TEST_F(TransmitorTest, NoCollectorListeningIsAnInformationalConnectFailure)
{
    korvtest::NoCollector absent;
    Transmitor transmitor("nas");
    const int descriptors = korvtest::OpenDescriptorCount();

    EXPECT_EQ(transmitor.Transmit(SampleRequest()), -1);

    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors);
    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_INFO, "socket_init",
                                   "Failed to connect to socket: [/tmp/korvsnmpcd.sock], reason: "
                                   "[No such file or directory]")));
}

TEST_F(TransmitorTest, NoDescriptorLeftIsAnInformationalSocketFailure)
{
    rlimit saved;
    ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &saved), 0);
    int lowestFree = dup(0);
    ASSERT_GE(lowestFree, 0);
    close(lowestFree);
    rlimit exhausted = saved;
    exhausted.rlim_cur = static_cast<rlim_t>(lowestFree);  // every descriptor below it is taken
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &exhausted), 0);

    int fd = SocketInit();

    setrlimit(RLIMIT_NOFILE, &saved);
    EXPECT_EQ(fd, -1);
    EXPECT_THAT(LoggedMessages(),
                ElementsAre(Logged(LOG_INFO, "socket_init",
                                   "Failed to create socket session, reason: [Too many open files]")));
}

// Every allocation of a whole exchange fails in turn: the exception reaches
// the caller, and the connection is closed all the same.
TEST_F(TransmitorTest, AllocationFailureAnywhereLeavesNoConnection)
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
            try {
                result = transmitor.Transmit(request);
            } catch (const std::bad_alloc &) {
                ++failures;
            }
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

TEST_F(TransmitorTest, DestructorClosesAConnectionStillHeld)
{
    int ends[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, ends), 0);
    {
        Transmitor transmitor("nas");
        transmitor.socketFd = ends[0];
    }
    EXPECT_FALSE(IsOpen(ends[0]));
    close(ends[1]);
}

}  // namespace
