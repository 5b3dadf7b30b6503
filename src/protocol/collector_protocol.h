// What the library, korvsnmpcd, korvsnmp-stat, the tests and the benchmark
// share about the collector socket: its path, its frames and the compact
// JSON text that travels in them.
//
// Frames: a 4-byte big-endian length, then that many bytes. A request frame
// carries the compact JSON text of the request (ending in the writer's line
// feed) and a NUL, both counted in the length; a reply frame carries the
// reply body as it is.
#ifndef KORVPROTO_COLLECTOR_PROTOCOL_H
#define KORVPROTO_COLLECTOR_PROTOCOL_H

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include <json/value.h>

#include "protocol/collector_socket_path.h"

namespace korvproto {

// Where the collector listens; the library's connections always go here.
inline constexpr char kCollectorSocketPath[] = KORVPROTO_COLLECTOR_SOCKET_PATH;

constexpr size_t kFramePrefixBytes = 4;
// No request comes near this; the collector refuses a longer claim at once.
constexpr uint32_t kMaxRequestBytes = 64 * 1024;

// The 4 big-endian bytes that announce `length`.
std::string EncodeFramePrefix(uint32_t length);
// The length that the kFramePrefixBytes bytes at `prefix` announce.
uint32_t DecodeFramePrefix(const void *prefix);

// A frame holding `body` as it is: its length, then `body`.
std::string EncodeFrame(std::string_view body);

// The request frame for `request`: the writer's compact text with its line
// feed and a NUL after it; the length counts the text up to its first NUL,
// plus the NUL.
std::string EncodeRequestFrame(const Json::Value &request);

// One line, no trailing line feed, object members in key order: the text of
// a value for logs, replies and comparisons.
std::string CompactJson(const Json::Value &value);

// Gathers one request frame from the bytes of a connection, in pieces of any size.
class RequestDecoder {
public:
    enum class State {
        kIncomplete,  // more bytes needed
        kComplete,    // Body() holds the whole request; later bytes are ignored
        kInvalid,     // the length is 0 or beyond kMaxRequestBytes
    };

    State Feed(const char *data, size_t size);
    State Current() const { return state_; }
    const std::string &Body() const { return body_; }

private:
    State state_ = State::kIncomplete;
    std::string prefix_;
    uint32_t length_ = 0;
    std::string body_;
};

}  // namespace korvproto

#endif
