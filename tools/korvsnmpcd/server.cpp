#include "server.h"

#include <poll.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "protocol/unit_log.h"
#include "reply.h"

namespace korvsnmpcd {
namespace {

constexpr char kLogUnit[] = "server";
constexpr mode_t kSocketMode = 0666;  // every local user may ask for statistics
constexpr size_t kReadChunk = 4096;

using Clock = std::chrono::steady_clock;

bool FillAddress(const std::string &path, sockaddr_un &address)
{
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address.sun_path)
        return false;
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    return true;
}

// Whether a daemon accepts connections on `path`; errno tells why not.
bool SomeoneAnswers(const sockaddr_un &address)
{
    UniqueFd probe(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!probe.Valid())
        return false;
    return connect(probe.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) == 0;
}

int MillisecondsUntil(Clock::time_point when, Clock::time_point now)
{
    if (when <= now)
        return 0;
    auto wait = std::chrono::ceil<std::chrono::milliseconds>(when - now).count();
    return static_cast<int>(std::min<decltype(wait)>(wait, INT32_MAX));
}

}  // namespace

struct Server::Connection {
    UniqueFd fd;
    Clock::time_point deadline;
    RequestDecoder request;
    std::string reply;  // the whole reply frame, once the request is in
    size_t sent = 0;
    bool done = false;
};

Server::Server(ServerOptions options) : options_(std::move(options)) {}

Server::~Server()
{
    struct stat file;
    if (ownsSocketFile_ && lstat(options_.socketPath.c_str(), &file) == 0 &&
        file.st_dev == socketDevice_ && file.st_ino == socketInode_)
        unlink(options_.socketPath.c_str());
}

bool Server::Listen()
{
    sigset_t stopSignals;
    sigemptyset(&stopSignals);
    sigaddset(&stopSignals, SIGTERM);
    sigaddset(&stopSignals, SIGINT);
    if (sigprocmask(SIG_BLOCK, &stopSignals, nullptr) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot block the stop signals: %m");
        return false;
    }
    signals_ = UniqueFd(signalfd(-1, &stopSignals, SFD_NONBLOCK | SFD_CLOEXEC));
    if (!signals_.Valid()) {
        KORVSNMP_LOG(LOG_ERR, "Cannot watch the stop signals: %m");
        return false;
    }
    return TakeSocketPath();
}

bool Server::TakeSocketPath()
{
    const char *path = options_.socketPath.c_str();
    sockaddr_un address;
    if (!FillAddress(options_.socketPath, address)) {
        KORVSNMP_LOG(LOG_ERR, "Socket path [%s] is empty or too long", path);
        return false;
    }

    struct stat existing;
    if (lstat(path, &existing) == 0) {
        if (!S_ISSOCK(existing.st_mode)) {
            KORVSNMP_LOG(LOG_ERR, "[%s] exists and is not a socket; not replacing it", path);
            return false;
        }
        if (SomeoneAnswers(address)) {
            KORVSNMP_LOG(LOG_ERR, "Another collector already answers on [%s]; not starting",
                           path);
            return false;
        }
        if (errno != ECONNREFUSED) {
            KORVSNMP_LOG(LOG_ERR, "Cannot tell whether a collector answers on [%s]: %m", path);
            return false;
        }
        if (unlink(path) != 0 && errno != ENOENT) {
            KORVSNMP_LOG(LOG_ERR, "Cannot remove the stale socket file [%s]: %m", path);
            return false;
        }
        KORVSNMP_LOG(LOG_NOTICE, "Replaced the stale socket file [%s]", path);
    } else if (errno != ENOENT) {
        KORVSNMP_LOG(LOG_ERR, "Cannot examine [%s]: %m", path);
        return false;
    }

    listening_ = UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (!listening_.Valid()) {
        KORVSNMP_LOG(LOG_ERR, "Cannot create the listening socket: %m");
        return false;
    }
    if (bind(listening_.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot bind [%s]: %m", path);
        return false;
    }
    struct stat made;
    if (lstat(path, &made) == 0) {
        socketDevice_ = made.st_dev;
        socketInode_ = made.st_ino;
        ownsSocketFile_ = true;
    }
    if (chmod(path, kSocketMode) != 0)
        KORVSNMP_LOG(LOG_WARNING, "Cannot open [%s] to every local user: %m", path);
    if (listen(listening_.Get(), SOMAXCONN) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot listen on [%s]: %m", path);
        return false;
    }
    return true;
}

bool Server::Run(Sampler &sampler)
{
    Clock::time_point nextSample = Clock::now() + options_.interval;
    std::vector<pollfd> watched;
    while (true) {
        Clock::time_point now = Clock::now();
        if (now >= nextSample) {
            sampler.Sample();
            now = Clock::now();
            // A late tick (a suspended host) is not made up for with a burst of samples.
            while (nextSample <= now)
                nextSample += options_.interval;
        }

        for (auto &connection : connections_) {
            if (connection->deadline <= now)
                connection->done = true;
        }
        connections_.erase(std::remove_if(connections_.begin(), connections_.end(),
                                          [](const auto &c) { return c->done; }),
                           connections_.end());

        Clock::time_point wakeUp = nextSample;
        watched.clear();
        watched.push_back({signals_.Get(), POLLIN, 0});
        bool accepting = connections_.size() < options_.maxConnections;
        watched.push_back({accepting ? listening_.Get() : -1, POLLIN, 0});
        for (const auto &connection : connections_) {
            short events = connection->reply.empty() ? POLLIN : POLLOUT;
            watched.push_back({connection->fd.Get(), events, 0});
            wakeUp = std::min(wakeUp, connection->deadline);
        }

        int ready = poll(watched.data(), watched.size(), MillisecondsUntil(wakeUp, now));
        if (ready < 0 && errno != EINTR) {
            KORVSNMP_LOG(LOG_ERR, "poll() failed: %m");
            return false;
        }
        if (ready <= 0)
            continue;

        if (watched[0].revents != 0) {
            signalfd_siginfo info;
            if (read(signals_.Get(), &info, sizeof info) == static_cast<ssize_t>(sizeof info)) {
                KORVSNMP_LOG(LOG_NOTICE, "Stopping on signal %u", info.ssi_signo);
                return true;
            }
        }
        // Connections accepted now are watched from the next round on.
        size_t watchedConnections = watched.size() - 2;
        for (size_t i = 0; i < watchedConnections; ++i) {
            short events = watched[i + 2].revents;
            if (events == 0)
                continue;
            Connection &connection = *connections_[i];
            if (connection.reply.empty())
                Receive(connection, sampler);
            else
                Send(connection);
        }
        if (watched[1].revents != 0)
            AcceptPending();
    }
}

void Server::AcceptPending()
{
    while (connections_.size() < options_.maxConnections) {
        UniqueFd fd(accept4(listening_.Get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
        if (!fd.Valid()) {
            if (errno != EAGAIN && errno != EWOULDBLOCK && errno != EINTR &&
                errno != ECONNABORTED)
                KORVSNMP_LOG(LOG_ERR, "accept() failed: %m");
            return;
        }
        auto connection = std::make_unique<Connection>();
        connection->fd = std::move(fd);
        connection->deadline = Clock::now() + options_.clientTimeout;
        connections_.push_back(std::move(connection));
    }
}

void Server::Receive(Connection &connection, const Sampler &sampler)
{
    char buffer[kReadChunk];
    while (connection.request.Current() == RequestDecoder::State::kIncomplete) {
        ssize_t got = read(connection.fd.Get(), buffer, sizeof buffer);
        if (got < 0 && errno == EINTR)
            continue;
        if (got < 0 && (errno == EAGAIN || errno == EWOULDBLOCK))
            return;
        if (got <= 0) {
            connection.done = true;  // the client left, or its connection broke
            return;
        }
        connection.request.Feed(buffer, static_cast<size_t>(got));
    }
    if (connection.request.Current() == RequestDecoder::State::kInvalid) {
        KORVSNMP_LOG(LOG_WARNING, "Closed a connection whose request length is 0 or beyond %u",
                       korvproto::kMaxRequestBytes);
        connection.done = true;
        return;
    }
    connection.reply = korvproto::EncodeFrame(AnswerRequest(connection.request.Body(),
                                                sampler.StatisticsReply()));
    Send(connection);
}

void Server::Send(Connection &connection)
{
    while (connection.sent < connection.reply.size()) {
        ssize_t put = send(connection.fd.Get(), connection.reply.data() + connection.sent,
                           connection.reply.size() - connection.sent, MSG_NOSIGNAL | MSG_DONTWAIT);
        if (put < 0 && errno == EINTR)
            continue;
        if (put < 0 && (errno == EAGAIN || errno == EWOULDBLOCK))
            return;
        if (put < 0) {
            connection.done = true;  // the client left before its reply
            return;
        }
        connection.sent += static_cast<size_t>(put);
    }
    connection.done = true;
}

}  // namespace korvsnmpcd
