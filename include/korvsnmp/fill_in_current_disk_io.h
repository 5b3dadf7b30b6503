#ifndef KORVSNMP_FILL_IN_CURRENT_DISK_IO_H
#define KORVSNMP_FILL_IN_CURRENT_DISK_IO_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The disk section: "disk", the records of the disks that the host names,
// with "display_name" and "type", and their "total".
KORVSNMP_EXPORT bool FillInCurrentDiskIO(const Json::Value &diskIO, Json::Value &out);

}  // namespace KORVSNMP

#endif
