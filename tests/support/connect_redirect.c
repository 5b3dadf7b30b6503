/* Keeps tests off the collector's real socket.

   connect() to the collector's fixed path goes to the path named by the
   environment variable KORVTEST_COLLECTOR_SOCKET instead, when it is set;
   every other connect() is left alone. The test program links this file
   itself (and sets the variable to a private path of its own at start-up);
   the programs that tests run as children get it through LD_PRELOAD of
   libkorvtest_redirect.so (see test_collector.h). */
#define _GNU_SOURCE
#include "connect_redirect.h"

#include <dlfcn.h>
#include <errno.h>
#include <stddef.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "protocol/collector_socket_path.h"

typedef int (*ConnectFunction)(int, const struct sockaddr *, socklen_t);

static ConnectFunction RealConnect(void)
{
    static ConnectFunction real;
    if (real == NULL)
        real = (ConnectFunction)dlsym(RTLD_NEXT, "connect");
    return real;
}

int korvtest_connect_unredirected(int fd, const struct sockaddr *address, socklen_t length)
{
    return RealConnect()(fd, address, length);
}

static int NamesTheFixedPath(const struct sockaddr *address, socklen_t length)
{
    static const char fixed[] = KORVPROTO_COLLECTOR_SOCKET_PATH;
    const struct sockaddr_un *unix_address = (const struct sockaddr_un *)address;
    size_t room;
    if (address == NULL || length <= offsetof(struct sockaddr_un, sun_path) ||
        address->sa_family != AF_UNIX)
        return 0;
    room = length - offsetof(struct sockaddr_un, sun_path);
    if (room > sizeof unix_address->sun_path)
        room = sizeof unix_address->sun_path;
    return strnlen(unix_address->sun_path, room) == sizeof fixed - 1 &&
           memcmp(unix_address->sun_path, fixed, sizeof fixed - 1) == 0;
}

int connect(int fd, const struct sockaddr *address, socklen_t length)
{
    const char *replacement = getenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE);
    struct sockaddr_un redirected;
    if (replacement == NULL || !NamesTheFixedPath(address, length))
        return RealConnect()(fd, address, length);
    if (strlen(replacement) >= sizeof redirected.sun_path) {
        errno = ENAMETOOLONG; /* never the real path */
        return -1;
    }
    memset(&redirected, 0, sizeof redirected);
    redirected.sun_family = AF_UNIX;
    strcpy(redirected.sun_path, replacement);
    return RealConnect()(fd, (const struct sockaddr *)&redirected, sizeof redirected);
}
