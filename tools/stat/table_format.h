// Human-readable rendering of a statistics result: the sample time, then one
// aligned table per section, with the catalogue's columns.
#ifndef KORVSNMP_STAT_TABLE_FORMAT_H
#define KORVSNMP_STAT_TABLE_FORMAT_H

#include <ostream>

#include <json/value.h>

namespace korvstat {

// Writes the time of `result` (as SNMPParseReplyData fills it) in local ISO
// 8601, then a table for each section present, in the catalogue's order
// (CPU, memory, NFS, disks, interfaces, volumes, LUNs), titled as the
// catalogue titles them. Columns: the record's names, then every statistic
// that some record has, titled and in the unit of the catalogue ("r/s",
// "rkB/s", "%util"), then members the catalogue does not know, by name. A
// "total" row comes last. Byte counts read 1.5M unless `rawNumbers`. Values
// of unexpected shapes are shown as compact JSON; nothing throws.
void WriteTables(const Json::Value &result, bool rawNumbers, std::ostream &out);

}  // namespace korvstat

#endif
