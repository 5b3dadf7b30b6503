#include "exposition/network_kinds.h"

#include "korv_net.h"

namespace korvexposition {

namespace {

constexpr char kTotal[] = "total";
constexpr size_t kPppoeNameSize = 16;

}  // namespace

NetworkKinds AskNetworkKinds(const Json::Value &result)
{
    NetworkKinds kinds;
    const Json::Value *network = result.isObject() ? result.find("network", "network" + 7) : nullptr;
    if (network != nullptr && network->isArray()) {
        for (const Json::Value &record : *network) {
            if (!record.isObject() || !record.isMember("device") || !record["device"].isString())
                continue;
            const std::string device = record["device"].asString();
            if (KLIBNetOVSIfIsMaster(device.c_str()) == 2)
                kinds.aggregations.insert(device);
        }
    }
    char pppoe[kPppoeNameSize] = {};
    if (KORVPPPoeIntfGet(pppoe, sizeof pppoe) == 0) {
        pppoe[kPppoeNameSize - 1] = '\0';
        kinds.pppoePrefix = pppoe;
    }
    return kinds;
}

InterfaceKind KindOf(size_t position, const std::string &device, const NetworkKinds &kinds)
{
    if (position == 0 && device == kTotal)
        return InterfaceKind::Total;
    if (kinds.aggregations.count(device) != 0)
        return InterfaceKind::Aggregation;
    if (!kinds.pppoePrefix.empty() && device.compare(0, kinds.pppoePrefix.size(), kinds.pppoePrefix) == 0)
        return InterfaceKind::Pppoe;
    return InterfaceKind::Interface;
}

const char *KindName(InterfaceKind kind)
{
    switch (kind) {
    case InterfaceKind::Total: return kTotal;
    case InterfaceKind::Interface: return "interface";
    case InterfaceKind::Aggregation: return "aggregation";
    case InterfaceKind::Pppoe: return "pppoe";
    }
    return "";
}

}  // namespace korvexposition
