// The sampling thread and the library's road for one sample.
#include "sampler.h"

#include <fcntl.h>
#include <poll.h>
#include <syslog.h>
#include <unistd.h>

#include <cerrno>
#include <exception>
#include <new>

#include <korvsnmp/korvsnmp.h>

#include "korv_net.h"

namespace korvagentx {

namespace {

constexpr char kUnit[] = "sampler";
constexpr char kWakeSample = 's';
constexpr char kWakeStop = 'q';
constexpr size_t kPppoeNameSize = 16;

const char *const kResources[] = {"cpu", "memory", "network", "disk", "space", "lun", "nfs"};
// The result member that each resource fills, in kResources' order.
const char *const kMembers[] = {"cpu", "memory", "network", "disk", "space", "lun", "nfs"};

Json::Value RequestFor(const char *resource)
{
    Json::Value request(Json::objectValue);
    request["resource"].append(resource);
    return request;
}

// SNMPParseReplyData, with the JSON library's errors on values of unexpected
// types kept in here.
bool Assemble(const Json::Value &request, const Json::Value &reply, Json::Value &result)
{
    try {
        return SNMPParseReplyData(request, reply, result);
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
    Json::Value request = RequestFor("all");
    Json::Value reply;
    if (transmitor.Transmit(request) != 0 || transmitor.GetDataJson(reply) != 0)
        return outcome;
    outcome.replied = true;
    Json::Value whole(Json::objectValue);
    if (Assemble(request, reply, whole) && whole.isObject()) {
        outcome.result = std::move(whole);
        return outcome;
    }
    // Something is missing or malformed: take each section on its own, so that
    // one bad section leaves the others in place and its own table empty.
    outcome.result = Json::Value(Json::objectValue);
    for (size_t i = 0; i < std::size(kResources); ++i) {
        Json::Value part(Json::objectValue);
        Assemble(RequestFor(kResources[i]), reply, part);
        if (part.isObject() && part.isMember(kMembers[i]))
            outcome.result[kMembers[i]] = part[kMembers[i]];
        if (part.isObject() && part.isMember("time"))
            outcome.result["time"] = part["time"];
    }
    return outcome;
}

NetworkKinds AskNetworkKinds(const Json::Value &result)
{
    NetworkKinds kinds;
    const Json::Value *network = result.isObject() ? result.find("network", "network" + 7) : nullptr;
    if (network != nullptr && network->isArray()) {
        for (const Json::Value &record : *network) {
            if (!record.isObject() || !record.isMember("device") || !record["device"].isString())
                continue;
            const std::string device = record["device"].asString();
            if (KLIBNetOVSIfIsMaster(device.c_str()) == 2)
                kinds.aggregations.insert(device);
        }
    }
    char pppoe[kPppoeNameSize] = {};
    if (KORVPPPoeIntfGet(pppoe, sizeof pppoe) == 0) {
        pppoe[kPppoeNameSize - 1] = '\0';
        kinds.pppoePrefix = pppoe;
    }
    return kinds;
}

Sampler::Sampler(uint32_t intervalSeconds) : intervalSeconds_(intervalSeconds)
{
    TableIndexes none;
    current_ = std::make_shared<const Snapshot>(BuildSnapshot(
        Json::Value(), NetworkKinds{}, none, intervalSeconds_, std::chrono::steady_clock::now()));
}

Sampler::~Sampler()
{
    Stop();
}

void Sampler::Start()
{
    if (thread_.joinable())
        return;
    if (pipe2(wakeFds_, O_CLOEXEC | O_NONBLOCK) != 0) {
        syslog(LOG_ERR, "%s:%d Cannot create the wake-up pipe, errno=%d", kUnit, __LINE__, errno);
        wakeFds_[0] = wakeFds_[1] = -1;
    }
    stopping_ = false;
    thread_ = std::thread(&Sampler::Run, this);
}

void Sampler::Stop()
{
    stopping_ = true;
    if (wakeFds_[1] >= 0) {
        ssize_t ignored = write(wakeFds_[1], &kWakeStop, 1);
        (void)ignored;
    }
    if (thread_.joinable())
        thread_.join();
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

std::shared_ptr<const Snapshot> Sampler::Current() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return current_;
}

void Sampler::Run()
{
    const int intervalMs = static_cast<int>(std::min<uint64_t>(intervalSeconds_ * 1000ull, INT32_MAX));
    auto due = std::chrono::steady_clock::now();
    while (!stopping_) {
        const auto now = std::chrono::steady_clock::now();
        if (now >= due) {
            Sample();
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
    auto snapshot = std::make_shared<const Snapshot>(
        BuildSnapshot(outcome.result, AskNetworkKinds(outcome.result), indexes_, intervalSeconds_,
                      std::chrono::steady_clock::now()));
    std::lock_guard<std::mutex> lock(mutex_);
    current_ = std::move(snapshot);
}

}  // namespace korvagentx
