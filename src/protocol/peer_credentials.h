// Who answers on, or calls through, a local connection, and whom the
// collector and its clients believe: root and the process's own effective
// user. A process of any other user may neither pose as the collector nor
// steer it.
#ifndef KORVPROTO_PEER_CREDENTIALS_H
#define KORVPROTO_PEER_CREDENTIALS_H

#include <sys/socket.h>
#include <sys/types.h>
#include <unistd.h>

namespace korvproto {

constexpr uid_t kRootUid = 0;

// The kernel's record of the process at the other end of the connected UNIX
// socket `fd` (its pid, uid and gid when it connected or listened). False,
// with errno set, when the kernel has none to give.
inline bool ReadPeerCredentials(int fd, ucred &peer)
{
    socklen_t size = sizeof peer;
    return getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &size) == 0;
}

// Whether `uid` is root or this process's effective user.
inline bool IsTrustedUser(uid_t uid) { return uid == kRootUid || uid == geteuid(); }

}  // namespace korvproto

#endif
