// What the members of a statistics result count, and in which unit: the one
// list that the tables and the OpenMetrics exposition both follow, in the
// order in which they show the members.
#ifndef KORVSNMP_STAT_COUNTERS_H
#define KORVSNMP_STAT_COUNTERS_H

#include <cstdint>
#include <string>
#include <vector>

#include <json/value.h>

namespace korvstat {

enum class Unit {
    Percent,         // 0-100
    PerSecond,       // operations or calls per second
    BytesPerSecond,
    KiB,             // a size in kibibytes, shown in bytes
};

struct Counter {
    const char *member;      // the result's member
    Unit unit;
    const char *metric;      // OpenMetrics family name after "korvsnmp_<section>_"; ends in unitName
    const char *unitName;    // OpenMetrics unit
    const char *help;
};

// "cpu": the processor time shares, in top's order (user, system, nice, idle, ...).
const std::vector<Counter> &CpuCounters();
// "memory": physical memory first, then main memory, then swap.
const std::vector<Counter> &MemoryCounters();
// The records of "network".
const std::vector<Counter> &NetworkCounters();
// The records of "disk", "space" and "lun" alike: utilization, reads, writes.
const std::vector<Counter> &DeviceCounters();
// "nfs".
const std::vector<Counter> &NfsCounters();

// The unit as a table header shows it: "%", "/s", "B/s", "B".
const char *HeaderUnit(Unit unit);

// A numeric JSON value (not a boolean) as a double, in the unit that the
// tables and the exposition show (KiB become bytes). False for other values.
bool ShownValue(const Json::Value &value, Unit unit, double &shown);

// A numeric JSON value (not a boolean) in exact decimal digits, scaled like
// ShownValue; "" for other values.
std::string ExactText(const Json::Value &value, Unit unit);

// A byte count as df -h shows it: "512", "1.5K", "16G" (powers of 1024).
std::string HumanBytes(double bytes);

}  // namespace korvstat

#endif
