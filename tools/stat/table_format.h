// Human-readable rendering of a statistics result: one aligned table per
// section that the result holds.
#ifndef KORVSNMP_STAT_TABLE_FORMAT_H
#define KORVSNMP_STAT_TABLE_FORMAT_H

#include <ostream>

#include <json/value.h>

namespace korvstat {

// Writes the sections of `result` (as SNMPParseReplyData fills it) that are
// present, in the order cpu, memory, network, disk, space, lun, nfs, time.
// Values of unexpected shapes are shown as compact JSON; nothing throws.
void WriteTables(const Json::Value &result, std::ostream &out);

}  // namespace korvstat

#endif
