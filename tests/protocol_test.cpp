// The collector socket's frames, byte for byte, as the library, the
// collector and the tests all build and read them.
#include <cstdint>
#include <string>

#include <gtest/gtest.h>
#include <json/value.h>

#include "protocol/collector_protocol.h"

namespace {

using korvproto::RequestDecoder;

TEST(CollectorFrames, EncodedBigEndianWithTheirExactLength)
{
    const struct {
        const char *name;
        std::string frame;
        std::string expected;
    } cases[] = {
        {"reply", korvproto::EncodeFrame("{\"success\":true}"),
         std::string("\0\0\0\x10{\"success\":true}", 20)},
        {"empty reply", korvproto::EncodeFrame(""), std::string(4, '\0')},
        {"byte order", korvproto::EncodeFramePrefix(0x01020304u), "\x01\x02\x03\x04"},
        {"request: text, line feed and NUL counted",
         korvproto::EncodeRequestFrame(Json::objectValue), std::string("\0\0\0\x04{}\n\0", 8)},
        {"request: a NUL inside a string is escaped, not cut",
         korvproto::EncodeRequestFrame(Json::Value(std::string("a\0b", 3))),
         std::string("\0\0\0\x0c\"a\\u0000b\"\n\0", 16)},
    };
    for (const auto &c : cases)
        EXPECT_EQ(c.frame, c.expected) << c.name;
    EXPECT_EQ(korvproto::DecodeFramePrefix("\x80\x00\x00\x10"), 0x80000010u);
    EXPECT_EQ(korvproto::CompactJson(Json::Value(Json::objectValue)), "{}");
}

TEST(CollectorFrames, RequestGatheredFromAnyPieces)
{
    const std::string body("{\"request\":\"reload\"}\n\0", 22);
    const std::string frame = std::string("\0\0\0\x16", 4) + body + "extra";
    RequestDecoder decoder;
    for (size_t i = 0; i + 1 < 4 + body.size(); ++i)
        ASSERT_EQ(decoder.Feed(&frame[i], 1), RequestDecoder::State::kIncomplete) << i;
    EXPECT_EQ(decoder.Feed(&frame[4 + body.size() - 1], 6), RequestDecoder::State::kComplete);
    EXPECT_EQ(decoder.Body(), body);

    const struct {
        uint32_t length;
        RequestDecoder::State state;
    } claims[] = {
        {0, RequestDecoder::State::kInvalid},
        {korvproto::kMaxRequestBytes, RequestDecoder::State::kIncomplete},
        {korvproto::kMaxRequestBytes + 1, RequestDecoder::State::kInvalid},
        {0xffffffffu, RequestDecoder::State::kInvalid},
    };
    for (const auto &claim : claims) {
        RequestDecoder claimed;
        const std::string prefix = korvproto::EncodeFramePrefix(claim.length);
        EXPECT_EQ(claimed.Feed(prefix.data(), prefix.size()), claim.state) << claim.length;
    }
}

}  // namespace
