#ifndef KORVSNMP_FILL_IN_CURRENT_LUN_IO_H
#define KORVSNMP_FILL_IN_CURRENT_LUN_IO_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// Rewrites the iSCSI LUN records in place: "device" becomes "uuid", and
// "lun_name" is the LUN's name from the web API.
KORVSNMP_EXPORT bool FillInCurrentLunIO(Json::Value &lunIO);

}  // namespace KORVSNMP

#endif
