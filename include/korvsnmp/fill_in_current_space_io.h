#ifndef KORVSNMP_FILL_IN_CURRENT_SPACE_IO_H
#define KORVSNMP_FILL_IN_CURRENT_SPACE_IO_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The space section: "volume", the records of the block devices that carry
// a storage space, in input order, each with "display_name", the space's
// name (a space behind a flash cache is reported through the cache's
// layered device, named after the cached volume, and its own device is left
// out); and "total", the last collector record whose "device" is "total".
// Records of other devices, or without "device", are left out. The storage
// configuration is read afresh on every call. Other members of `space` stay;
// a `space` that is neither an object nor null is replaced by an object.
//
// False with one error message, `space` untouched: `spaceIO` not an array,
// the spaces cannot be enumerated, an element that is neither an object nor
// null, or a "device" that is present but not a string.
KORVSNMP_EXPORT bool FillInCurrentSpaceIO(const Json::Value &spaceIO, Json::Value &space);

// The same, moving the kept records and "total" out of `spaceIO` instead of
// copying them; what is left of `spaceIO` is unspecified.
KORVSNMP_EXPORT bool FillInCurrentSpaceIO(Json::Value &&spaceIO, Json::Value &space);

}  // namespace KORVSNMP

#endif
