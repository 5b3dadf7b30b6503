#include "snapshot_exporter.h"

#include <pthread.h>
#include <signal.h>

#include <sstream>
#include <utility>

namespace korvexporter {

namespace {

// Sent to the sampling thread on stop: the library's wait on the collector
// fails with EINTR, so a stop never waits for the library's timeout.
constexpr int kInterruptSignal = SIGUSR2;
constexpr auto kInterruptRepeat = std::chrono::milliseconds(50);

void IgnoreInterrupt(int) {}

// The families in `format`; the `last` of OpenMetrics with its end.
std::string Text(const korvexposition::Exposition &exposition, korvexposition::TextFormat format,
                 bool last = false)
{
    std::ostringstream out;
    if (last && format == korvexposition::TextFormat::OpenMetrics)
        korvexposition::WriteOpenMetrics(exposition, out);
    else
        korvexposition::WriteFamilies(exposition, format, out);
    return out.str();
}

}  // namespace

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
    const korvexposition::Exposition exposition = korvexposition::BuildExposition(result, kinds);
    auto snapshot = std::make_shared<Snapshot>();
    snapshot->openMetrics = Text(exposition, korvexposition::TextFormat::OpenMetrics);
    snapshot->classic = Text(exposition, korvexposition::TextFormat::Classic);
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

std::string SnapshotExporter::Render(korvexposition::TextFormat format) const
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
    const bool openMetrics = format == korvexposition::TextFormat::OpenMetrics;
    std::string text;
    if (snapshot != nullptr) {
        text = openMetrics ? snapshot->openMetrics : snapshot->classic;
        frontEnd.snapshotAgeSeconds = std::chrono::duration<double>(now_() - snapshot->taken).count();
    }
    return text + Text(korvexposition::BuildFrontEnd(frontEnd), format, true);
}

}  // namespace korvexporter
