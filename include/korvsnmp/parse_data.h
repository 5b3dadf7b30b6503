// Assembly of the caller's statistics result from one collector reply.
#ifndef KORVSNMP_PARSE_DATA_H
#define KORVSNMP_PARSE_DATA_H

#include <json/value.h>

#include "export.h"

// Fills `result` with the sections that `request`'s "resource" list selects
// ("cpu", "memory", "network", "disk", "space", "lun", "nfs"; "all", an empty
// list or no list select every one), taken from `reply`'s "data", and always
// "time". False at the first missing or malformed section; sections filled
// before it stay. `result` is not cleared first.
KORVSNMP_EXPORT bool SNMPParseReplyData(const Json::Value &request, const Json::Value &reply,
                                        Json::Value &result);

#endif
