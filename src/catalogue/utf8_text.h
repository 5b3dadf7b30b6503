// Names from the collector and the host are bytes of any kind; SNMP's
// SnmpAdminString and OpenMetrics labels want UTF-8.
#ifndef KORVSNMP_CATALOGUE_UTF8_TEXT_H
#define KORVSNMP_CATALOGUE_UTF8_TEXT_H

#include <cstddef>
#include <string>
#include <string_view>

namespace korvcatalogue {

// SnmpAdminString's SIZE (0..255).
inline constexpr size_t kAdminStringSize = 255;

// Length of the valid UTF-8 sequence that starts at `at` (< text.size()):
// 1 to 4, or 0 when the bytes there are no valid sequence (overlong forms,
// surrogates and code points above U+10FFFF are not).
size_t Utf8SequenceLength(std::string_view text, size_t at);

// `text` as valid UTF-8 of at most `maxBytes` bytes: every byte that starts
// no valid sequence becomes U+FFFD, and the text is cut after the last whole
// character that fits.
std::string ValidUtf8(std::string_view text, size_t maxBytes = std::string::npos);

}  // namespace korvcatalogue

#endif
