// Opening a connection to the collector daemon.
#include <sys/socket.h>
#include <sys/un.h>

#include <cstring>

#include "korvsnmp/transmitor.h"
#include "protocol/collector_protocol.h"
#include "protocol/peer_credentials.h"
#include "protocol/unique_fd.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "socket_init";
using korvproto::kCollectorSocketPath;

static_assert(sizeof kCollectorSocketPath <= sizeof(sockaddr_un::sun_path),
              "the socket path fits the address");

// Whether the process that answers on `fd` may be the collector: root or our
// own user. Anyone else who got hold of the path would hand the caller
// statistics of their making. Logs why not.
bool AnswersAsCollector(int fd)
{
    ucred peer;
    if (!korvproto::ReadPeerCredentials(fd, peer)) {
        KORVSNMP_LOG(LOG_ERR, "Cannot tell who answers on [%s], reason: [%m]",
                     kCollectorSocketPath);
        return false;
    }
    if (korvproto::IsTrustedUser(peer.uid))
        return true;
    KORVSNMP_LOG(LOG_ERR,
                 "The peer on [%s] is not the collector: uid %u (pid %d) is neither root "
                 "nor uid %u",
                 kCollectorSocketPath, static_cast<unsigned>(peer.uid), static_cast<int>(peer.pid),
                 static_cast<unsigned>(geteuid()));
    return false;
}

}  // namespace

int SocketInit()
{
    korvproto::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM, 0));
    if (!fd.Valid()) {
        KORVSNMP_LOG(LOG_INFO, "Failed to create socket session, reason: [%m]");
        return -1;
    }

    sockaddr_un address;
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, kCollectorSocketPath, sizeof kCollectorSocketPath);

    if (connect(fd.Get(), reinterpret_cast<const sockaddr *>(&address), sizeof address) < 0) {
        // Logged while the descriptor is still open: its close may change errno.
        KORVSNMP_LOG(LOG_INFO, "Failed to connect to socket: [%s], reason: [%m]",
                     kCollectorSocketPath);
        return -1;
    }
    // Before one byte of the request goes out.
    if (!AnswersAsCollector(fd.Get()))
        return -1;
    return fd.Release();
}
