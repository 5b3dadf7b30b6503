// What the "network" rows of a result are: the total, an interface, a link
// aggregation or the PPPoE link. The result does not say; the platform does.
#ifndef KORVSNMP_EXPOSITION_NETWORK_KINDS_H
#define KORVSNMP_EXPOSITION_NETWORK_KINDS_H

#include <cstddef>
#include <set>
#include <string>

#include <json/value.h>

namespace korvexposition {

// Numbered as KORVSNMP-MIB's korvIfKind.
enum class InterfaceKind : unsigned { Total = 1, Interface = 2, Aggregation = 3, Pppoe = 4 };

// Which devices are link aggregations, and the PPPoE link's name (a
// prefix; empty: none).
struct NetworkKinds {
    std::set<std::string> aggregations;
    std::string pppoePrefix;
};

// The platform's answer for the "network" rows of `result` (a result of any
// shape; rows without a string "device" are passed over).
NetworkKinds AskNetworkKinds(const Json::Value &result);

// The kind of the row at `position` of "network" named `device`: the total
// is the first row, named "total"; then aggregations, then PPPoE by prefix.
InterfaceKind KindOf(size_t position, const std::string &device, const NetworkKinds &kinds);

// "total", "interface", "aggregation", "pppoe".
const char *KindName(InterfaceKind kind);

}  // namespace korvexposition

#endif
