// The sampling thread: every interval (or at once on SampleNow) it runs the
// library's whole road, Transmit, GetDataJson and SNMPParseReplyData, builds
// a snapshot, lays it out for answering and publishes it by swapping one
// pointer. Readers take the latest snapshot without ever waiting on the
// library, the collector or the platform; the thread takes none of the
// process's signals but its own interrupt.
#ifndef KORVAGENTX_SAMPLER_H
#define KORVAGENTX_SAMPLER_H

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

#include <signal.h>

#include <json/value.h>

#include "encoded_snapshot.h"
#include "snapshot.h"

namespace korvagentx {

// What one sample brought: the assembled result, or nothing when the
// collector gave no reply (the previous snapshot then stays).
struct SampleOutcome {
    bool replied = false;
    Json::Value result;
};

// The whole road for one sample: a statistics request for everything; a
// section that the reply lacks (or that the library cannot assemble) is
// missing from the result, the others are there. Never throws but
// std::bad_alloc.
SampleOutcome TakeSample();

// The platform's answer to which network devices are aggregations and PPPoE.
using korvexposition::AskNetworkKinds;

class Sampler {
public:
    // `stateDirectory` keeps the row indexes (see SetStateDirectory);
    // `upTime` gives the agent's sysUpTime in hundredths of a second, from
    // the sampling thread.
    Sampler(uint32_t intervalSeconds, const std::string &stateDirectory, std::function<uint32_t()> upTime);
    ~Sampler();  // stops the thread
    // The interval of the samples after the next Start (while stopped).
    void SetInterval(uint32_t intervalSeconds) { intervalSeconds_ = intervalSeconds; }
    // The directory whose index file (kIndexFileName) keeps the row indexes
    // from the next Start (while stopped). That Start reads them from it when
    // it is another directory than at the previous Start; the indexes are
    // written there after each sample that changed them.
    void SetStateDirectory(const std::string &directory) { stateDirectory_ = directory; }
    Sampler(const Sampler &) = delete;
    Sampler &operator=(const Sampler &) = delete;

    // Starts the thread, which samples at once. A Sampler can be started
    // again after Stop: the last snapshot, the failure count and, in the
    // same state directory, the row indexes carry over.
    void Start();
    // Ends the thread, breaking off an exchange with the collector under way
    // (SIGUSR2 to the thread, whose previous handling is restored after).
    // Call it from one thread only.
    void Stop();
    // Takes a sample now. Async-signal-safe.
    void SampleNow();

    // The latest snapshot; never waits on a sample.
    std::shared_ptr<const EncodedSnapshot> Current() const { return std::atomic_load(&current_); }
    uint32_t FailedSamples() const { return failed_.load(); }

private:
    void Run();
    void Sample();

    uint32_t intervalSeconds_;
    int wakeFds_[2] = {-1, -1};
    std::atomic<bool> stopping_{false};
    std::atomic<bool> running_{false};
    std::atomic<uint32_t> failed_{0};
    bool collectorAway_ = false;
    const std::function<uint32_t()> upTime_;
    std::string stateDirectory_;
    std::optional<std::string> loadedDirectory_;  // where the indexes were read at a Start
    SampleMemory memory_;
    IndexFile indexFile_;
    std::mutex endMutex_;
    std::condition_variable ended_;
    struct sigaction previousInterrupt_ {};
    std::shared_ptr<const EncodedSnapshot> current_;  // std::atomic_load and std::atomic_store only
    std::thread thread_;
};

}  // namespace korvagentx

#endif
