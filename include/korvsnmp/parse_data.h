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

// The same result, return value and messages, for any input, but the
// sections that the copying form copies ("System"[0], the disk and space
// records, "iSCSI", "NFS", "time") are moved out of `reply`, which is cheaper
// in time and memory. What is left of `reply` is unspecified; `reply` and
// `result` must be distinct values.
KORVSNMP_EXPORT bool SNMPParseReplyData(const Json::Value &request, Json::Value &&reply,
                                        Json::Value &result);

#endif
