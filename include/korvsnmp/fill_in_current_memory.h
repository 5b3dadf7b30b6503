#ifndef KORVSNMP_FILL_IN_CURRENT_MEMORY_H
#define KORVSNMP_FILL_IN_CURRENT_MEMORY_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The memory section: a copy of the collector's memory `record` with
// "memory_size", the platform's physical memory size, or "total_real" when
// the platform has no figure.
KORVSNMP_EXPORT bool FillInCurrentMemory(const Json::Value &record, Json::Value &memory);

}  // namespace KORVSNMP

#endif
