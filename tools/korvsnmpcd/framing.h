// The frames of the collector socket. A request is a 4-byte big-endian
// length N, then N bytes (the client's JSON text and its NUL); a reply is a
// 4-byte big-endian length L, then the L bytes of the reply body.
#ifndef KORVSNMPCD_FRAMING_H
#define KORVSNMPCD_FRAMING_H

#include <cstddef>
#include <cstdint>
#include <string>

namespace korvsnmpcd {

constexpr size_t kFramePrefixBytes = 4;
// No request comes near this; a longer claim is refused at once.
constexpr uint32_t kMaxRequestBytes = 64 * 1024;

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

// The reply frame for `body`: its length in 4 big-endian bytes, then `body`.
std::string FrameReply(const std::string &body);

}  // namespace korvsnmpcd

#endif
