// Stand-in for the network services. On the live host each query probes
// only what it answers: the interface list, one interface, or the PPP link.
#include <algorithm>
#include <cstring>
#include <optional>

#include "live_host.h"
#include "standin_state.h"

using korvstandin::Fault;
using korvstandin::NetInterface;
using korvstandin::NetRole;
using korvstandin::Op;
using korvstandin::detail::CopyText;
using korvstandin::detail::Described;
using korvstandin::detail::Enter;
using korvstandin::detail::Guarded;
using korvstandin::detail::Text;

namespace {

const std::string kLiveRoot;  // the real /

const korvstandin::HostDescription &Description()
{
    return korvstandin::detail::Current(korvstandin::detail::Domain::Model);
}

std::optional<NetInterface> FindInterface(const char *name)
{
    if (name == nullptr)
        return std::nullopt;
    if (!Described())
        return korvstandin::live::ProbeInterface(kLiveRoot, name);
    for (const NetInterface &entry : Description().interfaces)
        if (entry.name == name)
            return entry;
    return std::nullopt;
}

constexpr unsigned int kNoSuchInterface = 0x0E01;

}  // namespace

extern "C" {

int KLIBNetGetInterfaceInfo(KLIBNetInterfaceInfo *records, int capacity, int flags)
{
    if (Enter(Op::KLIBNetGetInterfaceInfo, capacity, flags) != Fault::None)
        return -1;
    if (records == nullptr || capacity <= 0)
        return -1;
    return Guarded(Op::KLIBNetGetInterfaceInfo, -1, [&] {
        std::vector<std::string> names;
        if (Described()) {
            for (const NetInterface &entry : Description().interfaces)
                names.push_back(entry.name);
        } else {
            names = korvstandin::live::ProbeInterfaceNames(kLiveRoot);
        }
        int filled = static_cast<int>(std::min<size_t>(names.size(), static_cast<size_t>(capacity)));
        for (int i = 0; i < filled; ++i)
            CopyText(records[i].name, sizeof records[i].name, names[i]);
        if (Described() && Description().interfaceCountClaim)
            return *Description().interfaceCountClaim;
        return filled;
    });
}

int KLIBNetVlanGet(const char *name, KLIBNetVlanInfo *vlan)
{
    if (Enter(Op::KLIBNetVlanGet, Text(name)) != Fault::None)
        return -1;
    return Guarded(Op::KLIBNetVlanGet, -1, [&] {
        std::optional<NetInterface> entry = FindInterface(name);
        if (!entry || vlan == nullptr) {
            korvstandin::detail::SetLastError(kNoSuchInterface, "net", __LINE__);
            return -1;
        }
        if (entry->vlanQueryFails)
            return -1;
        if (entry->role != NetRole::Vlan)
            return 0;
        if (entry->vlanRecordUnwritten)
            return 1;
        // Only a VLAN's answer writes the record; other interfaces leave it as it was.
        CopyText(vlan->parent, sizeof vlan->parent, entry->vlanParent);
        CopyText(vlan->name, sizeof vlan->name, entry->vlanName);
        return 1;
    });
}

int KLIBNetOVSIfIsMaster(const char *name)
{
    if (Enter(Op::KLIBNetOVSIfIsMaster, Text(name)) != Fault::None)
        return -1;
    return Guarded(Op::KLIBNetOVSIfIsMaster, -1, [&] {
        std::optional<NetInterface> entry = FindInterface(name);
        if (!entry)
            return 0;
        switch (entry->role) {
        case NetRole::Aggregation:
            return 2;
        case NetRole::OvsMaster:
            return entry->ovsMasterAnswer;
        default:
            return 0;
        }
    });
}

int KORVNetLinkAggrGet(const char *name, KORVNetLinkAggrInfo *aggr)
{
    if (Enter(Op::KORVNetLinkAggrGet, Text(name)) != Fault::None)
        return -1;
    return Guarded(Op::KORVNetLinkAggrGet, -1, [&] {
        std::optional<NetInterface> entry = FindInterface(name);
        if (!entry || aggr == nullptr || entry->role != NetRole::Aggregation ||
            entry->aggrQueryFails)
            return -1;
        CopyText(aggr->name, sizeof aggr->name, entry->name);
        size_t slots = std::min<size_t>(entry->members.size(), KLIB_NET_AGGR_MAX_MEMBERS);
        for (size_t i = 0; i < slots; ++i)
            CopyText(aggr->members[i], sizeof aggr->members[i], entry->members[i]);
        aggr->memberCount =
            entry->memberCountClaim.value_or(static_cast<int>(entry->members.size()));
        return 0;
    });
}

int KORVPPPoeIntfGet(char *name, int size)
{
    if (Enter(Op::KORVPPPoeIntfGet, size) != Fault::None)
        return -1;
    return Guarded(Op::KORVPPPoeIntfGet, -1, [&] {
        const std::string pppoe =
            Described() ? Description().pppoeInterface : korvstandin::live::ProbePppLink(kLiveRoot);
        if (pppoe.empty() || name == nullptr || size <= 0)
            return -1;
        CopyText(name, static_cast<size_t>(size), pppoe);
        return 0;
    });
}

}  // extern "C"
