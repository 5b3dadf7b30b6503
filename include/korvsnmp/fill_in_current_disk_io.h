#ifndef KORVSNMP_FILL_IN_CURRENT_DISK_IO_H
#define KORVSNMP_FILL_IN_CURRENT_DISK_IO_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The disk section. `diskIO` is the collector's "DiskIO" array; `out` gets
// "disk", copies of the records of the disks that the host names (internal,
// expansion-unit and SSD-cache disks, then USB, then eSATA devices, a later
// source winning), in input order, with "display_name" and "type", and
// "total", the 64-bit sums of their counters and their mean utilization.
// Records of unknown devices are dropped. Other members of `out` stay.
//
// False, with `out` untouched: `diskIO` not an array (not logged); a disk or
// device enumeration that fails; an element that is neither an object nor
// null; a "device" that is neither a string nor null (null reads as no
// device); a counter of a named record that is not an unsigned 32-bit number
// (absent or null reads as 0); `out` neither an object nor null. Each of
// these but the first logs one message naming the element and the member.
KORVSNMP_EXPORT bool FillInCurrentDiskIO(const Json::Value &diskIO, Json::Value &out);

// The same, moving the named records out of `diskIO` instead of copying
// them; what is left of `diskIO` is unspecified.
KORVSNMP_EXPORT bool FillInCurrentDiskIO(Json::Value &&diskIO, Json::Value &out);

}  // namespace KORVSNMP

#endif
