#include "counters.h"

#include <charconv>
#include <cmath>
#include <cstdio>
#include <limits>

namespace korvstat {
namespace {

constexpr double kBytesPerKiB = 1024;
constexpr char kPrefixes[] = "KMGTPE";

}  // namespace

const std::vector<Counter> &CpuCounters()
{
    static const std::vector<Counter> counters = {
        {"user", Unit::Percent, "user_percent", "percent", "Share of processor time in user mode"},
        {"system", Unit::Percent, "system_percent", "percent", "Share of processor time in the kernel"},
        {"nice", Unit::Percent, "nice_percent", "percent",
         "Share of processor time in user mode at a lowered priority"},
        {"idle", Unit::Percent, "idle_percent", "percent", "Share of processor time idle"},
        {"iowait", Unit::Percent, "iowait_percent", "percent",
         "Share of processor time idle while I/O was outstanding"},
        {"irq", Unit::Percent, "irq_percent", "percent", "Share of processor time serving interrupts"},
        {"softirq", Unit::Percent, "softirq_percent", "percent",
         "Share of processor time serving software interrupts"},
        {"steal", Unit::Percent, "steal_percent", "percent",
         "Share of processor time taken by the hypervisor for other guests"},
    };
    return counters;
}

const std::vector<Counter> &MemoryCounters()
{
    static const std::vector<Counter> counters = {
        {"memory_size", Unit::KiB, "size_bytes", "bytes", "Physical memory size"},
        {"total_real", Unit::KiB, "total_real_bytes", "bytes", "Main memory usable by the system"},
        {"avail_real", Unit::KiB, "avail_real_bytes", "bytes",
         "Main memory available for new work without swapping"},
        {"free_real", Unit::KiB, "free_real_bytes", "bytes", "Main memory unused"},
        {"buffer", Unit::KiB, "buffer_bytes", "bytes", "Main memory in block device buffers"},
        {"cached", Unit::KiB, "cached_bytes", "bytes", "Main memory in the page cache"},
        {"total_swap", Unit::KiB, "total_swap_bytes", "bytes", "Swap space"},
        {"avail_swap", Unit::KiB, "avail_swap_bytes", "bytes", "Swap space unused"},
    };
    return counters;
}

const std::vector<Counter> &NetworkCounters()
{
    static const std::vector<Counter> counters = {
        {"rx", Unit::BytesPerSecond, "receive_bytes_per_second", "bytes_per_second",
         "Bytes received per second"},
        {"tx", Unit::BytesPerSecond, "transmit_bytes_per_second", "bytes_per_second",
         "Bytes transmitted per second"},
    };
    return counters;
}

const std::vector<Counter> &DeviceCounters()
{
    static const std::vector<Counter> counters = {
        {"utilization", Unit::Percent, "utilization_percent", "percent",
         "Share of time with I/O in flight"},
        {"read_access", Unit::PerSecond, "read_accesses_per_second", "accesses_per_second",
         "Read operations completed per second"},
        {"read_byte", Unit::BytesPerSecond, "read_bytes_per_second", "bytes_per_second",
         "Bytes read per second"},
        {"write_access", Unit::PerSecond, "write_accesses_per_second", "accesses_per_second",
         "Write operations completed per second"},
        {"write_byte", Unit::BytesPerSecond, "write_bytes_per_second", "bytes_per_second",
         "Bytes written per second"},
    };
    return counters;
}

const std::vector<Counter> &NfsCounters()
{
    static const std::vector<Counter> counters = {
        {"read_byte", Unit::BytesPerSecond, "read_bytes_per_second", "bytes_per_second",
         "Bytes read by NFS clients per second"},
        {"write_byte", Unit::BytesPerSecond, "write_bytes_per_second", "bytes_per_second",
         "Bytes written by NFS clients per second"},
        {"calls", Unit::PerSecond, "calls_per_second", "calls_per_second",
         "NFS remote procedure calls per second"},
    };
    return counters;
}

const char *HeaderUnit(Unit unit)
{
    switch (unit) {
    case Unit::Percent: return "%";
    case Unit::PerSecond: return "/s";
    case Unit::BytesPerSecond: return "B/s";
    case Unit::KiB: return "B";
    }
    return "";
}

bool ShownValue(const Json::Value &value, Unit unit, double &shown)
{
    if (!value.isNumeric())
        return false;
    shown = value.asDouble() * (unit == Unit::KiB ? kBytesPerKiB : 1);
    return true;
}

std::string ExactText(const Json::Value &value, Unit unit)
{
    const int scale = unit == Unit::KiB ? static_cast<int>(kBytesPerKiB) : 1;
    using UInt = Json::LargestUInt;
    using Int = Json::LargestInt;
    if (value.type() == Json::uintValue && value.asLargestUInt() <= std::numeric_limits<UInt>::max() / scale)
        return std::to_string(value.asLargestUInt() * scale);
    if (value.type() == Json::intValue && value.asLargestInt() <= std::numeric_limits<Int>::max() / scale &&
        value.asLargestInt() >= std::numeric_limits<Int>::min() / scale)
        return std::to_string(value.asLargestInt() * scale);
    double shown = 0;
    if (!ShownValue(value, unit, shown))
        return "";
    if (std::isnan(shown))
        return "NaN";
    if (std::isinf(shown))
        return shown > 0 ? "+Inf" : "-Inf";
    char text[64];
    const auto written = std::to_chars(text, text + sizeof text, shown);
    return std::string(text, written.ptr);
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
