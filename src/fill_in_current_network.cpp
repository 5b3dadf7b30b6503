// The network section: which interfaces the host reports and how they are
// grouped, and the records and sums built from the collector's counters.
#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <map>
#include <string>
#include <vector>

#include <korv_core.h>
#include <korv_net.h>

#include "json_read.h"
#include "korvsnmp/fill_in_current_network.h"
#include "platform_text.h"
#include "protocol/unit_log.h"

namespace {

constexpr char kLogUnit[] = "fill_in_current_network";

constexpr int kInterfaceCapacity = 32;
constexpr int kInterfaceSelection = 6;
constexpr int kVlanAnswerVlan = 1;
constexpr int kVlanAnswerNotVlan = 0;
constexpr int kOvsAnswerPlain = 0;
constexpr int kOvsAnswerAggregation = 2;
constexpr char kHiddenPrefix[] = "dkos";  // internal interfaces, never reported
constexpr size_t kHiddenPrefixLength = 4;
constexpr size_t kOvsMasterPrefixLength = 4;  // an Open vSwitch master is listed without it
constexpr size_t kPppoeNameSize = 16;

using InterfaceNames = std::vector<std::string>;
using AggregationMap = std::map<std::string, std::vector<std::string>>;

struct Counters {
    uint32_t rx = 0;
    uint32_t tx = 0;

    Counters &operator+=(const Counters &other)  // wraps modulo 2^32
    {
        rx += other.rx;
        tx += other.tx;
        return *this;
    }
};

// True when `a` sorts before `b`: bytes compared as unsigned values over the
// shorter length, then the shorter name first.
bool CompareIfName(const std::string &a, const std::string &b)
{
    const int order = std::memcmp(a.data(), b.data(), std::min(a.size(), b.size()));
    return order != 0 ? order < 0 : a.size() < b.size();
}

// Fills `names` with the reported interfaces, sorted, and `aggregations`
// with each link aggregation's members. False when the platform lists none.
bool GetNetInterfaceList(InterfaceNames &names, AggregationMap &aggregations)
{
    std::array<KLIBNetInterfaceInfo, kInterfaceCapacity> records{};
    // Zeroed once for the whole pass: a VLAN answer fills only what it knows.
    KLIBNetVlanInfo vlan{};
    const int listed = KLIBNetGetInterfaceInfo(records.data(), kInterfaceCapacity, kInterfaceSelection);
    if (listed <= 0) {
        KORVSNMP_LOG(LOG_ERR, "Failed to get net interface, errno=0x%X", KLIBCErrGet());
        return false;
    }

    for (int i = 0; i < std::min(listed, kInterfaceCapacity); ++i) {
        const std::string name = korvread::FieldText(records[i].name);
        const int vlanAnswer = KLIBNetVlanGet(name.c_str(), &vlan);
        if (vlanAnswer == kVlanAnswerVlan) {
            names.push_back(korvread::FieldText(vlan.name));
            continue;
        }
        if (vlanAnswer != kVlanAnswerNotVlan)
            continue;  // the query failed for this interface

        const int ovsAnswer = KLIBNetOVSIfIsMaster(name.c_str());
        if (ovsAnswer == kOvsAnswerPlain) {
            if (name.compare(0, kHiddenPrefixLength, kHiddenPrefix) != 0)
                names.push_back(name);
        } else if (ovsAnswer == kOvsAnswerAggregation) {
            KORVNetLinkAggrInfo aggregation{};
            if (KORVNetLinkAggrGet(name.c_str(), &aggregation) < 0 || aggregation.memberCount <= 0)
                continue;
            // The record holds 32 member slots; a count beyond them names no more members.
            const int members = std::min(aggregation.memberCount, KLIB_NET_AGGR_MAX_MEMBERS);
            std::vector<std::string> &memberNames = aggregations[name];
            memberNames.clear();
            for (int slot = 0; slot < members; ++slot)
                memberNames.push_back(korvread::FieldText(aggregation.members[slot]));
        } else {
            // A master named with four characters or fewer is listed with the empty name.
            names.push_back(name.size() > kOvsMasterPrefixLength ? name.substr(kOvsMasterPrefixLength)
                                                                 : std::string());
        }
    }
    std::sort(names.begin(), names.end(), CompareIfName);
    return true;
}

// The first element whose "device" is the string `name`, or null.
const Json::Value *FindDevice(const Json::Value &network, const std::string &name)
{
    for (const Json::Value &element : network) {
        const Json::Value &device = element["device"];
        if (device.isString() && device.asString() == name)
            return &element;
    }
    return nullptr;
}

// Reads an element's "rx" and "tx" (absent ones read as 0).
bool ReadCounters(const Json::Value &element, const std::string &device, Counters &counters)
{
    for (auto [member, counter] : {std::pair{"rx", &counters.rx}, std::pair{"tx", &counters.tx}}) {
        unsigned int value = 0;
        if (!korvread::ReadUInt32(element[member], value)) {
            KORVSNMP_LOG(LOG_ERR, "Network device [%s]: \"%s\" is not an unsigned 32-bit number",
                         device.c_str(), member);
            return false;
        }
        *counter = value;
    }
    return true;
}

bool AllRecords(const Json::Value &network)
{
    for (Json::ArrayIndex i = 0; i < network.size(); ++i) {
        if (!korvread::IsRecord(network[i])) {
            KORVSNMP_LOG(LOG_ERR, "Network element %u is not an object", i);
            return false;
        }
    }
    return true;
}

Json::Value Record(const std::string &device, const Counters &counters)
{
    Json::Value record(Json::objectValue);
    record["device"] = device;
    record["rx"] = counters.rx;
    record["tx"] = counters.tx;
    return record;
}

}  // namespace

namespace KORVSNMP {

bool FillInCurrentNetwork(const Json::Value &network, Json::Value &output)
{
    if (!network.isArray()) {
        KORVSNMP_LOG(LOG_ERR, "ReplyNetwork is not array");
        return false;
    }
    if (!AllRecords(network))
        return false;

    Json::Value result(Json::arrayValue);
    result.append(Json::Value(Json::objectValue))["device"] = "total";

    InterfaceNames names;
    AggregationMap aggregations;
    if (!GetNetInterfaceList(names, aggregations)) {
        output = result;
        return false;
    }

    Counters total;
    for (const std::string &name : names) {
        const Json::Value *element = FindDevice(network, name);
        Counters counters;
        if (element == nullptr)
            continue;
        if (!ReadCounters(*element, name, counters))
            return false;
        result.append(*element);
        total += counters;
    }

    std::map<std::string, Counters> aggregationSums;
    for (const auto &[aggregation, members] : aggregations) {
        for (const std::string &member : members) {
            const Json::Value *element = FindDevice(network, member);
            Counters counters;
            if (element == nullptr)
                continue;
            if (!ReadCounters(*element, member, counters))
                return false;
            aggregationSums[aggregation] += counters;
        }
    }
    for (const auto &[aggregation, sums] : aggregationSums) {
        result.append(Record(aggregation, sums));
        total += sums;
    }

    // The PPPoE link's records, under every device name that begins with its
    // name; they are not counted. An empty name is taken for no link.
    char pppoeBuffer[kPppoeNameSize] = {};
    if (KORVPPPoeIntfGet(pppoeBuffer, kPppoeNameSize) == 0) {
        const std::string pppoe = korvread::FieldText(pppoeBuffer);
        for (const Json::Value &element : network) {
            const Json::Value &device = element["device"];
            if (!pppoe.empty() && device.isString() &&
                device.asString().compare(0, pppoe.size(), pppoe) == 0)
                result.append(element);
        }
    }

    result[0]["rx"] = total.rx;
    result[0]["tx"] = total.tx;
    output = std::move(result);
    return true;
}

}  // namespace KORVSNMP
