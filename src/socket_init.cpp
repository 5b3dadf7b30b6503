// Opening a connection to the collector daemon.
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

#include "korvsnmp/transmitor.h"
#include "protocol/collector_protocol.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "socket_init";
using korvproto::kCollectorSocketPath;

static_assert(sizeof kCollectorSocketPath <= sizeof(sockaddr_un::sun_path),
              "the socket path fits the address");

}  // namespace

int SocketInit()
{
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (fd < 0) {
        KORVSNMP_LOG(LOG_INFO, "Failed to create socket session, reason: [%m]");
        return -1;
    }

    sockaddr_un address;
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, kCollectorSocketPath, sizeof kCollectorSocketPath);

    if (connect(fd, reinterpret_cast<const sockaddr *>(&address), sizeof address) < 0) {
        // Log before close(), which may change errno.
        KORVSNMP_LOG(LOG_INFO, "Failed to connect to socket: [%s], reason: [%m]",
                     kCollectorSocketPath);
        close(fd);
        return -1;
    }
    return fd;
}
