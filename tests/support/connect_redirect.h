/* The connect() redirection of the tests (connect_redirect.c). */
#ifndef KORVTEST_CONNECT_REDIRECT_H
#define KORVTEST_CONNECT_REDIRECT_H

#include <sys/socket.h>

#define KORVTEST_COLLECTOR_SOCKET_VARIABLE "KORVTEST_COLLECTOR_SOCKET"

#ifdef __cplusplus
extern "C" {
#endif

/* The C library's connect(), for a test that must reach the real fixed path. */
int korvtest_connect_unredirected(int fd, const struct sockaddr *address, socklen_t length);

#ifdef __cplusplus
}
#endif

#endif
