// The exporter's heart: a thread samples the collector every interval and
// keeps the latest result as ready text, in both formats; a scrape copies it
// without ever waiting on the collector, and adds the snapshot's age, the
// failed samples, the interval and whether the last sample reached the
// collector.
#ifndef KORVSNMP_EXPORTER_SNAPSHOT_EXPORTER_H
#define KORVSNMP_EXPORTER_SNAPSHOT_EXPORTER_H

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include <json/value.h>

#include "exposition/exposition.h"

namespace korvexporter {

class SnapshotExporter {
public:
    // Fills `result` with one sample of the statistics; false when the
    // collector gave none. Called on the sampling thread only.
    using SampleFunction = std::function<bool(Json::Value &result, korvexposition::NetworkKinds &kinds)>;
    using Clock = std::function<std::chrono::steady_clock::time_point()>;

    SnapshotExporter(std::chrono::milliseconds interval, SampleFunction sample,
                     Clock now = std::chrono::steady_clock::now);
    ~SnapshotExporter();  // stops the thread
    SnapshotExporter(const SnapshotExporter &) = delete;
    SnapshotExporter &operator=(const SnapshotExporter &) = delete;

    // Takes one sample on the calling thread: a result replaces the
    // snapshot, a failure keeps the old one and counts.
    void SampleOnce();
    // Samples every interval on a thread of its own, from one interval on.
    void Start();
    // Ends the thread, breaking off an exchange with the collector under way
    // (SIGUSR2 to the thread, whose handler Start installs).
    void Stop();

    // The snapshot's families in `format`, then the sampling's own: the age
    // of the snapshot (none before the first), failed samples, the interval
    // and whether the last sample reached the collector; OpenMetrics ends
    // with "# EOF". Never waits on a sample.
    std::string Render(korvexposition::TextFormat format) const;

private:
    struct Snapshot {
        std::string openMetrics;  // without its end
        std::string classic;
        std::chrono::steady_clock::time_point taken;
    };

    void Run();

    const std::chrono::milliseconds interval_;
    const SampleFunction sample_;
    const Clock now_;
    std::atomic<uint64_t> failed_{0};
    std::atomic<bool> collectorUp_{false};
    mutable std::mutex mutex_;
    std::shared_ptr<const Snapshot> current_;
    std::mutex waitMutex_;
    std::condition_variable wake_;
    bool stopping_ = false;
    std::thread thread_;
};

}  // namespace korvexporter

#endif
