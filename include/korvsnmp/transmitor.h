// The collector client: one framed JSON request to korvsnmpcd over the UNIX
// socket "/tmp/korvsnmpcd.sock", one framed reply back, one connection per
// exchange.
//
// Frames: a 4-byte big-endian length, then that many bytes. A request is the
// compact JSON text of the request (ending in a line feed) and a NUL, both
// counted in the length. A reply length of 0 or less means an empty reply.
//
// Only root or the caller's own effective user is believed to be the
// collector: a connection whose peer runs as anyone else (a local user who
// bound the path first) fails as a connection that cannot be made fails,
// before one byte is sent, with the peer's uid and pid logged.
//
// No call throws, apart from std::bad_alloc; every failure is logged once to
// syslog and reported as -1 (or false).
#ifndef KORVSNMP_TRANSMITOR_H
#define KORVSNMP_TRANSMITOR_H

#include <string>

#include <json/value.h>

#include "export.h"

// Opens a new connection to the collector. Returns the connected descriptor,
// or -1 (logged at LOG_INFO) when the socket cannot be made or the collector
// does not accept, and -1 (logged at LOG_ERR, naming the peer's uid and pid)
// when the peer is neither root nor the caller's effective user, or the
// kernel cannot tell who it is. The caller owns the descriptor.
KORVSNMP_EXPORT int SocketInit();

class KORVSNMP_EXPORT Transmitor {
public:
    // An empty host name is accepted here; Transmit refuses to run until
    // SetHostName gives a non-empty one.
    explicit Transmitor(const std::string &hostName);
    // Closes a connection that is still open.
    ~Transmitor();

    // The object owns its descriptor: it is neither copied nor moved.
    Transmitor(const Transmitor &) = delete;
    Transmitor &operator=(const Transmitor &) = delete;

    // -1 for an empty name (the old name stays), else 0.
    int SetHostName(const std::string &hostName);

    // One whole exchange: connect, send `request`, receive the reply into
    // dataStr, close. 0 or -1; socketFd is -1 afterwards either way. A failure
    // before the reply becomes readable leaves the previous reply in place.
    int Transmit(const Json::Value &request);

    // Copies the last reply's text into `text`. -1, `text` untouched, when
    // there is none (no exchange yet, or an empty reply).
    int GetDataStr(std::string &text) const;

    // Parses the last reply's text into `value` (a trailing NUL after the
    // root is accepted). -1 when there is no reply text, or when it is not
    // JSON or nested too deeply to parse; what the parse left in `value` then
    // stays.
    int GetDataJson(Json::Value &value) const;

    // Writes one request frame on socketFd, after waiting at most 10.5 s for
    // it to become writable. 0, or -1 with the connection closed. A short
    // write is a failure; a peer that has gone away is one too (no SIGPIPE).
    int TransmitData(const Json::Value &request);

    // Reads one reply frame from socketFd into dataStr, after waiting at most
    // 90 s for the first byte. 0 with the connection still open, or -1 with it
    // closed (or nothing done when socketFd is -1). A body cut short by the
    // peer is a failure.
    int ReceiveData();

    // Control requests, each on a connection and a Transmitor of its own.
    // True only when the collector answers with an object whose "success" is
    // the boolean true. The collector refuses them from a caller that is
    // neither root nor its own user.
    static bool EnterHistoryMode(std::string reason);
    static bool Reload();

    // A descriptor is usable only below FD_SETSIZE: both waits put it in an
    // fd_set. TransmitData and ReceiveData fail on a higher one.
    std::string hostName;
    std::string dataStr;  // the last reply's bytes, as received
    int socketFd;         // the open connection, or -1
};

#endif
