#include "collector_protocol.h"

#include <arpa/inet.h>

#include <algorithm>
#include <cstring>

#include <json/writer.h>

namespace korvproto {

std::string EncodeFramePrefix(uint32_t length)
{
    const uint32_t networkOrder = htonl(length);
    return std::string(reinterpret_cast<const char *>(&networkOrder), kFramePrefixBytes);
}

uint32_t DecodeFramePrefix(const void *prefix)
{
    uint32_t networkOrder = 0;
    std::memcpy(&networkOrder, prefix, kFramePrefixBytes);
    return ntohl(networkOrder);
}

std::string EncodeFrame(std::string_view body)
{
    std::string frame = EncodeFramePrefix(static_cast<uint32_t>(body.size()));
    frame.append(body);
    return frame;
}

std::string EncodeRequestFrame(const Json::Value &request)
{
    const std::string text = Json::FastWriter().write(request);
    const size_t counted = std::strlen(text.c_str()) + 1;
    std::string frame = EncodeFramePrefix(static_cast<uint32_t>(counted));
    frame.append(text.c_str(), counted);
    return frame;
}

std::string CompactJson(const Json::Value &value)
{
    Json::FastWriter writer;
    writer.omitEndingLineFeed();
    return writer.write(value);
}

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
            length_ = DecodeFramePrefix(prefix_.data());
            if (length_ == 0 || length_ > kMaxRequestBytes) {
                state_ = State::kInvalid;
                break;
            }
            body_.reserve(length_);
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

}  // namespace korvproto
