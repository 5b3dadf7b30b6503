// The catalogue of statistics: for every value that leaves the appliance,
// where it sits in the library's result, what it counts and in which unit,
// which KORVSNMP-MIB object serves it and which OpenMetrics family shows it.
//
// Every program that names a statistic reads it from here: the collector's
// reply builder, korvsnmp-stat's tables, watch view and OpenMetrics text,
// the SNMP front ends, the exporter. mibs/KORVSNMP-MIB.txt holds one object
// for each entry that has an SNMP object, and a test keeps the two equal.
#ifndef KORVSNMP_CATALOGUE_STATISTICS_CATALOGUE_H
#define KORVSNMP_CATALOGUE_STATISTICS_CATALOGUE_H

#include <cstdint>
#include <string>
#include <vector>

namespace korvcatalogue {

// Where an entry's value is found in the result of SNMPParseReplyData.
enum class Section {
    Agent,        // none: the SNMP front end's own scalars (korvAgent)
    Cpu,          // "cpu": one object, the collector's "System" record
    Memory,       // "memory": one object
    Nfs,          // "nfs": one object
    DiskTotal,    // "disk"."total"
    Disk,         // each record of "disk"."disk"
    Interface,    // each record of "network" (total, interfaces, aggregations, PPPoE)
    VolumeTotal,  // "space"."total"
    Volume,       // each record of "space"."volume"
    Lun,          // each record of "lun"
};

enum class Kind {
    Name,           // a text naming the record
    Enumeration,    // a small number naming a class (disk type, interface kind)
    Index,          // a table row's index, given by the SNMP front end
    Rate,           // a per-second rate over the collector's last interval
    Share,          // a percentage 0-100 of the last interval
    Gauge,          // a size or a state at the sample
    Counter,        // cumulative since boot as the kernel counts it, 64 bits
    Discontinuity,  // sysUpTime when the row appeared or its counters went back
};

enum class Unit {
    None,            // names, indexes, enumerations
    Percent,         // 0-100
    PerSecond,       // operations or calls per second
    BytesPerSecond,
    KiB,
    Bytes,
    Operations,      // a count: operations, calls, packets, errors, drops, commands
    Milliseconds,
    ClockTicks,      // USER_HZ, sysconf(_SC_CLK_TCK) of them a second
    MiB,             // whole mebibytes, as the kernel's iSCSI target counts
    Seconds,
    TimeTicks,       // hundredths of a second
};

// The SYNTAX of the entry's KORVSNMP-MIB object.
enum class Syntax {
    None,                 // not served over SNMP
    SnmpAdminString,
    Integer,              // an enumeration
    Unsigned32,
    Gauge32,
    Counter32,
    CounterBasedGauge64,
    Counter64,
    TimeStamp,
};

struct Statistic {
    Section section;
    std::string member;       // the result's member; "" for what the SNMP front end makes
    Kind kind;
    Unit unit;
    std::string snmpObject;   // KORVSNMP-MIB's descriptor, "" when SNMP does not serve it
    uint32_t snmpNumber;      // its column in the table's entry, or its number in the group
    Syntax syntax;
    std::string metric;       // OpenMetrics family, "" when the exposition leaves it out
                              // (a counter's family is named without its "_total")
    std::string metricLabel;  // a fixed label of that family's samples ("mode=\"user\""), or ""
    std::string title;        // a short column title, in iostat's manner: "rkB/s", "%util"
    std::string help;         // what it is, one sentence without a final stop
};

// Every statistic, grouped by section in the order of Section, and in each
// section in the order in which the tables show them.
const std::vector<Statistic> &Statistics();

// The statistics of one section, in the catalogue's order.
std::vector<const Statistic *> StatisticsOf(Section section);

// The entry for `member` in `section`, or nullptr.
const Statistic *Find(Section section, const std::string &member);

// The front end's own values (Section::Agent), in the catalogue's order.
enum class AgentValue { SampleTime, SnapshotAge, FailedSamples, SampleInterval, CollectorUp };
const Statistic &AgentStatistic(AgentValue value);

// The KORVSNMP-MIB group or table (its number under korvObjects) that holds
// a section's objects.
uint32_t SnmpGroupOf(Section section);

// The words that name `unit` where a text gives it ("bytes", "clock ticks";
// "number of" for a count; "" for None). Each KORVSNMP-MIB object's
// DESCRIPTION contains its unit's words.
const char *UnitWordOf(Unit unit);

// The result's member that holds a section ("cpu", "disk", ...), and the
// words that title it in tables and HELP texts ("Disk", "Volume total").
const char *ResultMemberOf(Section section);
const char *TitleOf(Section section);

}  // namespace korvcatalogue

#endif
