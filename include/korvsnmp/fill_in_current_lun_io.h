#ifndef KORVSNMP_FILL_IN_CURRENT_LUN_IO_H
#define KORVSNMP_FILL_IN_CURRENT_LUN_IO_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// Rewrites the iSCSI LUN records of the array `lunIO` in place, keeping
// their order: "device" (the LUN's UUID) is removed and becomes "uuid", and
// "lun_name" is the LUN's name from the web API's LUN list, or the UUID when
// the list lacks it or cannot be had (logged; still true). A non-empty
// array costs one web API call. Other members stay unchanged.
//
// `lunIO` not an array, an element that is neither an object nor null, or a
// "device" that is present but not a string gives false with one error
// message, and `lunIO` is left untouched. A null element reads as a record
// without "device".
KORVSNMP_EXPORT bool FillInCurrentLunIO(Json::Value &lunIO);

}  // namespace KORVSNMP

#endif
