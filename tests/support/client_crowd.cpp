#include "client_crowd.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstring>
#include <random>
#include <sstream>

#include <json/value.h>

#include "protocol/collector_protocol.h"

namespace korvtest {
namespace {

using Clock = std::chrono::steady_clock;

constexpr size_t kMaxGarbageChunk = 16;
constexpr int kPollSliceMs = 10;

enum class Kind { kIdle, kSlow, kGarbage };

sockaddr_un Address(const std::string &path)
{
    sockaddr_un address;
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    return address;
}

// A non-blocking connection, or -1 (the backlog is full, or no listener).
int ConnectNow(const sockaddr_un &address)
{
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    if (fd < 0)
        return -1;
    if (connect(fd, reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

std::string RequestFrame()
{
    Json::Value request;
    request["resource"].append("all");
    return korvproto::EncodeRequestFrame(request);
}

}  // namespace

struct ClientCrowd::Client {
    Kind kind;
    int fd = -1;
    size_t sent = 0;  // bytes of the request a slow client has sent on this connection
    Clock::time_point nextSend;
};

ClientCrowd::ClientCrowd(std::string socketPath, CrowdSize size, bool reconnect)
    : path_(std::move(socketPath)), reconnect_(reconnect)
{
    const sockaddr_un address = Address(path_);
    Clock::time_point start = Clock::now();
    std::mt19937 phases(7);
    std::uniform_int_distribution<int> phaseMs(0, static_cast<int>(kCrowdTick.count()) - 1);
    auto add = [&](Kind kind, size_t count) {
        for (size_t i = 0; i < count; ++i) {
            Client client;
            client.kind = kind;
            client.nextSend = start + std::chrono::milliseconds(phaseMs(phases));
            client.fd = ConnectNow(address);
            if (client.fd >= 0)
                ++connected_;
            clients_.push_back(client);
        }
    };
    add(Kind::kIdle, size.idle);
    add(Kind::kSlow, size.slow);
    add(Kind::kGarbage, size.garbage);
    driver_ = std::thread([this] { Drive(); });
}

ClientCrowd::~ClientCrowd()
{
    stop_ = true;
    driver_.join();
    for (Client &client : clients_) {
        if (client.fd >= 0)
            close(client.fd);
    }
}

void ClientCrowd::Drive()
{
    const sockaddr_un address = Address(path_);
    const std::string request = RequestFrame();
    std::mt19937 random(11);
    std::uniform_int_distribution<int> byte(0, 255);
    std::uniform_int_distribution<size_t> chunk(1, kMaxGarbageChunk);
    std::vector<pollfd> watched;
    std::vector<size_t> owners;
    char sink[4096];

    while (!stop_) {
        Clock::time_point now = Clock::now();
        watched.clear();
        owners.clear();
        for (size_t i = 0; i < clients_.size(); ++i) {
            Client &client = clients_[i];
            bool due = now >= client.nextSend;
            if (due)
                client.nextSend += kCrowdTick * ((now - client.nextSend) / kCrowdTick + 1);
            if (client.fd < 0) {
                if (!due || !reconnect_)
                    continue;
                client.fd = ConnectNow(address);
                client.sent = 0;
                if (client.fd < 0)
                    continue;
                ++connected_;
            } else if (due && client.kind == Kind::kSlow && client.sent < request.size()) {
                if (send(client.fd, &request[client.sent], 1, MSG_NOSIGNAL) == 1)
                    ++client.sent;
            } else if (due && client.kind == Kind::kGarbage) {
                char garbage[kMaxGarbageChunk];
                size_t length = chunk(random);
                for (size_t b = 0; b < length; ++b)
                    garbage[b] = static_cast<char>(byte(random));
                (void)send(client.fd, garbage, length, MSG_NOSIGNAL);
            }
            watched.push_back({client.fd, POLLIN, 0});
            owners.push_back(i);
        }

        if (poll(watched.data(), watched.size(), kPollSliceMs) <= 0)
            continue;
        for (size_t w = 0; w < watched.size(); ++w) {
            if (watched[w].revents == 0)
                continue;
            Client &client = clients_[owners[w]];
            ssize_t got = read(client.fd, sink, sizeof sink);
            if (got > 0 || (got < 0 && (errno == EAGAIN || errno == EINTR)))
                continue;  // a reply to garbage; the close follows
            close(client.fd);
            client.fd = -1;
            --connected_;
            ++closedByPeer_;
        }
    }
}

std::chrono::microseconds TimedProbe(const std::string &socketPath,
                                     std::chrono::milliseconds limit)
{
    using std::chrono::microseconds;
    const microseconds failed(-1);
    const sockaddr_un address = Address(socketPath);
    const std::string request = RequestFrame();
    Clock::time_point start = Clock::now();
    Clock::time_point giveUp = start + limit;
    auto remainingMs = [&] {
        auto left = std::chrono::ceil<std::chrono::milliseconds>(giveUp - Clock::now()).count();
        return static_cast<int>(std::max<decltype(left)>(left, 0));
    };

    int fd = ConnectNow(address);
    while (fd < 0 && Clock::now() < giveUp) {  // the backlog is full: try again
        poll(nullptr, 0, 1);
        fd = ConnectNow(address);
    }
    if (fd < 0)
        return failed;
    size_t sent = 0;
    std::string reply;
    bool closed = false;
    while (!closed && Clock::now() < giveUp) {
        pollfd ready = {fd, static_cast<short>(sent < request.size() ? POLLOUT : POLLIN), 0};
        if (poll(&ready, 1, remainingMs()) <= 0)
            continue;
        if (sent < request.size()) {
            ssize_t put = send(fd, request.data() + sent, request.size() - sent, MSG_NOSIGNAL);
            if (put < 0 && errno != EAGAIN)
                break;
            sent += static_cast<size_t>(std::max<ssize_t>(put, 0));
            continue;
        }
        char buffer[65536];
        ssize_t got = read(fd, buffer, sizeof buffer);
        if (got > 0)
            reply.append(buffer, static_cast<size_t>(got));
        else if (got == 0 || errno != EAGAIN)
            closed = true;
    }
    close(fd);
    auto took = std::chrono::duration_cast<microseconds>(Clock::now() - start);
    const size_t prefix = korvproto::kFramePrefixBytes;
    if (!closed || reply.size() < prefix)
        return failed;
    bool whole = korvproto::DecodeFramePrefix(reply.data()) == reply.size() - prefix &&
                 reply.compare(prefix, 8, "{\"data\":") == 0;
    return whole ? took : failed;
}

std::chrono::microseconds Percentile(std::vector<std::chrono::microseconds> samples, double p)
{
    if (samples.empty())
        return std::chrono::microseconds(0);
    std::sort(samples.begin(), samples.end());
    size_t rank = static_cast<size_t>(std::ceil(p / 100.0 * static_cast<double>(samples.size())));
    return samples[std::clamp<size_t>(rank, 1, samples.size()) - 1];
}

size_t OpenDescriptorCount(pid_t pid)
{
    std::string dir = "/proc/" + std::to_string(pid) + "/fd";
    size_t count = 0;
    if (DIR *entries = opendir(dir.c_str())) {
        while (dirent *entry = readdir(entries)) {
            if (entry->d_name[0] != '.')
                ++count;
        }
        closedir(entries);
    }
    return count;
}

}  // namespace korvtest
