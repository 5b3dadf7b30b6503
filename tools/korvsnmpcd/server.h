// The collector's socket server: one epoll-driven loop that serves every
// connection and ticks the statistics source on its interval.
//
// Each connection gets one exchange: its request frame is gathered as it
// arrives, answered, and the connection closed once the reply is written.
// A connection that has not finished its exchange within the client timeout
// is closed, so a stalled client never holds up another one; a request
// frame that claims an impossible length is closed at once. Every pending
// connection is accepted at once; at the connection cap the oldest
// connection that has not sent its whole request yet (else the oldest one)
// is closed to make room, so idle clients cannot lock out a caller.
// Statistics go to every local user; a control request from a client that
// is neither root nor the collector's own user (its credentials read from
// the kernel) is refused and logged with its uid. Refused frames, timeouts
// and evictions are logged at most once per log period.
#ifndef KORVSNMPCD_SERVER_H
#define KORVSNMPCD_SERVER_H

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <list>
#include <string>
#include <vector>

#include "event_throttle.h"
#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "statistics_source.h"

namespace korvsnmpcd {

using korvproto::RequestDecoder;
using korvproto::UniqueFd;

inline constexpr const char *kDefaultSocketPath = korvproto::kCollectorSocketPath;
constexpr size_t kDefaultMaxConnections = 4096;
// Every local process may ask for statistics: the appliance's agents run
// under users of their own.
constexpr mode_t kSocketMode = 0666;

struct ServerOptions {
    std::string socketPath = kDefaultSocketPath;
    std::chrono::milliseconds interval{1000};
    std::chrono::milliseconds clientTimeout{2000};
    // Connections served at once; lowered to what the descriptor limit allows.
    size_t maxConnections = kDefaultMaxConnections;
    // When set, the next statistics reply sent is also written to this file.
    std::string recordPath;
    std::chrono::milliseconds logPeriod{10000};
};

// Whether something accepts connections on the UNIX socket `path` (a
// connect, closed at once); errno tells why not.
bool SomethingListensOn(const std::string &path);

class Server {
public:
    explicit Server(ServerOptions options);
    // Removes the socket file if it is still the one this server made.
    ~Server();
    Server(const Server &) = delete;
    Server &operator=(const Server &) = delete;

    // Blocks SIGTERM and SIGINT for the loop, raises the descriptor limit
    // for the connection cap, then takes the socket path. Refuses (false,
    // logged) when a collector of root or our own user answers there, or
    // when something of ours there is not a socket. Replaces, logging a
    // warning that names the owner, a stale socket file and anything of
    // another user (in a sticky directory, which only its owner or
    // CAP_FOWNER may do). The socket is bound under a temporary name beside the path
    // (the path plus 7 characters must fit a socket address), opened to
    // every user, and renamed over the path once it listens.
    bool Listen();

    // Serves until SIGTERM or SIGINT; false when the loop cannot go on.
    bool Run(StatisticsSource &source);

private:
    struct Connection;
    using Clock = std::chrono::steady_clock;
    // What is logged at most once per log period, with its count.
    enum class Event { kRefusedFrame, kRefusedBody, kTimedOut, kEvicted, kAcceptFailed };
    static constexpr size_t kEventKinds = 5;

    bool FitConnectionCap();
    bool TakeSocketPath();
    bool Watch(int fd, uint32_t events, void *tag);
    void AcceptPending();
    void MakeRoom();
    void Receive(Connection &connection, StatisticsSource &source);
    void Send(Connection &connection);
    void Answer(Connection &connection, StatisticsSource &source);
    void CloseExpired(Clock::time_point now);
    void LogDueCounts(Clock::time_point now);
    void Note(Event event, Clock::time_point now);
    void Report(Event event, uint64_t n);

    ServerOptions options_;
    UniqueFd listening_;
    UniqueFd signals_;
    UniqueFd poller_;
    dev_t socketDevice_ = 0;
    ino_t socketInode_ = 0;
    bool ownsSocketFile_ = false;
    // In accept order, which is also deadline order.
    std::list<Connection> connections_;
    std::vector<EventThrottle> throttles_;
    int lastAcceptError_ = 0;
};

}  // namespace korvsnmpcd

#endif
