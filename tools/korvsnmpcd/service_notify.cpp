#include "service_notify.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <string>

#include "protocol/unit_log.h"
#include "protocol/unique_fd.h"

namespace korvsnmpcd {
namespace {

using korvproto::UniqueFd;

constexpr char kLogUnit[] = "service_notify";
constexpr char kVariable[] = "NOTIFY_SOCKET";
constexpr char kReady[] = "READY=1";

}  // namespace

void NotifyReady()
{
    const char *name = std::getenv(kVariable);
    if (name == nullptr)
        return;
    std::string target = name;
    unsetenv(kVariable);

    sockaddr_un address;
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    if (target.empty() || (target[0] != '/' && target[0] != '@') ||
        target.size() >= sizeof address.sun_path) {
        KORVSNMP_LOG(LOG_WARNING, "Cannot use %s [%s]", kVariable, target.c_str());
        return;
    }
    std::memcpy(address.sun_path, target.data(), target.size());
    if (target[0] == '@')
        address.sun_path[0] = '\0';  // an abstract name
    socklen_t length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + target.size());

    UniqueFd fd(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (!fd.Valid() || sendto(fd.Get(), kReady, sizeof kReady - 1, MSG_NOSIGNAL,
                              reinterpret_cast<const sockaddr *>(&address), length) < 0)
        KORVSNMP_LOG(LOG_WARNING, "Cannot tell the service manager [%s] that it is ready: %m",
                       target.c_str());
}

}  // namespace korvsnmpcd
