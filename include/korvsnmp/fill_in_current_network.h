#ifndef KORVSNMP_FILL_IN_CURRENT_NETWORK_H
#define KORVSNMP_FILL_IN_CURRENT_NETWORK_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The network section: a "total" record, one record per reported interface,
// one per link aggregation, and the PPPoE link's records.
KORVSNMP_EXPORT bool FillInCurrentNetwork(const Json::Value &network, Json::Value &output);

}  // namespace KORVSNMP

#endif
