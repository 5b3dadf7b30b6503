#include "counters.h"

#include <charconv>
#include <cmath>
#include <cstdio>
#include <limits>

namespace korvstat {
namespace {

using korvcatalogue::Unit;

constexpr uint64_t kBytesPerKiB = 1024;
constexpr double kBytesPerKB = 1024;
constexpr char kPrefixes[] = "KMGTPE";

std::string ExactText(const Json::Value &value, uint64_t multiplier)
{
    if (value.type() == Json::uintValue &&
        value.asLargestUInt() <= std::numeric_limits<Json::LargestUInt>::max() / multiplier)
        return std::to_string(value.asLargestUInt() * multiplier);
    const auto scale = static_cast<Json::LargestInt>(multiplier);
    if (value.type() == Json::intValue &&
        value.asLargestInt() <= std::numeric_limits<Json::LargestInt>::max() / scale &&
        value.asLargestInt() >= std::numeric_limits<Json::LargestInt>::min() / scale)
        return std::to_string(value.asLargestInt() * scale);
    char text[64];
    const auto written = std::to_chars(text, text + sizeof text, value.asDouble() * static_cast<double>(multiplier));
    return std::string(text, written.ptr);
}

}  // namespace

std::string CellText(const Json::Value &value, const korvcatalogue::Statistic &statistic, bool rawNumbers)
{
    if (!value.isNumeric())
        return "";
    switch (statistic.unit) {
    case Unit::KiB:
    case Unit::Bytes: {
        const uint64_t multiplier = statistic.unit == Unit::KiB ? kBytesPerKiB : 1;
        if (rawNumbers)
            return ExactText(value, multiplier);
        return HumanBytes(value.asDouble() * static_cast<double>(multiplier));
    }
    case Unit::BytesPerSecond: {
        char text[64];
        std::snprintf(text, sizeof text, "%.2f", value.asDouble() / kBytesPerKB);
        return text;
    }
    default: return ExactText(value, 1);
    }
}

std::string HumanBytes(double bytes)
{
    if (!(bytes >= 1024) || std::isinf(bytes)) {
        char text[32];
        std::snprintf(text, sizeof text, "%.0f", bytes);
        return text;
    }
    size_t prefix = 0;
    bytes /= 1024;
    // Scale on while the rounded figure would read 1024 or more.
    while (prefix + 1 < sizeof kPrefixes - 1 && std::round(bytes) >= 1024) {
        bytes /= 1024;
        ++prefix;
    }
    char text[32];
    const bool oneDecimal = std::round(bytes * 10) / 10 < 10;
    std::snprintf(text, sizeof text, oneDecimal ? "%.1f%c" : "%.0f%c", bytes, kPrefixes[prefix]);
    return text;
}

}  // namespace korvstat
