#include "framing.h"

#include <arpa/inet.h>

#include <algorithm>
#include <cstring>

namespace korvsnmpcd {

RequestDecoder::State RequestDecoder::Feed(const char *data, size_t size)
{
    while (size > 0 && state_ == State::kIncomplete) {
        if (prefix_.size() < kFramePrefixBytes) {
            size_t take = std::min(size, kFramePrefixBytes - prefix_.size());
            prefix_.append(data, take);
            data += take;
            size -= take;
            if (prefix_.size() < kFramePrefixBytes)
                break;
            uint32_t networkOrder = 0;
            std::memcpy(&networkOrder, prefix_.data(), kFramePrefixBytes);
            length_ = ntohl(networkOrder);
            if (length_ == 0 || length_ > kMaxRequestBytes) {
                state_ = State::kInvalid;
                break;
            }
            continue;
        }
        size_t take = std::min<size_t>(size, length_ - body_.size());
        body_.append(data, take);
        data += take;
        size -= take;
        if (body_.size() == length_)
            state_ = State::kComplete;
    }
    return state_;
}

std::string FrameReply(const std::string &body)
{
    uint32_t networkOrder = htonl(static_cast<uint32_t>(body.size()));
    std::string frame(reinterpret_cast<const char *>(&networkOrder), kFramePrefixBytes);
    frame += body;
    return frame;
}

}  // namespace korvsnmpcd
