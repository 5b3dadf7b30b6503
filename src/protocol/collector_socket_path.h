/* The collector's socket path, for C and C++ alike (the test programs'
   connect() redirection is C). C++ code uses korvproto::kCollectorSocketPath. */
#ifndef KORVPROTO_COLLECTOR_SOCKET_PATH_H
#define KORVPROTO_COLLECTOR_SOCKET_PATH_H

#define KORVPROTO_COLLECTOR_SOCKET_PATH "/tmp/korvsnmpcd.sock"

#endif
