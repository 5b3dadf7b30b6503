// The collector under a crowd of idle, slow and garbage-sending clients:
// well-formed requests are still answered at once, every client has a
// bounded time, the descriptors stay bounded and return to their baseline,
// and refusals are logged by the count, not one line each.
#include <sys/resource.h>
#include <unistd.h>

#include <chrono>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "client_crowd.h"
#include "collector_process.h"
#include "event_throttle.h"

namespace {

using korvtest::ClientCrowd;
using korvtest::CollectorProcess;
using korvtest::CrowdSize;
using korvtest::Eventually;
using ::testing::HasSubstr;
using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;

constexpr auto kProbeLimit = milliseconds(5000);
// Generous for a loaded two-core machine and the sanitizer build; a daemon
// that leaves requests in the backlog behind the crowd takes seconds.
constexpr auto kProbeP99Bound = milliseconds(1000);
constexpr size_t kDescriptorSlack = 16;

size_t CountLines(const std::string &text, const std::string &part)
{
    size_t count = 0;
    for (size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1)) ++count;
    return count;
}

// The crowd's connections, the probes' and the daemon's own must fit this process's limit.
bool RoomForDescriptors(rlim_t wanted)
{
    rlimit limit;
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0 || limit.rlim_max < wanted) return false;
    limit.rlim_cur = std::max(limit.rlim_cur, wanted);
    return setrlimit(RLIMIT_NOFILE, &limit) == 0;
}

class KorvsnmpcdCrowd : public ::testing::Test {
protected:
    void Start(const std::vector<std::string> &options)
    {
        std::vector<std::string> args = {"--socket", path_, "--foreground"};
        args.insert(args.end(), options.begin(), options.end());
        daemon_.emplace(KORVSNMPCD_PATH, args, path_ + ".log");
        ASSERT_TRUE(korvtest::WaitUntilConnectable(path_)) << daemon_->Log();
        ASSERT_TRUE(Eventually([&] { return korvtest::TimedProbe(path_, kProbeLimit).count() > 0; }));
        baseline_ = korvtest::OpenDescriptorCount(daemon_->Pid());
    }
    void TearDown() override { if (daemon_) { EXPECT_EQ(daemon_->Stop(SIGTERM), 0) << daemon_->Log(); } }
    bool BackToBaseline() {
        return Eventually([&] { return korvtest::OpenDescriptorCount(daemon_->Pid()) == baseline_; }); }

    const std::string path_ = "/tmp/korvsnmpcd-crowd-" + std::to_string(getpid()) + "-main.sock";
    std::optional<CollectorProcess> daemon_;
    size_t baseline_ = 0;
};

TEST_F(KorvsnmpcdCrowd, WellFormedRequestsAreAnsweredPromptlyAmidThousandsOfHostileClients)
{
    const CrowdSize size{2000, 100, 200};
    const size_t crowd = size.idle + size.slow + size.garbage;
    if (!RoomForDescriptors(crowd + 256)) GTEST_SKIP() << "the descriptor limit is below " << crowd + 256;
    Start({"--client-timeout", "60"});  // the crowd stays connected for the whole test
    Clock::time_point start = Clock::now();
    {
        ClientCrowd clients(path_, size);
        // Garbage senders are closed and come back all the time; the idle ones stay.
        ASSERT_TRUE(Eventually([&] { return clients.Connected() >= size.idle; }))
            << clients.Connected() << " of " << crowd << " connected";

        std::vector<std::chrono::microseconds> latencies;
        size_t failures = 0;
        for (int i = 0; i < 100 && failures < 3; ++i) {
            auto took = korvtest::TimedProbe(path_, kProbeLimit);
            took.count() < 0 ? void(++failures) : latencies.push_back(took);
        }
        EXPECT_EQ(failures, 0u) << "requests not answered within " << kProbeLimit.count() << " ms";
        EXPECT_LT(korvtest::Percentile(latencies, 99), kProbeP99Bound);
        EXPECT_LE(korvtest::OpenDescriptorCount(daemon_->Pid()), baseline_ + crowd + kDescriptorSlack);
        EXPECT_TRUE(Eventually([&] { return clients.ClosedByPeer() > 0; })) << "garbage never refused";
    }
    EXPECT_TRUE(BackToBaseline()) << korvtest::OpenDescriptorCount(daemon_->Pid());

    // Two kinds of refusal, each reported at once and then at most once per 10 s.
    auto periods = std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - start).count() / 10;
    EXPECT_LE(CountLines(daemon_->Log(), "Refused "), size_t(2 * (1 + periods))) << daemon_->Log();
}

TEST_F(KorvsnmpcdCrowd, AtTheCapTheOldestUnfinishedConnectionMakesRoom)
{
    Start({"--client-timeout", "60", "--max-connections", "50"});
    ClientCrowd idle(path_, CrowdSize{300, 0, 0}, /*reconnect=*/false);
    for (int i = 0; i < 20; ++i)
        EXPECT_GT(korvtest::TimedProbe(path_, kProbeLimit).count(), 0) << "probe " << i;
    EXPECT_TRUE(Eventually([&] { return idle.ClosedByPeer() >= 250; })) << idle.ClosedByPeer();
    EXPECT_LE(korvtest::OpenDescriptorCount(daemon_->Pid()), baseline_ + 50);
    EXPECT_EQ(CountLines(daemon_->Log(), "unfinished connection(s) to stay within 50 connections"), 1u)
        << daemon_->Log();
}

TEST_F(KorvsnmpcdCrowd, SilentAndSlowClientsAreClosedAtTheirDeadline)
{
    // One byte every 100 ms never finishes a request within 200 ms: each byte must not buy time.
    Start({"--client-timeout", "0.2"});
    Clock::time_point start = Clock::now();
    ClientCrowd stalling(path_, CrowdSize{100, 20, 0}, /*reconnect=*/false);
    EXPECT_GT(korvtest::TimedProbe(path_, kProbeLimit).count(), 0) << "held up by the stalled ones";
    EXPECT_TRUE(Eventually([&] { return stalling.ClosedByPeer() == 120; })) << stalling.ClosedByPeer();
    EXPECT_GE(Clock::now() - start, milliseconds(200)) << "closed before their deadline";
    EXPECT_TRUE(BackToBaseline());
    EXPECT_THAT(daemon_->Log(),
                HasSubstr("Closed 1 connection(s) that did not finish their exchange within 200 ms"));
}

TEST(KorvsnmpcdEventThrottle, FirstAtOnceThenOneCountPerPeriod)
{
    korvsnmpcd::EventThrottle throttle(milliseconds(10000));
    const Clock::time_point t0;
    // {Record (else Due), at ms, reported}: nothing yet; the first at once, then counted; not before the
    // period is over; nothing pending; within the last report's period; a lone event after a quiet spell.
    struct Step { bool record; int atMs; uint64_t reported; } steps[] = {
        {false, 0, 0}, {true, 0, 1}, {true, 1000, 0}, {true, 2000, 0}, {false, 9999, 0}, {false, 10000, 2},
        {false, 15000, 0}, {true, 16000, 0}, {true, 20000, 2}, {true, 45000, 1}};
    for (const Step &step : steps)
        EXPECT_EQ(step.record ? throttle.Record(t0 + milliseconds(step.atMs))
                              : throttle.Due(t0 + milliseconds(step.atMs)), step.reported)
            << (step.record ? "Record" : "Due") << " at " << step.atMs << " ms";
}

}  // namespace
