// The sampling thread and the library's road for one sample.
#include "sampler.h"

#include <fcntl.h>
#include <poll.h>
#include <pthread.h>
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <exception>
#include <new>

#include <korvsnmp/korvsnmp.h>

namespace korvagentx {

namespace {

constexpr char kUnit[] = "sampler";
constexpr char kWakeSample = 's';
constexpr char kWakeStop = 'q';
// Sent to the sampling thread on stop: it breaks a wait on the collector
// (the library's select() fails with EINTR), so a stop never waits 90 s.
constexpr int kInterruptSignal = SIGUSR2;
constexpr auto kInterruptRepeat = std::chrono::milliseconds(50);

void IgnoreInterrupt(int) {}

std::string IndexPath(const std::string &stateDirectory)
{
    return stateDirectory + "/" + kIndexFileName;
}

// The sampling thread takes none of the process's asynchronous signals (they
// belong to the program that it runs in) but the interrupt; faults stay
// deliverable.
void KeepOnlyTheInterrupt()
{
    sigset_t blocked;
    sigfillset(&blocked);
    for (int signal : {kInterruptSignal, SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGTRAP, SIGABRT})
        sigdelset(&blocked, signal);
    pthread_sigmask(SIG_SETMASK, &blocked, nullptr);
}

// Each resource, the reply section that it needs and the result member
// that it fills.
struct Section {
    const char *resource;
    const char *replySection;
    const char *member;
};
const Section kSections[] = {
    {"cpu", "System", "cpu"},      {"memory", "Memory", "memory"}, {"network", "Network", "network"},
    {"disk", "DiskIO", "disk"},    {"space", "SpaceIO", "space"},  {"lun", "iSCSI", "lun"},
    {"nfs", "NFS", "nfs"},
};

Json::Value RequestFor(const char *resource)
{
    Json::Value request(Json::objectValue);
    request["resource"].append(resource);
    return request;
}

// SNMPParseReplyData, with the JSON library's errors on values of unexpected
// types kept in here.
bool Assemble(const Json::Value &request, Json::Value &&reply, Json::Value &result)
{
    try {
        return SNMPParseReplyData(request, std::move(reply), result);
    } catch (const std::bad_alloc &) {
        throw;
    } catch (const std::exception &error) {
        syslog(LOG_ERR, "%s:%d The library could not assemble the reply: %s", kUnit, __LINE__,
               error.what());
        return false;
    }
}

}  // namespace

SampleOutcome TakeSample()
{
    SampleOutcome outcome;
    Transmitor transmitor("localhost");
    Json::Value reply;
    if (transmitor.Transmit(RequestFor("all")) != 0 || transmitor.GetDataJson(reply) != 0)
        return outcome;
    outcome.replied = true;
    outcome.result = Json::Value(Json::objectValue);
    Json::Value none;
    Json::Value &data = reply.isObject() && reply["data"].isObject() ? reply["data"] : none;
    const Json::Value *time = data.isObject() ? data.find("time", "time" + 4) : nullptr;
    if (time != nullptr)
        outcome.result["time"] = *time;
    // Each section on its own, moved out of the reply: a section that is
    // missing or that the library refuses leaves only its own table empty.
    for (const Section &section : kSections) {
        Json::Value part(Json::objectValue);
        if (data.isObject() && data.isMember(section.replySection))
            part["data"][section.replySection].swapPayload(data[section.replySection]);
        if (time != nullptr)
            part["data"]["time"] = *time;
        Json::Value filled(Json::objectValue);
        Assemble(RequestFor(section.resource), std::move(part), filled);
        if (filled.isObject() && filled.isMember(section.member))
            outcome.result[section.member].swapPayload(filled[section.member]);
    }
    return outcome;
}

Sampler::Sampler(uint32_t intervalSeconds, const std::string &stateDirectory, std::function<uint32_t()> upTime)
    : intervalSeconds_(intervalSeconds), upTime_(std::move(upTime)), stateDirectory_(stateDirectory),
      indexFile_(IndexPath(stateDirectory))
{
    SampleMemory none;
    std::atomic_store(&current_, std::make_shared<const EncodedSnapshot>(BuildSnapshot(
        Json::Value(), NetworkKinds{}, none, intervalSeconds_, 0, std::chrono::steady_clock::now())));
}

Sampler::~Sampler()
{
    Stop();
}

void Sampler::Start()
{
    if (thread_.joinable())
        return;
    if (loadedDirectory_ != stateDirectory_) {
        // Counters remembered under the former indexes mean nothing under the new ones.
        memory_ = SampleMemory();
        indexFile_ = IndexFile(IndexPath(stateDirectory_));
        indexFile_.Load(memory_.indexes);
        loadedDirectory_ = stateDirectory_;
    }
    if (pipe2(wakeFds_, O_CLOEXEC | O_NONBLOCK) != 0) {
        syslog(LOG_ERR, "%s:%d Cannot create the wake-up pipe, errno=%d", kUnit, __LINE__, errno);
        wakeFds_[0] = wakeFds_[1] = -1;
    }
    struct sigaction interrupt {};
    interrupt.sa_handler = IgnoreInterrupt;  // no SA_RESTART: waits end with EINTR
    sigaction(kInterruptSignal, &interrupt, &previousInterrupt_);
    stopping_ = false;
    running_ = true;
    thread_ = std::thread([this] {
        KeepOnlyTheInterrupt();
        Run();
        std::lock_guard<std::mutex> lock(endMutex_);
        running_ = false;
        ended_.notify_all();
    });
}

void Sampler::Stop()
{
    stopping_ = true;
    if (wakeFds_[1] >= 0) {
        ssize_t ignored = write(wakeFds_[1], &kWakeStop, 1);
        (void)ignored;
    }
    if (thread_.joinable()) {
        // The thread may be about to wait on the collector: repeat until it ends.
        std::unique_lock<std::mutex> lock(endMutex_);
        while (running_) {
            pthread_kill(thread_.native_handle(), kInterruptSignal);
            ended_.wait_for(lock, kInterruptRepeat, [this] { return !running_; });
        }
        lock.unlock();
        thread_.join();
        sigaction(kInterruptSignal, &previousInterrupt_, nullptr);
    }
    for (int &fd : wakeFds_) {
        if (fd >= 0)
            close(fd);
        fd = -1;
    }
}

void Sampler::SampleNow()
{
    if (wakeFds_[1] >= 0) {
        ssize_t ignored = write(wakeFds_[1], &kWakeSample, 1);
        (void)ignored;
    }
}

void Sampler::Run()
{
    const int intervalMs = static_cast<int>(std::min<uint64_t>(intervalSeconds_ * 1000ull, INT32_MAX));
    auto due = std::chrono::steady_clock::now();
    while (!stopping_) {
        const auto now = std::chrono::steady_clock::now();
        if (now >= due) {
            // Nothing may leave the thread: in snmpd that would end snmpd.
            try {
                Sample();
            } catch (const std::exception &error) {
                ++failed_;
                syslog(LOG_ERR, "%s:%d A sample failed: %s", kUnit, __LINE__, error.what());
            }
            due = std::chrono::steady_clock::now() + std::chrono::milliseconds(intervalMs);
            continue;
        }
        const auto wait = std::chrono::duration_cast<std::chrono::milliseconds>(due - now).count();
        pollfd wake{wakeFds_[0], POLLIN, 0};
        int ready = poll(&wake, wakeFds_[0] >= 0 ? 1 : 0, static_cast<int>(wait) + 1);
        if (ready > 0) {
            char byte;
            while (read(wakeFds_[0], &byte, 1) == 1)
                if (byte == kWakeSample)
                    due = std::chrono::steady_clock::now();
        }
    }
}

void Sampler::Sample()
{
    SampleOutcome outcome = TakeSample();
    if (!outcome.replied) {
        ++failed_;
        if (!collectorAway_)
            syslog(LOG_ERR, "%s:%d No statistics from the collector; answering from the last sample",
                   kUnit, __LINE__);
        collectorAway_ = true;
        return;
    }
    if (collectorAway_)
        syslog(LOG_NOTICE, "%s:%d The collector answers again", kUnit, __LINE__);
    collectorAway_ = false;
    auto snapshot = std::make_shared<const EncodedSnapshot>(
        BuildSnapshot(outcome.result, AskNetworkKinds(outcome.result), memory_, intervalSeconds_, upTime_(),
                      std::chrono::steady_clock::now()));
    std::atomic_store(&current_, std::shared_ptr<const EncodedSnapshot>(std::move(snapshot)));
    indexFile_.Save(memory_.indexes);
}

}  // namespace korvagentx
