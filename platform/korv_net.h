// The host platform's network services: the interface list, VLANs, Open
// vSwitch masters, link aggregations and the PPPoE link.
//
// Declarations only: on the appliance the host's own libraries define these;
// elsewhere the stand-in libkorvplatform.so.1 does. The records are
// fixed-layout byte records exchanged with the platform as they stand.
#ifndef KORV_PLATFORM_NET_H
#define KORV_PLATFORM_NET_H

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

#define KLIB_NET_NAME_SIZE 16
#define KLIB_NET_AGGR_MAX_MEMBERS 32

// One interface as the network layer lists it (132 bytes).
typedef struct KLIBNetInterfaceInfo {
    char name[KLIB_NET_NAME_SIZE];  // interface name, NUL-terminated
    unsigned char details[116];     // addresses and flags; not read by korvsnmp
} KLIBNetInterfaceInfo;

// A VLAN interface (36 bytes).
typedef struct KLIBNetVlanInfo {
    char parent[KLIB_NET_NAME_SIZE];  // the interface that carries the VLAN
    char name[KLIB_NET_NAME_SIZE];    // the name under which the VLAN is listed
    int vlanId;
} KLIBNetVlanInfo;

// A link aggregation and its members (540 bytes).
typedef struct KORVNetLinkAggrInfo {
    char name[KLIB_NET_NAME_SIZE];
    int mode;
    int flags;
    int memberCount;  // signed; slots beyond the 32 that the record holds do not exist
    char members[KLIB_NET_AGGR_MAX_MEMBERS][KLIB_NET_NAME_SIZE];
} KORVNetLinkAggrInfo;

#ifdef __cplusplus
static_assert(sizeof(KLIBNetInterfaceInfo) == 132, "interface record is 132 bytes");
static_assert(offsetof(KLIBNetInterfaceInfo, name) == 0, "interface name at offset 0");
static_assert(sizeof(KLIBNetVlanInfo) == 36, "VLAN record is 36 bytes");
static_assert(offsetof(KLIBNetVlanInfo, name) == 16, "listed VLAN name at offset 16");
static_assert(sizeof(KORVNetLinkAggrInfo) == 540, "aggregation record is 540 bytes");
static_assert(offsetof(KORVNetLinkAggrInfo, memberCount) == 24, "member count at offset 24");
static_assert(offsetof(KORVNetLinkAggrInfo, members) == 28, "member slots from offset 28");
#endif

// Fills up to `capacity` records with the interfaces that `flags` selects.
// Returns the number of records filled; 0 or less is failure (KLIBCErrGet
// tells why).
int KLIBNetGetInterfaceInfo(KLIBNetInterfaceInfo *records, int capacity, int flags);

// 1: `name` is a VLAN and `vlan` is filled; 0: not a VLAN (`vlan` untouched);
// anything else: failure for this interface.
int KLIBNetVlanGet(const char *name, KLIBNetVlanInfo *vlan);

// 0: not an Open vSwitch master; 2: a link aggregation; any other value:
// an Open vSwitch master, whose listed name drops the first four characters.
int KLIBNetOVSIfIsMaster(const char *name);

// Fills `aggr` for the aggregation `name`; negative on failure.
int KORVNetLinkAggrGet(const char *name, KORVNetLinkAggrInfo *aggr);

// 0 when a PPPoE link exists: its NUL-terminated name is then in `name`
// (at most `size` bytes). Any other result: there is none.
int KORVPPPoeIntfGet(char *name, int size);

#ifdef __cplusplus
}
#endif

#endif
