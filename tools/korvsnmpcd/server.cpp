#include "server.h"

#include <signal.h>
#include <sys/epoll.h>
#include <sys/random.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <pwd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <vector>

#include "protocol/peer_credentials.h"
#include "protocol/unit_log.h"
#include "reply.h"
#include "reply_file.h"

namespace korvsnmpcd {
namespace {

constexpr char kLogUnit[] = "server";
constexpr size_t kReadChunk = 4096;
// The kernel caps it at net.core.somaxconn; every pending connection is
// accepted in one round, so the backlog only has to hold one round's arrivals.
constexpr int kListenBacklog = 4096;
constexpr size_t kAcceptRound = kListenBacklog;
// Descriptors kept beside the connections: the listener, the signals, the
// poller, syslog's socket, the statistics files being read.
constexpr rlim_t kSpareDescriptors = 64;
constexpr int kEventBatch = 256;
constexpr auto kLongestWait = std::chrono::seconds(1);

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

// The socket is made under a temporary name beside its path: the path plus
// this separator and kTemporaryLetters random letters.
constexpr char kTemporarySeparator = '.';
constexpr size_t kTemporaryLetters = 6;
constexpr int kTemporaryNameTries = 16;

// "uid N (name)", or "uid N" for a user without a name.
std::string DescribeUser(uid_t uid)
{
    std::string text = "uid " + std::to_string(uid);
    passwd entry;
    passwd *found = nullptr;
    char buffer[4096];
    if (getpwuid_r(uid, &entry, buffer, sizeof buffer, &found) == 0 && found != nullptr)
        text += std::string(" (") + found->pw_name + ")";
    return text;
}

const char *DescribeKind(mode_t mode)
{
    if (S_ISSOCK(mode))
        return "socket";
    if (S_ISREG(mode))
        return "regular file";
    if (S_ISLNK(mode))
        return "symbolic link";
    if (S_ISDIR(mode))
        return "directory";
    return "special file";
}

// Removes a socket file made under a temporary name, unless Keep() was called.
class TemporarySocketFile {
public:
    TemporarySocketFile() = default;
    ~TemporarySocketFile()
    {
        if (!path_.empty())
            unlink(path_.c_str());
    }
    TemporarySocketFile(const TemporarySocketFile &) = delete;
    TemporarySocketFile &operator=(const TemporarySocketFile &) = delete;

    void Hold(std::string path) { path_ = std::move(path); }
    const std::string &Path() const { return path_; }
    void Keep() { path_.clear(); }

private:
    std::string path_;
};

// Binds `fd` to a new name beside `path` that nobody holds yet, held by
// `made`. False (logged) when no such name fits or can be bound.
bool BindBeside(int fd, const std::string &path, TemporarySocketFile &made)
{
    static constexpr char kLetters[] = "abcdefghijklmnopqrstuvwxyz0123456789";
    for (int attempt = 0; attempt < kTemporaryNameTries; ++attempt) {
        unsigned char noise[kTemporaryLetters] = {};
        if (getrandom(noise, sizeof noise, 0) != static_cast<ssize_t>(sizeof noise)) {
            const auto now = static_cast<uint64_t>(Clock::now().time_since_epoch().count());
            for (size_t i = 0; i < kTemporaryLetters; ++i)
                noise[i] = static_cast<unsigned char>((now >> (8 * i)) + getpid() + attempt);
        }
        std::string name = path + kTemporarySeparator;
        for (unsigned char byte : noise)
            name += kLetters[byte % (sizeof kLetters - 1)];
        sockaddr_un address;
        if (!FillAddress(name, address)) {
            KORVSNMP_LOG(LOG_ERR, "Socket path [%s] leaves no room for a temporary name beside it",
                         path.c_str());
            return false;
        }
        if (bind(fd, reinterpret_cast<const sockaddr *>(&address), sizeof address) == 0) {
            made.Hold(std::move(name));
            return true;
        }
        if (errno != EADDRINUSE) {
            KORVSNMP_LOG(LOG_ERR, "Cannot bind [%s]: %m", name.c_str());
            return false;
        }
    }
    KORVSNMP_LOG(LOG_ERR, "Cannot find a free temporary name beside [%s]", path.c_str());
    return false;
}

// Whether the socket may be put at the path of `address`: nothing is there,
// or what is there may be replaced, which `replacing` then names for the log.
// Logs why not.
bool JudgeSocketPath(const sockaddr_un &address, std::string &replacing)
{
    const char *path = address.sun_path;
    struct stat existing;
    if (lstat(path, &existing) != 0) {
        if (errno == ENOENT)
            return true;
        KORVSNMP_LOG(LOG_ERR, "Cannot examine [%s]: %m", path);
        return false;
    }
    const std::string owner = DescribeUser(existing.st_uid);
    if (!korvproto::IsTrustedUser(existing.st_uid)) {
        // Another user's: whatever it is, it is not this collector, and the
        // library would not believe it anyway.
        if (S_ISDIR(existing.st_mode) && rmdir(path) != 0) {
            KORVSNMP_LOG(LOG_ERR, "[%s] is a directory of %s that cannot be removed: %m", path,
                         owner.c_str());
            return false;
        }
        replacing = std::string("[") + path + "], a " + DescribeKind(existing.st_mode) + " of " +
                    owner + ", not this collector's";
        return true;
    }
    if (!S_ISSOCK(existing.st_mode)) {
        KORVSNMP_LOG(LOG_ERR, "[%s] exists and is not a socket; not replacing it", path);
        return false;
    }
    if (SomeoneAnswers(address)) {
        KORVSNMP_LOG(LOG_ERR, "Another collector already answers on [%s]; not starting", path);
        return false;
    }
    if (errno != ECONNREFUSED) {
        KORVSNMP_LOG(LOG_ERR, "Cannot tell whether a collector answers on [%s]: %m", path);
        return false;
    }
    replacing = std::string("the stale socket file [") + path + "] of " + owner;
    return true;
}

int MillisecondsUntil(Clock::time_point when, Clock::time_point now)
{
    if (when <= now)
        return 0;
    auto wait = std::chrono::ceil<std::chrono::milliseconds>(when - now).count();
    return static_cast<int>(std::min<decltype(wait)>(wait, INT32_MAX));
}

}  // namespace

bool SomethingListensOn(const std::string &path)
{
    sockaddr_un address;
    if (!FillAddress(path, address)) {
        errno = ENAMETOOLONG;
        return false;
    }
    return SomeoneAnswers(address);
}

struct Server::Connection {
    UniqueFd fd;
    ucred peer{0, static_cast<uid_t>(-1), static_cast<gid_t>(-1)};
    bool mayControl = false;  // root or the collector's own user
    Clock::time_point deadline;
    RequestDecoder request;
    std::string reply;  // the whole reply frame, once the request is in
    size_t sent = 0;
    bool done = false;
    std::list<Connection>::iterator self;
};

Server::Server(ServerOptions options)
    : options_(std::move(options))
{
    for (size_t event = 0; event < kEventKinds; ++event)
        throttles_.emplace_back(options_.logPeriod);
}

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
    poller_ = UniqueFd(epoll_create1(EPOLL_CLOEXEC));
    if (!poller_.Valid()) {
        KORVSNMP_LOG(LOG_ERR, "Cannot create the poller: %m");
        return false;
    }
    return FitConnectionCap() && TakeSocketPath() && Watch(signals_.Get(), EPOLLIN, &signals_) &&
           Watch(listening_.Get(), EPOLLIN, &listening_);
}

bool Server::FitConnectionCap()
{
    rlimit limit;
    if (getrlimit(RLIMIT_NOFILE, &limit) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot read the descriptor limit: %m");
        return false;
    }
    rlim_t wanted = static_cast<rlim_t>(options_.maxConnections) + kSpareDescriptors;
    if (limit.rlim_cur < wanted) {
        limit.rlim_cur = std::min(wanted, limit.rlim_max);
        if (setrlimit(RLIMIT_NOFILE, &limit) != 0 || getrlimit(RLIMIT_NOFILE, &limit) != 0)
            KORVSNMP_LOG(LOG_WARNING, "Cannot raise the descriptor limit: %m");
    }
    if (limit.rlim_cur < wanted) {
        if (limit.rlim_cur <= kSpareDescriptors) {
            KORVSNMP_LOG(LOG_ERR, "The descriptor limit %llu leaves no room for connections",
                           static_cast<unsigned long long>(limit.rlim_cur));
            return false;
        }
        options_.maxConnections = static_cast<size_t>(limit.rlim_cur - kSpareDescriptors);
        KORVSNMP_LOG(LOG_NOTICE, "Serving at most %zu connections at once (descriptor limit %llu)",
                       options_.maxConnections, static_cast<unsigned long long>(limit.rlim_cur));
    }
    return true;
}

bool Server::Watch(int fd, uint32_t events, void *tag)
{
    epoll_event event{};
    event.events = events;
    event.data.ptr = tag;
    if (epoll_ctl(poller_.Get(), EPOLL_CTL_ADD, fd, &event) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot watch descriptor %d: %m", fd);
        return false;
    }
    return true;
}

bool Server::TakeSocketPath()
{
    const char *path = options_.socketPath.c_str();
    sockaddr_un address;
    if (!FillAddress(options_.socketPath, address)) {
        KORVSNMP_LOG(LOG_ERR, "Socket path [%s] is empty or too long", path);
        return false;
    }
    std::string replacing;  // what the new socket takes the place of, for the log
    if (!JudgeSocketPath(address, replacing))
        return false;

    listening_ = UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (!listening_.Valid()) {
        KORVSNMP_LOG(LOG_ERR, "Cannot create the listening socket: %m");
        return false;
    }
    // Made whole under a name of its own, then renamed over the path: a
    // caller never meets a socket that does not listen yet, and nobody can
    // slip in between a removal and the bind.
    TemporarySocketFile made;
    if (!BindBeside(listening_.Get(), options_.socketPath, made))
        return false;
    if (chmod(made.Path().c_str(), kSocketMode) != 0)
        KORVSNMP_LOG(LOG_WARNING, "Cannot open [%s] to every local user: %m", path);
    if (listen(listening_.Get(), kListenBacklog) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot listen on [%s]: %m", made.Path().c_str());
        return false;
    }
    if (rename(made.Path().c_str(), path) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot put the socket at [%s]: %m", path);
        return false;
    }
    made.Keep();
    if (!replacing.empty())
        KORVSNMP_LOG(LOG_WARNING, "Replaced %s", replacing.c_str());
    struct stat placed;
    if (lstat(path, &placed) == 0) {
        socketDevice_ = placed.st_dev;
        socketInode_ = placed.st_ino;
        ownsSocketFile_ = true;
    }
    return true;
}

bool Server::Run(StatisticsSource &source)
{
    Clock::time_point nextTick = Clock::now() + options_.interval;
    epoll_event events[kEventBatch];
    std::vector<Connection *> finished;
    while (true) {
        Clock::time_point now = Clock::now();
        if (now >= nextTick) {
            source.Tick();
            now = Clock::now();
            // A late tick (a suspended host) is not made up for with a burst of samples.
            while (nextTick <= now)
                nextTick += options_.interval;
        }
        CloseExpired(now);
        LogDueCounts(now);

        Clock::time_point wakeUp = std::min(nextTick, now + kLongestWait);
        if (!connections_.empty())
            wakeUp = std::min(wakeUp, connections_.front().deadline);
        int ready = epoll_wait(poller_.Get(), events, kEventBatch, MillisecondsUntil(wakeUp, now));
        if (ready < 0 && errno != EINTR) {
            KORVSNMP_LOG(LOG_ERR, "epoll_wait() failed: %m");
            return false;
        }

        bool acceptNow = false;
        finished.clear();
        for (int i = 0; i < ready; ++i) {
            void *tag = events[i].data.ptr;
            if (tag == &signals_) {
                signalfd_siginfo info;
                if (read(signals_.Get(), &info, sizeof info) == static_cast<ssize_t>(sizeof info)) {
                    KORVSNMP_LOG(LOG_NOTICE, "Stopping on signal %u", info.ssi_signo);
                    return true;
                }
            } else if (tag == &listening_) {
                acceptNow = true;
            } else {
                Connection &connection = *static_cast<Connection *>(tag);
                if (connection.reply.empty())
                    Receive(connection, source);
                else
                    Send(connection);
                if (connection.done)
                    finished.push_back(&connection);
            }
        }
        // No event of this batch refers to a connection any more.
        for (Connection *connection : finished)
            connections_.erase(connection->self);
        if (acceptNow)
            AcceptPending();
    }
}

void Server::AcceptPending()
{
    for (size_t round = 0; round < kAcceptRound; ++round) {
        if (connections_.size() >= options_.maxConnections)
            MakeRoom();
        UniqueFd fd(accept4(listening_.Get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
        if (!fd.Valid()) {
            if (errno == EAGAIN || errno == EWOULDBLOCK)
                return;
            if (errno == EINTR || errno == ECONNABORTED)
                continue;
            lastAcceptError_ = errno;
            Note(Event::kAcceptFailed, Clock::now());
            // Out of descriptors or memory: give the oldest connection's up.
            if (connections_.empty())
                return;
            connections_.pop_front();
            continue;
        }
        connections_.emplace_back();
        Connection &connection = connections_.back();
        connection.self = std::prev(connections_.end());
        connection.fd = std::move(fd);
        connection.deadline = Clock::now() + options_.clientTimeout;
        // Statistics go to anyone; only root and our own user may steer.
        connection.mayControl =
            korvproto::ReadPeerCredentials(connection.fd.Get(), connection.peer) &&
            korvproto::IsTrustedUser(connection.peer.uid);
        if (!Watch(connection.fd.Get(), EPOLLIN, &connection))
            connections_.pop_back();
    }
}

void Server::MakeRoom()
{
    auto unfinished = std::find_if(connections_.begin(), connections_.end(),
                                   [](const Connection &c) { return c.reply.empty(); });
    connections_.erase(unfinished != connections_.end() ? unfinished : connections_.begin());
    Note(Event::kEvicted, Clock::now());
}

void Server::CloseExpired(Clock::time_point now)
{
    while (!connections_.empty() && connections_.front().deadline <= now) {
        connections_.pop_front();
        Note(Event::kTimedOut, now);
    }
}

void Server::Note(Event event, Clock::time_point now)
{
    if (uint64_t n = throttles_[static_cast<size_t>(event)].Record(now))
        Report(event, n);
}

void Server::LogDueCounts(Clock::time_point now)
{
    for (size_t event = 0; event < kEventKinds; ++event) {
        if (uint64_t n = throttles_[event].Due(now))
            Report(static_cast<Event>(event), n);
    }
}

void Server::Report(Event event, uint64_t n)
{
    auto count = static_cast<unsigned long long>(n);
    switch (event) {
    case Event::kRefusedFrame:
        KORVSNMP_LOG(LOG_WARNING, "Refused %llu request frame(s) whose length is 0 or beyond %u",
                       count, korvproto::kMaxRequestBytes);
        break;
    case Event::kRefusedBody:
        KORVSNMP_LOG(LOG_WARNING, "Refused %llu request(s) that are not a JSON object", count);
        break;
    case Event::kTimedOut:
        KORVSNMP_LOG(LOG_NOTICE,
                       "Closed %llu connection(s) that did not finish their exchange within "
                       "%lld ms",
                       count, static_cast<long long>(options_.clientTimeout.count()));
        break;
    case Event::kEvicted:
        KORVSNMP_LOG(LOG_WARNING,
                       "Closed %llu unfinished connection(s) to stay within %zu connections",
                       count, options_.maxConnections);
        break;
    case Event::kAcceptFailed:
        KORVSNMP_LOG(LOG_ERR, "accept() failed %llu time(s), last: %s", count,
                       strerror(lastAcceptError_));
        break;
    }
}

void Server::Receive(Connection &connection, StatisticsSource &source)
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
        Note(Event::kRefusedFrame, Clock::now());
        connection.done = true;
        return;
    }
    Answer(connection, source);
}

void Server::Answer(Connection &connection, StatisticsSource &source)
{
    RequestKind kind = ReadRequest(connection.request.Body(), connection.mayControl);
    if (kind != RequestKind::kStatistics) {
        if (kind == RequestKind::kNotAnObject)
            Note(Event::kRefusedBody, Clock::now());
        if (kind == RequestKind::kForbiddenControl)
            KORVSNMP_LOG(LOG_WARNING,
                         "Refused a control request from uid %u (pid %d): only root and uid %u "
                         "may steer the collector",
                         static_cast<unsigned>(connection.peer.uid),
                         static_cast<int>(connection.peer.pid),
                         static_cast<unsigned>(geteuid()));
        connection.reply = korvproto::EncodeFrame(ControlReply(kind));
    } else {
        const std::string &statistics = source.Reply();
        if (!options_.recordPath.empty()) {
            RecordReply(options_.recordPath, statistics);
            options_.recordPath.clear();  // only the next reply, kept or not
        }
        connection.reply = korvproto::EncodeFrame(statistics);
    }
    Send(connection);
    if (!connection.done) {
        epoll_event event{};
        event.events = EPOLLOUT;
        event.data.ptr = &connection;
        if (epoll_ctl(poller_.Get(), EPOLL_CTL_MOD, connection.fd.Get(), &event) != 0)
            connection.done = true;
    }
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
