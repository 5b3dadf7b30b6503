// Whom the library believes to be the collector, how the collector takes its
// path back from another user, and who may steer it: real processes of uid
// 65534 (nobody) beside a test program that runs as root.
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <sys/wait.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <set>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>

#include "collector_process.h"
#include "connect_redirect.h"
#include "foreign_user.h"
#include "json_text.h"
#include "korvsnmp/transmitor.h"
#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "reply.h"
#include "syslog_capture.h"
#include "test_collector.h"

namespace {

using korvtest::CollectorProcess;
using korvtest::kNobody;
using korvtest::Logged;
using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::Not;

// What a squatter answers: a CPU at 99 %, and yes to everything.
const char kForgedReply[] = R"({"data":{"System":[{"cpu_user_load":99}]},"success":true})";
const char kStatisticsRequest[] = R"({"resource":["memory"]})";

// Points the test redirect of the fixed collector path at `path` while it lives.
class RedirectTo {
public:
    explicit RedirectTo(const std::string &path)
        : saved_(std::getenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE))
    {
        setenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE, path.c_str(), 1);
    }
    ~RedirectTo() { setenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE, saved_.c_str(), 1); }

private:
    std::string saved_;
};

// One statistics exchange through the library; the reply, or null.
Json::Value LibraryStatistics()
{
    Transmitor transmitor("localhost");
    Json::Value reply;
    if (transmitor.Transmit(korvtest::ParseJson(kStatisticsRequest)) != 0 ||
        transmitor.GetDataJson(reply) != 0)
        return Json::Value();
    return reply;
}

size_t Occurrences(const std::string &text, const std::string &part)
{
    size_t count = 0;
    for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1))
        ++count;
    return count;
}

std::set<std::string> Entries(const std::string &directory)
{
    std::set<std::string> names;
    for (const auto &entry : std::filesystem::directory_iterator(directory))
        names.insert(entry.path().filename().string());
    return names;
}

// Whether a request steers the collector decides only for control requests;
// a refused one is not carried out, so nothing of it is logged here (the
// server logs the refusal with the client's uid).
TEST(CollectorControl, RefusedToThoseWhoMayNotSteer)
{
    using korvsnmpcd::RequestKind;
    const struct {
        const char *body;
        bool mayControl;
        RequestKind kind;
    } cases[] = {
        {R"({"request":"reload"})", false, RequestKind::kForbiddenControl},
        {R"({"reason":"x","request":"history_mode"})", false, RequestKind::kForbiddenControl},
        {R"({"resource":["all"]})", false, RequestKind::kStatistics},
        {R"({"request":"other"})", false, RequestKind::kStatistics},
        {"[1]", false, RequestKind::kNotAnObject},
        {R"({"request":"reload"})", true, RequestKind::kControl},
    };
    korvtest::ClearLog();
    for (const auto &c : cases)
        EXPECT_EQ(korvsnmpcd::ReadRequest(c.body, c.mayControl), c.kind) << c.body << c.mayControl;
    EXPECT_THAT(korvtest::LoggedMessages(),
                ElementsAre(Logged(LOG_NOTICE, "reply",
                                   "Reload requested; nothing to reload, sampling goes on")));
    EXPECT_EQ(korvsnmpcd::ControlReply(RequestKind::kForbiddenControl),
              R"({"error":"control requests need root or the collector's own user","success":false})");
}

class ForeignPeer : public ::testing::Test {
protected:
    void SetUp() override
    {
        if (!korvtest::CanRunAsNobody())
            GTEST_SKIP() << "needs root, to run peers as uid " << kNobody << " (nobody)";
        ASSERT_FALSE(sticky_.Path().empty()) << "cannot make a sticky directory";
    }

    std::unique_ptr<CollectorProcess> StartCollector()
    {
        return std::make_unique<CollectorProcess>(
            KORVSNMPCD_PATH,
            std::vector<std::string>{"--foreground", "--socket", path_, "--interval", "0.05"},
            sticky_.Path() + "/korvsnmpcd.log");
    }

    korvtest::StickyDirectory sticky_;
    const std::string path_ = sticky_.Path() + "/korvsnmpcd.sock";
};

TEST_F(ForeignPeer, LibraryBelievesNoListenerOfAnotherUser)
{
    korvtest::NobodyListener squatter(path_, korvtest::Frame(kForgedReply));
    ASSERT_TRUE(squatter.Listening());
    const RedirectTo redirect(path_);
    const auto refusal = Logged(LOG_ERR, "socket_init",
                                "The peer on [/tmp/korvsnmpcd.sock] is not the collector: uid 65534 (pid " +
                                    std::to_string(squatter.Pid()) + ") is neither root nor uid " +
                                    std::to_string(geteuid()));
    const int descriptors = korvtest::OpenDescriptorCount();

    korvtest::ClearLog();
    const korvproto::UniqueFd connection(SocketInit());
    EXPECT_EQ(connection.Get(), -1);
    EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(refusal));

    // As when no collector can be reached: -1, no descriptor, the earlier reply kept.
    Transmitor transmitor("localhost");
    transmitor.dataStr = "the earlier reply";
    korvtest::ClearLog();
    EXPECT_EQ(transmitor.Transmit(korvtest::ParseJson(kStatisticsRequest)), -1);
    EXPECT_EQ(transmitor.socketFd, -1);
    EXPECT_EQ(transmitor.dataStr, "the earlier reply");
    EXPECT_THAT(korvtest::LoggedMessages(), ElementsAre(refusal));

    const struct {
        const char *request;
        std::function<bool()> send;
    } controls[] = {
        {R"({"request":"reload"})", [] { return Transmitor::Reload(); }},
        {R"({"reason":"test","request":"history_mode"})",
         [] { return Transmitor::EnterHistoryMode("test"); }},
    };
    for (const auto &control : controls) {
        korvtest::ClearLog();
        EXPECT_FALSE(control.send()) << control.request;
        EXPECT_THAT(korvtest::LoggedMessages(),
                    ElementsAre(refusal, Logged(LOG_ERR, "transmitor",
                                                std::string("Failed to send request to korvsnmpcd, "
                                                            "request: [") +
                                                    control.request + "]")))
            << control.request;
    }
    EXPECT_EQ(korvtest::OpenDescriptorCount(), descriptors);
    // Four connections, not one byte sent on any of them.
    EXPECT_THAT(squatter.Received(4), ElementsAre(0u, 0u, 0u, 0u));
}

// A caller of another user than root believes a collector of its own user
// (and, as every other test shows, root's).
TEST_F(ForeignPeer, LibraryOfAnotherUserBelievesACollectorOfItsOwnUser)
{
    const RedirectTo redirect(path_);
    const std::string path = path_;
    korvtest::AsNobody caller([path] {
        const korvproto::UniqueFd listener(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const sockaddr_un address = korvtest::SocketAddress(path);
        if (bind(listener.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0 ||
            listen(listener.Get(), 1) != 0)
            return std::string("cannot listen");
        // The connection is made, and judged, before anyone accepts it.
        const korvproto::UniqueFd connection(SocketInit());
        return std::string(connection.Valid() ? "believed" : "refused");
    });
    EXPECT_EQ(caller.Result(), std::optional<std::string>("believed"));
}

// What another user may leave at the collector's path, all replaced.
struct Squatter {
    const char *kind;  // as the collector's warning names it
    // Makes it at `path` in `directory`; null: a listener of nobody's.
    void (*make)(const std::string &path, const std::string &directory);
};

// A file that nobody's link points to, which must stay as it is.
const char kLinkTarget[] = "target";

void MakeNobodysFile(const std::string &path, const std::string &)
{
    std::ofstream(path) << "squatting";
    EXPECT_EQ(chown(path.c_str(), kNobody, kNobody), 0);
}

void MakeNobodysLink(const std::string &path, const std::string &directory)
{
    const std::string target = directory + "/" + kLinkTarget;
    std::ofstream(target) << "keep me";
    EXPECT_EQ(symlink(target.c_str(), path.c_str()), 0);
    EXPECT_EQ(lchown(path.c_str(), kNobody, kNobody), 0);
}

class CollectorPathTaken : public ForeignPeer, public ::testing::WithParamInterface<Squatter> {};

TEST_P(CollectorPathTaken, FromAnotherUserWithAWarningNamingTheOwner)
{
    std::optional<korvtest::NobodyListener> listener;
    if (GetParam().make)
        GetParam().make(path_, sticky_.Path());
    else
        ASSERT_TRUE(listener.emplace(path_, korvtest::Frame(kForgedReply)).Listening());
    struct stat squatted;
    ASSERT_EQ(lstat(path_.c_str(), &squatted), 0);
    ASSERT_EQ(squatted.st_uid, kNobody);

    auto collector = StartCollector();
    const std::string warning = "Replaced [" + path_ + "], a " + GetParam().kind +
                                " of uid 65534 (nobody), not this collector's";
    ASSERT_TRUE(korvtest::Eventually(
        [&] { return collector->Log().find(warning) != std::string::npos; }))
        << collector->Log();

    struct stat taken;
    ASSERT_EQ(lstat(path_.c_str(), &taken), 0);
    EXPECT_TRUE(S_ISSOCK(taken.st_mode));
    EXPECT_EQ(taken.st_uid, 0u);
    EXPECT_EQ(taken.st_mode & 07777, 0666u);
    // The socket was made under a name of its own and renamed: none is left over.
    for (const std::string &name : Entries(sticky_.Path()))
        EXPECT_THAT(name, Not(::testing::StartsWith("korvsnmpcd.sock."))) << "left over";
    // A link is replaced, never followed.
    EXPECT_EQ(korvtest::ReadWholeFile(sticky_.Path() + "/" + kLinkTarget),
              GetParam().make == MakeNobodysLink ? "keep me" : "");

    const RedirectTo redirect(path_);
    const Json::Value reply = LibraryStatistics();
    EXPECT_TRUE(reply["data"]["Memory"].isArray()) << reply;
    EXPECT_FALSE(reply.isMember("success")) << "the squatter's reply";
    EXPECT_EQ(collector->Stop(SIGTERM), 0) << collector->Log();
    EXPECT_NE(access(path_.c_str(), F_OK), 0) << "socket file left behind";
}

INSTANTIATE_TEST_SUITE_P(
    Squatters, CollectorPathTaken,
    ::testing::Values(Squatter{"socket", nullptr}, Squatter{"regular file", MakeNobodysFile},
                      Squatter{"symbolic link", MakeNobodysLink}),
    [](const auto &info) {
        std::string name = info.param.kind;
        name.erase(std::remove(name.begin(), name.end(), ' '), name.end());
        return name;
    });

TEST_F(ForeignPeer, AnotherUserGetsStatisticsButCannotSteerTheCollector)
{
    auto collector = StartCollector();
    ASSERT_TRUE(korvtest::WaitUntilConnectable(path_)) << collector->Log();
    const RedirectTo redirect(path_);
    const std::string path = path_;
    korvtest::AsNobody client([path] {
        Json::Value report(Json::objectValue);
        report["reload"] = Transmitor::Reload();
        report["history_mode"] = Transmitor::EnterHistoryMode("backup");
        report["statistics"] = LibraryStatistics()["data"]["Memory"].isArray();
        report["answer"] = korvtest::ExchangeWith(
            path, korvproto::EncodeRequestFrame(korvtest::ParseJson(R"({"request":"reload"})")));
        return korvproto::CompactJson(report);
    });
    const std::optional<std::string> report = client.Result();
    ASSERT_TRUE(report.has_value());
    EXPECT_EQ(*report,
              korvtest::Canonical(R"({"answer":"{\"error\":\"control requests need root or the )"
                                  R"(collector's own user\",\"success\":false}",)"
                                  R"("history_mode":false,"reload":false,"statistics":true})"));

    const std::string log = collector->Log();
    EXPECT_EQ(Occurrences(log, "Refused a control request from uid 65534 (pid "), 3u) << log;
    EXPECT_THAT(log, HasSubstr("): only root and uid 0 may steer the collector"));
    EXPECT_THAT(log, Not(HasSubstr("Reload requested")));
    EXPECT_THAT(log, Not(HasSubstr("History mode requested")));

    // Root still steers it.
    EXPECT_TRUE(Transmitor::Reload());
    EXPECT_THAT(collector->Log(), HasSubstr("Reload requested"));
    EXPECT_EQ(collector->Stop(SIGTERM), 0) << collector->Log();
}

TEST_F(ForeignPeer, KorvsnmpStatSaysThatControlNeedsRoot)
{
    auto collector = StartCollector();
    ASSERT_TRUE(korvtest::WaitUntilConnectable(path_)) << collector->Log();
    // The later assignment of the variable wins over the prefix's own.
    const std::string command = korvtest::RedirectedChildPrefix() +
                                KORVTEST_COLLECTOR_SOCKET_VARIABLE "='" + path_ + "' " +
                                KORVSNMP_STAT_PATH;
    const struct {
        const char *arguments;
        const char *says;
    } cases[] = {
        {" --reload", "the collector did not reload"},
        {" --history-mode backup", "the collector did not enter history mode"},
    };
    for (const auto &c : cases) {
        korvtest::AsNobody stat([&] {
            std::string output;
            FILE *pipe = popen((command + c.arguments + " 2>&1").c_str(), "r");
            char piece[1024];
            for (size_t got; pipe != nullptr && (got = fread(piece, 1, sizeof piece, pipe)) > 0;)
                output.append(piece, got);
            const int status = pipe != nullptr ? pclose(pipe) : -1;
            return std::to_string(WEXITSTATUS(status)) + " " + output;
        });
        const std::optional<std::string> result = stat.Result();
        ASSERT_TRUE(result.has_value()) << c.arguments;
        EXPECT_THAT(*result, ::testing::StartsWith("1 ")) << c.arguments;
        EXPECT_THAT(*result, HasSubstr(std::string("korvsnmp-stat: ") + c.says +
                                       "; control requests need root, and this runs as uid 65534"))
            << c.arguments;
        EXPECT_THAT(*result, HasSubstr("control requests need root or the collector's own user"))
            << c.arguments;
    }
    EXPECT_EQ(collector->Stop(SIGTERM), 0) << collector->Log();
}

}  // namespace
