#include "proc_parsers.h"

#include <cctype>
#include <cstdlib>
#include <iterator>

namespace korvsnmpcd {
namespace {

constexpr size_t kCpuFields = 8;            // user nice system idle iowait irq softirq steal
constexpr size_t kCpuMinFields = 4;         // up to idle, on the oldest kernels
constexpr size_t kNetDevMinFields = 12;     // after "name:", up to the transmit drops
constexpr size_t kNetDevTxFirstField = 8;   // rx: bytes packets errs drop fifo frame compressed multicast
constexpr size_t kDiskStatsMinFields = 14;  // major minor name and eleven counters
constexpr int kOctalEscapeDigits = 3;
constexpr int kOctalBase = 8;

std::vector<std::string_view> Lines(std::string_view text)
{
    std::vector<std::string_view> lines;
    while (!text.empty()) {
        size_t end = text.find('\n');
        lines.push_back(text.substr(0, end));
        if (end == std::string_view::npos)
            break;
        text.remove_prefix(end + 1);
    }
    return lines;
}

std::vector<std::string_view> Fields(std::string_view line)
{
    std::vector<std::string_view> fields;
    size_t at = 0;
    while (true) {
        at = line.find_first_not_of(" \t", at);
        if (at == std::string_view::npos)
            break;
        size_t end = line.find_first_of(" \t", at);
        fields.push_back(line.substr(at, end == std::string_view::npos ? end : end - at));
        if (end == std::string_view::npos)
            break;
        at = end;
    }
    return fields;
}

// A decimal number; false when `field` is not one (a sign, letters, empty, beyond 64 bits).
bool ToNumber(std::string_view field, uint64_t &value)
{
    if (field.empty())
        return false;
    uint64_t result = 0;
    for (char c : field) {
        if (!std::isdigit(static_cast<unsigned char>(c)))
            return false;
        uint64_t digit = static_cast<uint64_t>(c - '0');
        if (result > (UINT64_MAX - digit) / 10)
            return false;
        result = result * 10 + digit;
    }
    value = result;
    return true;
}

// Field `index` of `fields` (counted from 1 after the key) as a counter.
Counter CounterField(const std::vector<std::string_view> &fields, size_t index, std::string_view key,
                     UnreadableFields *unreadable)
{
    uint64_t value = 0;
    if (ToNumber(fields[index], value))
        return value;
    if (unreadable != nullptr)
        unreadable->Note(key, index, fields[index]);
    return std::nullopt;
}

}  // namespace

void UnreadableFields::Note(std::string_view key, size_t field, std::string_view text)
{
    if (count++ == 0)
        first = "line [" + std::string(key) + "] field " + std::to_string(field) + " [" +
                std::string(text) + "]";
}

bool ParseCpuTimes(std::string_view text, CpuTimes &times, UnreadableFields *unreadable)
{
    Counter CpuTimes::*const states[kCpuFields] = {
        &CpuTimes::user, &CpuTimes::nice, &CpuTimes::system,  &CpuTimes::idle,
        &CpuTimes::iowait, &CpuTimes::irq, &CpuTimes::softirq, &CpuTimes::steal};
    for (std::string_view line : Lines(text)) {
        std::vector<std::string_view> fields = Fields(line);
        if (fields.empty() || fields[0] != "cpu")
            continue;
        if (fields.size() - 1 < kCpuMinFields)
            return false;
        CpuTimes parsed;
        for (size_t i = 0; i < kCpuFields && i + 1 < fields.size(); ++i)
            parsed.*states[i] = CounterField(fields, i + 1, fields[0], unreadable);
        times = parsed;
        return true;
    }
    return false;
}

bool ParseMemoryInfo(std::string_view text, MemoryInfo &memory)
{
    const std::map<std::string_view, uint64_t MemoryInfo::*> members = {
        {"MemTotal:", &MemoryInfo::totalKiB},      {"MemFree:", &MemoryInfo::freeKiB},
        {"MemAvailable:", &MemoryInfo::availableKiB}, {"Buffers:", &MemoryInfo::buffersKiB},
        {"Cached:", &MemoryInfo::cachedKiB},        {"SwapTotal:", &MemoryInfo::swapTotalKiB},
        {"SwapFree:", &MemoryInfo::swapFreeKiB},
    };
    MemoryInfo parsed;
    bool hasTotal = false;
    for (std::string_view line : Lines(text)) {
        std::vector<std::string_view> fields = Fields(line);
        if (fields.size() < 2)
            continue;
        auto member = members.find(fields[0]);
        uint64_t value = 0;
        if (member == members.end() || !ToNumber(fields[1], value))
            continue;
        parsed.*(member->second) = value;
        if (member->second == &MemoryInfo::totalKiB)
            hasTotal = true;
    }
    if (!hasTotal)
        return false;
    memory = parsed;
    return true;
}

std::map<std::string, InterfaceCounters> ParseNetDev(std::string_view text,
                                                     UnreadableFields *unreadable)
{
    // Bytes, packets, errors and drops lead each direction's fields.
    Counter InterfaceCounters::*const rx[] = {&InterfaceCounters::rxBytes, &InterfaceCounters::rxPackets,
                                              &InterfaceCounters::rxErrors, &InterfaceCounters::rxDrops};
    Counter InterfaceCounters::*const tx[] = {&InterfaceCounters::txBytes, &InterfaceCounters::txPackets,
                                              &InterfaceCounters::txErrors, &InterfaceCounters::txDrops};
    std::map<std::string, InterfaceCounters> interfaces;
    for (std::string_view line : Lines(text)) {
        // "  eth0: 123 ..." or, with long counters, "eth0:123 ...": the name ends at the colon.
        size_t colon = line.find(':');
        if (colon == std::string_view::npos)
            continue;
        std::vector<std::string_view> name = Fields(line.substr(0, colon));
        std::vector<std::string_view> counters = Fields(line.substr(colon + 1));
        if (name.size() != 1 || counters.size() < kNetDevMinFields)
            continue;
        // Numbered from 1 after the name, as in the unreadable fields' descriptions.
        counters.insert(counters.begin(), name[0]);
        InterfaceCounters parsed;
        for (size_t i = 0; i < std::size(rx); ++i) {
            parsed.*rx[i] = CounterField(counters, 1 + i, name[0], unreadable);
            parsed.*tx[i] = CounterField(counters, 1 + kNetDevTxFirstField + i, name[0], unreadable);
        }
        interfaces[std::string(name[0])] = parsed;
    }
    return interfaces;
}

std::map<std::string, BlockCounters> ParseDiskStats(std::string_view text,
                                                     UnreadableFields *unreadable)
{
    enum Field { kMajor, kMinor, kName, kReads, kReadsMerged, kSectorsRead, kReadMs,
                 kWrites, kWritesMerged, kSectorsWritten, kWriteMs, kInFlight, kIoTicks };
    std::map<std::string, BlockCounters> devices;
    for (std::string_view line : Lines(text)) {
        std::vector<std::string_view> fields = Fields(line);
        if (fields.size() < kDiskStatsMinFields)
            continue;
        uint64_t major = 0;
        uint64_t minor = 0;
        if (!ToNumber(fields[kMajor], major) || !ToNumber(fields[kMinor], minor) ||
            major > UINT32_MAX || minor > UINT32_MAX)
            continue;
        BlockCounters parsed;
        parsed.major = static_cast<unsigned>(major);
        parsed.minor = static_cast<unsigned>(minor);
        // Numbered from 1 after the name, as in the unreadable fields' descriptions.
        const std::vector<std::string_view> counters(fields.begin() + kName, fields.end());
        const auto counter = [&](size_t field) {
            return CounterField(counters, field - kName, fields[kName], unreadable);
        };
        parsed.reads = counter(kReads);
        parsed.sectorsRead = counter(kSectorsRead);
        parsed.writes = counter(kWrites);
        parsed.sectorsWritten = counter(kSectorsWritten);
        parsed.ioTicksMs = counter(kIoTicks);
        devices[std::string(fields[kName])] = parsed;
    }
    return devices;
}

NfsServerCounters ParseNfsServer(std::string_view text, UnreadableFields *unreadable)
{
    NfsServerCounters counters;
    for (std::string_view line : Lines(text)) {
        std::vector<std::string_view> fields = Fields(line);
        if (fields.size() >= 3 && fields[0] == "io") {
            counters.readBytes = CounterField(fields, 1, fields[0], unreadable);
            counters.writtenBytes = CounterField(fields, 2, fields[0], unreadable);
        } else if (fields.size() >= 2 && fields[0] == "rpc") {
            counters.rpcCalls = CounterField(fields, 1, fields[0], unreadable);
        }
    }
    return counters;
}

Counter ParseSingleNumber(std::string_view text, std::string_view key, UnreadableFields *unreadable)
{
    std::vector<std::string_view> fields = Fields(text.substr(0, text.find('\n')));
    if (fields.size() != 1) {
        if (unreadable != nullptr)
            unreadable->Note(key, 1, text.substr(0, text.find('\n')));
        return std::nullopt;
    }
    fields.insert(fields.begin(), key);
    return CounterField(fields, 1, key, unreadable);
}

std::vector<std::string> ParseMountSources(std::string_view text)
{
    std::vector<std::string> sources;
    for (std::string_view line : Lines(text)) {
        std::vector<std::string_view> fields = Fields(line);
        if (fields.empty())
            continue;
        std::string_view field = fields[0];
        std::string source;
        for (size_t i = 0; i < field.size(); ++i) {
            bool escape = field[i] == '\\' && i + kOctalEscapeDigits < field.size();
            int code = 0;
            for (int d = 1; escape && d <= kOctalEscapeDigits; ++d) {
                char digit = field[i + static_cast<size_t>(d)];
                if (digit < '0' || digit > '7')
                    escape = false;
                else
                    code = code * kOctalBase + (digit - '0');
            }
            if (escape) {
                source.push_back(static_cast<char>(code));
                i += kOctalEscapeDigits;
            } else {
                source.push_back(field[i]);
            }
        }
        sources.push_back(std::move(source));
    }
    return sources;
}

}  // namespace korvsnmpcd
