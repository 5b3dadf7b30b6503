// Human-readable rendering of a statistics result: the sample time, then one
// aligned table per section that the result holds.
#ifndef KORVSNMP_STAT_TABLE_FORMAT_H
#define KORVSNMP_STAT_TABLE_FORMAT_H

#include <ostream>

#include <json/value.h>

namespace korvstat {

// Writes the time of `result` (as SNMPParseReplyData fills it) in local ISO
// 8601, then the sections present, in the order cpu, memory, network, disk,
// space, lun, nfs. Every counter table has the columns: names (device,
// display_name, type, or uuid, lun_name), the known counters in one order
// with their unit in the header, then members of unknown meaning by name;
// a "total" row comes last. Byte counts read 1.5M unless `rawNumbers`.
// Values of unexpected shapes are shown as compact JSON; nothing throws.
void WriteTables(const Json::Value &result, bool rawNumbers, std::ostream &out);

}  // namespace korvstat

#endif
