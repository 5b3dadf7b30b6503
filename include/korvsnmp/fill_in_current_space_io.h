#ifndef KORVSNMP_FILL_IN_CURRENT_SPACE_IO_H
#define KORVSNMP_FILL_IN_CURRENT_SPACE_IO_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The space section: "volume", the records of the block devices that carry
// a storage space, named after it, and the collector's "total".
KORVSNMP_EXPORT bool FillInCurrentSpaceIO(const Json::Value &spaceIO, Json::Value &space);

}  // namespace KORVSNMP

#endif
