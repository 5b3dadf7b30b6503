#ifndef KORVSNMP_FILL_IN_CURRENT_MEMORY_H
#define KORVSNMP_FILL_IN_CURRENT_MEMORY_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The memory section: a copy of the collector's memory `record` with
// "memory_size", the platform's physical memory size, or "total_real" when
// the platform has no figure. Every other member of `record` is copied
// unchanged. True when "memory_size" was set.
//
// A `record` without "total_real" gives false and leaves its plain copy in
// `memory`. A `record` that is neither an object nor null, or whose
// "total_real" is not an unsigned 32-bit number (a string, a negative
// number, one beyond 32 bits), gives false with one error message and
// leaves `memory` untouched.
KORVSNMP_EXPORT bool FillInCurrentMemory(const Json::Value &record, Json::Value &memory);

}  // namespace KORVSNMP

#endif
