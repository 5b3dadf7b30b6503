#include "client_crowd.h"

#include <dirent.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <filesystem>
#include <iterator>
#include <random>

#include <json/value.h>

#include "collector_process.h"
#include "protocol/collector_protocol.h"

namespace korvtest {
namespace {

using Clock = std::chrono::steady_clock;

constexpr size_t kMaxGarbageChunk = 16;
constexpr int kPollSliceMs = 10;

enum class Kind { kIdle, kSlow, kGarbage };

// A non-blocking connection, or -1 (the backlog is full, or no listener).
int ConnectNow(const std::string &path)
{
    const sockaddr_un address = SocketAddress(path);
    korvproto::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    return fd.Valid() && connect(fd.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) == 0
        ? fd.Release() : -1;
}

std::string RequestFrame()
{
    Json::Value request;
    return request["resource"].append("all"), korvproto::EncodeRequestFrame(request);
}

}  // namespace

struct ClientCrowd::Client {
    Kind kind; int fd = -1;  // -1: no connection
    size_t sent = 0;  // bytes of the request a slow client has sent on this connection
    Clock::time_point nextSend;
};

ClientCrowd::ClientCrowd(std::string socketPath, CrowdSize size, bool reconnect)
    : path_(std::move(socketPath)), reconnect_(reconnect)
{
    const Clock::time_point start = Clock::now();
    std::mt19937 phases(7);
    std::uniform_int_distribution<Clock::rep> phase(0, Clock::duration(kCrowdTick).count() - 1);
    for (auto [kind, count] :
         {std::pair(Kind::kIdle, size.idle), {Kind::kSlow, size.slow}, {Kind::kGarbage, size.garbage}})
        for (size_t i = 0; i < count; ++i, connected_ += clients_.back().fd >= 0 ? 1 : 0)
            clients_.push_back({kind, ConnectNow(path_), 0, start + Clock::duration(phase(phases))});
    driver_ = std::thread([this] { Drive(); });
}

ClientCrowd::~ClientCrowd()
{
    stop_ = true, driver_.join();
    for (Client &client : clients_) close(client.fd);  // -1 for those closed already: harmless
}

void ClientCrowd::Drive()
{
    const std::string request = RequestFrame();
    std::mt19937 random(11);
    std::uniform_int_distribution<int> byte(0, 255);
    std::uniform_int_distribution<size_t> chunk(1, kMaxGarbageChunk);
    std::vector<pollfd> watched(clients_.size());  // one per client; fd -1 when it has no connection
    char sink[4096];

    while (!stop_) {
        const Clock::time_point now = Clock::now();
        for (size_t i = 0; i < clients_.size(); ++i) {
            Client &client = clients_[i];
            bool due = now >= client.nextSend;
            if (due) client.nextSend += kCrowdTick * ((now - client.nextSend) / kCrowdTick + 1);
            if (client.fd < 0) {
                if (due && reconnect_ && (client.sent = 0, client.fd = ConnectNow(path_)) >= 0) ++connected_;
            } else if (due && client.kind == Kind::kSlow && client.sent < request.size()) {
                client.sent += send(client.fd, &request[client.sent], 1, MSG_NOSIGNAL) == 1;
            } else if (due && client.kind == Kind::kGarbage) {
                char garbage[kMaxGarbageChunk];
                const size_t length = chunk(random);
                std::generate_n(garbage, length, [&] { return static_cast<char>(byte(random)); });
                (void)send(client.fd, garbage, length, MSG_NOSIGNAL);
            }
            watched[i] = {client.fd, POLLIN, 0};
        }

        if (poll(watched.data(), watched.size(), kPollSliceMs) <= 0) continue;
        for (size_t w = 0; w < watched.size(); ++w) {
            if (watched[w].revents == 0) continue;
            Client &client = clients_[w];
            const ssize_t got = read(client.fd, sink, sizeof sink);
            if (got > 0 || (got < 0 && (errno == EAGAIN || errno == EINTR))) continue;  // a reply to garbage
            close(client.fd), client.fd = -1, --connected_, ++closedByPeer_;
        }
    }
}

std::chrono::microseconds TimedProbe(const std::string &socketPath, std::chrono::milliseconds limit)
{
    const std::string request = RequestFrame();
    const Clock::time_point start = Clock::now();
    int fd = ConnectNow(socketPath);
    // The backlog is full: again.
    for (; fd < 0 && Clock::now() - start < limit; fd = ConnectNow(socketPath)) poll(nullptr, 0, 1);
    // A fresh connection's buffer takes the whole small request at once.
    bool sent = fd >= 0 && send(fd, request.data(), request.size(), MSG_NOSIGNAL) ==
                               static_cast<ssize_t>(request.size());
    std::string reply;
    ssize_t got = sent ? 1 : -1;
    while (got != 0 && sent && Clock::now() - start < limit) {
        pollfd ready = {fd, POLLIN, 0};
        auto left = std::chrono::ceil<std::chrono::milliseconds>(limit - (Clock::now() - start));
        if (poll(&ready, 1, static_cast<int>(std::max<long>(left.count(), 0))) <= 0) continue;
        char buffer[65536];
        got = read(fd, buffer, sizeof buffer);
        if (got > 0) reply.append(buffer, static_cast<size_t>(got));
        sent = got >= 0 || errno == EAGAIN;
    }
    if (fd >= 0) close(fd);
    auto took = std::chrono::duration_cast<std::chrono::microseconds>(Clock::now() - start);
    const size_t prefix = korvproto::kFramePrefixBytes;
    return got == 0 && reply.size() >= prefix
        && korvproto::DecodeFramePrefix(reply.data()) == reply.size() - prefix
        && reply.compare(prefix, 8, "{\"data\":") == 0 ? took : std::chrono::microseconds(-1);
}

std::chrono::microseconds Percentile(std::vector<std::chrono::microseconds> samples, double p)
{
    if (samples.empty()) return std::chrono::microseconds(0);
    std::sort(samples.begin(), samples.end());
    const auto rank = static_cast<size_t>(std::ceil(p / 100.0 * static_cast<double>(samples.size())));
    return samples[std::clamp<size_t>(rank, 1, samples.size()) - 1];
}

size_t OpenDescriptorCount(pid_t pid)
{
    std::error_code gone;  // the process has exited: none
    std::filesystem::directory_iterator fds("/proc/" + std::to_string(pid) + "/fd", gone);
    return static_cast<size_t>(std::distance(fds, std::filesystem::directory_iterator()));
}

}  // namespace korvtest
