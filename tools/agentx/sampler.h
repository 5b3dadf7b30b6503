// The sampling thread: every interval (or at once on SampleNow) it runs the
// library's whole road, Transmit, GetDataJson and SNMPParseReplyData, builds
// a snapshot and publishes it. Readers take the latest snapshot without ever
// waiting on the library, the collector or the platform.
#ifndef KORVAGENTX_SAMPLER_H
#define KORVAGENTX_SAMPLER_H

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <mutex>
#include <thread>

#include <json/value.h>

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
    explicit Sampler(uint32_t intervalSeconds);
    ~Sampler();  // stops the thread
    Sampler(const Sampler &) = delete;
    Sampler &operator=(const Sampler &) = delete;

    void Start();
    // Ends the thread, breaking off an exchange with the collector under way
    // (SIGUSR2 to the thread). Call it from one thread only.
    void Stop();
    // Takes a sample now. Async-signal-safe.
    void SampleNow();

    std::shared_ptr<const Snapshot> Current() const;
    uint32_t FailedSamples() const { return failed_.load(); }

private:
    void Run();
    void Sample();

    const uint32_t intervalSeconds_;
    int wakeFds_[2] = {-1, -1};
    std::atomic<bool> stopping_{false};
    std::atomic<bool> running_{false};
    std::atomic<uint32_t> failed_{0};
    bool collectorAway_ = false;
    TableIndexes indexes_;
    mutable std::mutex mutex_;
    std::shared_ptr<const Snapshot> current_;
    std::thread thread_;
};

}  // namespace korvagentx

#endif
