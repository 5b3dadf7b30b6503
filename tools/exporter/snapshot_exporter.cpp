#include "snapshot_exporter.h"

#include <pthread.h>
#include <signal.h>

#include <utility>

namespace korvexporter {

namespace {

// Sent to the sampling thread on stop: the library's wait on the collector
// fails with EINTR, so a stop never waits for the library's timeout.
constexpr int kInterruptSignal = SIGUSR2;
constexpr auto kInterruptRepeat = std::chrono::milliseconds(50);

void IgnoreInterrupt(int) {}

prometheus::MetricFamily ToMetricFamily(const korvexposition::Family &family)
{
    const bool counter = family.type == korvexposition::FamilyType::Counter;
    prometheus::MetricFamily converted;
    converted.name = counter ? family.name + "_total" : family.name;
    converted.help = family.help;
    converted.type = counter ? prometheus::MetricType::Counter : prometheus::MetricType::Gauge;
    converted.metric.reserve(family.samples.size());
    for (const korvexposition::Sample &sample : family.samples) {
        prometheus::ClientMetric metric;
        metric.label.reserve(sample.labels.size());
        for (const korvexposition::Label &label : sample.labels)
            metric.label.push_back({label.name, label.value});
        if (counter)
            metric.counter.value = sample.value;
        else
            metric.gauge.value = sample.value;
        converted.metric.push_back(std::move(metric));
    }
    return converted;
}

}  // namespace

std::vector<prometheus::MetricFamily> ToMetricFamilies(const korvexposition::Exposition &exposition)
{
    std::vector<prometheus::MetricFamily> families;
    families.reserve(exposition.size());
    for (const korvexposition::Family &family : exposition)
        families.push_back(ToMetricFamily(family));
    return families;
}

SnapshotExporter::SnapshotExporter(std::chrono::milliseconds interval, SampleFunction sample, Clock now)
    : interval_(interval), sample_(std::move(sample)), now_(std::move(now))
{
}

SnapshotExporter::~SnapshotExporter()
{
    Stop();
}

void SnapshotExporter::SampleOnce()
{
    Json::Value result;
    korvexposition::NetworkKinds kinds;
    if (!sample_(result, kinds)) {
        ++failed_;
        collectorUp_ = false;
        return;
    }
    auto snapshot = std::make_shared<Snapshot>();
    snapshot->families = ToMetricFamilies(korvexposition::BuildExposition(result, kinds));
    snapshot->taken = now_();
    collectorUp_ = true;
    std::lock_guard<std::mutex> lock(mutex_);
    current_ = std::move(snapshot);
}

void SnapshotExporter::Start()
{
    struct sigaction action {};
    action.sa_handler = IgnoreInterrupt;
    sigemptyset(&action.sa_mask);
    sigaction(kInterruptSignal, &action, nullptr);  // no SA_RESTART: the wait breaks
    thread_ = std::thread([this] { Run(); });
}

void SnapshotExporter::Stop()
{
    if (!thread_.joinable())
        return;
    {
        std::lock_guard<std::mutex> lock(waitMutex_);
        stopping_ = true;
    }
    wake_.notify_all();
    // Until the thread has seen the stop: a signal breaks a wait in the library.
    std::unique_lock<std::mutex> lock(waitMutex_);
    while (!wake_.wait_for(lock, kInterruptRepeat, [this] { return !stopping_; }))
        pthread_kill(thread_.native_handle(), kInterruptSignal);
    lock.unlock();
    thread_.join();
}

void SnapshotExporter::Run()
{
    std::unique_lock<std::mutex> lock(waitMutex_);
    while (!wake_.wait_for(lock, interval_, [this] { return stopping_; })) {
        lock.unlock();
        SampleOnce();
        lock.lock();
    }
    stopping_ = false;  // seen
    wake_.notify_all();
}

std::vector<prometheus::MetricFamily> SnapshotExporter::Collect() const
{
    std::shared_ptr<const Snapshot> snapshot;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        snapshot = current_;
    }
    korvexposition::FrontEnd frontEnd;
    frontEnd.failedSamples = failed_.load();
    frontEnd.sampleIntervalSeconds =
        static_cast<uint32_t>(std::chrono::duration_cast<std::chrono::seconds>(interval_).count());
    frontEnd.collectorUp = collectorUp_.load();
    std::vector<prometheus::MetricFamily> families;
    if (snapshot != nullptr) {
        families = snapshot->families;
        frontEnd.snapshotAgeSeconds = std::chrono::duration<double>(now_() - snapshot->taken).count();
    }
    for (prometheus::MetricFamily &family : ToMetricFamilies(korvexposition::BuildFrontEnd(frontEnd)))
        families.push_back(std::move(family));
    return families;
}

}  // namespace korvexporter
