#ifndef KORVSNMP_FILL_IN_CURRENT_NETWORK_H
#define KORVSNMP_FILL_IN_CURRENT_NETWORK_H

#include <json/value.h>

#include "export.h"

namespace KORVSNMP {

// The network section, built from the collector's "Network" array: the
// "total" record first, then a copy of the first element of each interface
// that the host reports (byte-wise name order), one record per link
// aggregation with the sums of its members, and copies of every element whose
// device begins with the PPPoE link's name. "rx" and "tx" are summed in
// unsigned 32-bit arithmetic and wrap; absent ones count as 0.
//
// Returns false without touching `output` when `network` is not an array,
// when an element is neither an object nor null, or when a counter that is
// read is not an unsigned 32-bit number (one message names the element or
// the device and the member). An element whose "device" is not a string
// matches nothing. When the platform lists no interface, `output` is left
// holding only {"device": "total"} and the result is false.
KORVSNMP_EXPORT bool FillInCurrentNetwork(const Json::Value &network, Json::Value &output);

}  // namespace KORVSNMP

#endif
