// The collector's socket server: one poll()-driven loop that serves every
// connection and runs the sampler on its timer.
//
// Each connection gets one exchange: its request frame is gathered as it
// arrives, answered, and the connection closed once the reply is written. A
// connection that has not finished its exchange within the client timeout
// is closed, so a stalled client never holds up another one. A request
// frame that claims an impossible length is closed at once.
#ifndef KORVSNMPCD_SERVER_H
#define KORVSNMPCD_SERVER_H

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "sampler.h"

namespace korvsnmpcd {

using korvproto::RequestDecoder;
using korvproto::UniqueFd;

inline constexpr const char *kDefaultSocketPath = korvproto::kCollectorSocketPath;

struct ServerOptions {
    std::string socketPath = kDefaultSocketPath;
    std::chrono::milliseconds interval{1000};
    std::chrono::milliseconds clientTimeout{2000};
    // Beyond this, new connections wait in the listen backlog.
    size_t maxConnections = 256;
};

class Server {
public:
    explicit Server(ServerOptions options);
    // Removes the socket file if it is still the one this server made.
    ~Server();
    Server(const Server &) = delete;
    Server &operator=(const Server &) = delete;

    // Blocks SIGTERM and SIGINT for the loop, then takes the socket path:
    // refuses (false, logged) when another daemon answers there or the path
    // is not a socket; replaces a stale socket file.
    bool Listen();

    // Serves until SIGTERM or SIGINT; false when the loop cannot go on.
    bool Run(Sampler &sampler);

private:
    struct Connection;

    bool TakeSocketPath();
    void AcceptPending();
    void Receive(Connection &connection, const Sampler &sampler);
    void Send(Connection &connection);

    ServerOptions options_;
    UniqueFd listening_;
    UniqueFd signals_;
    dev_t socketDevice_ = 0;
    ino_t socketInode_ = 0;
    bool ownsSocketFile_ = false;
    std::vector<std::unique_ptr<Connection>> connections_;
};

}  // namespace korvsnmpcd

#endif
