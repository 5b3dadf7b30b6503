// The stand-in for the host platform (libkorvplatform.so.1).
//
// It implements every operation of korv_platform.h by its contract (record
// layouts, list allocation and release, failure results) and answers from
// one in-memory description of a host. Tests fill that description and switch
// operations to fail; nothing here is read by libkorvsnmp, which sees only the
// platform operations.
//
// The description and the switches are process-wide and unsynchronised:
// change them only while no platform operation runs.
#ifndef KORV_STANDIN_H
#define KORV_STANDIN_H

#include <map>
#include <optional>
#include <string>
#include <vector>

#include <json/value.h>

#include "../korv_platform.h"

namespace korvstandin {

// ---- The host description ---------------------------------------------------

struct Disk {
    int number = 0;
    int container = DISK_CONTAINER_INTERNAL;
    int groupIndex = 0;
    std::string devicePath{};      // cut to fit DiskInfo::devicePath
    bool recordMissing = false;  // the list node carries no disk record
};

struct ExpansionUnit {
    unsigned int number = 0;
    std::vector<std::string> diskPaths{};
    std::optional<std::string> modelName{};  // none: the unit has no model-name operation
    bool poweredOn = true;
};

struct ExternalDevice {
    std::string name{};         // as KORVUSBDevEnum lists it
    std::string displayText{};  // cut to fit ExtStgPartsVolInfo::displayName
    bool infoFails = false;   // KORVExtStgPartsVolInfoGet fails for it
};

struct ExternalDeviceSet {
    std::vector<ExternalDevice> devices{};
    bool sizeQueryFails = false;  // KORVUSBDevEnum's size query fails for this kind
    bool fillFails = false;       // its filling call fails for this kind
};

enum class NetRole { Plain, Vlan, Aggregation, OvsMaster };

struct NetInterface {
    std::string name{};
    NetRole role = NetRole::Plain;
    std::string vlanParent{};             // Vlan: the carrying interface
    std::string vlanName{};               // Vlan: the name the VLAN record lists
    std::vector<std::string> members{};   // Aggregation: member names, in slot order
    std::optional<int> memberCountClaim{};  // Aggregation: count written instead of members.size()
    int ovsMasterAnswer = 1;            // OvsMaster: KLIBNetOVSIfIsMaster's nonzero answer
    bool vlanQueryFails = false;        // KLIBNetVlanGet answers -1 for it
    bool vlanRecordUnwritten = false;   // Vlan: KLIBNetVlanGet answers 1 yet writes nothing
    bool aggrQueryFails = false;        // KORVNetLinkAggrGet answers -1 for it
};

struct Space {
    std::string devicePath{};
    std::string name{};
};

struct FlashCache {
    std::string spacePath{};
    std::string volumePath{};
    std::string layerPath{};     // what KORVVSpaceLayerPathGet answers for this cache
    bool layerFails = false;   // KORVVSpaceLayerPathGet fails for it
};

struct Lun {
    Json::Value uuid{};  // normally strings; other types make malformed LUN objects
    Json::Value name{};  // a null member is left out of the LUN object
};

// How the web API answers "list" of "KORV.Core.ISCSI.LUN".
enum class LunAnswer { Normal, Unsuccessful, WithoutData, WithoutLuns };

// A sectioned text file: section -> key -> value.
using SectionedFile = std::map<std::string, std::map<std::string, std::string>>;

struct HostDescription {
    unsigned int physMemSize = 0;
    bool quillbox = false;

    bool supportsEBox = false;
    std::vector<Disk> disks{};
    std::vector<ExpansionUnit> expansionUnits{};
    ExternalDeviceSet usb{};
    ExternalDeviceSet esata{};

    std::vector<NetInterface> interfaces{};
    std::string pppoeInterface{};  // empty: no PPPoE link

    std::vector<Space> spaces{};
    std::vector<FlashCache> flashCaches{};

    std::vector<Lun> luns{};
    LunAnswer lunAnswer = LunAnswer::Normal;

    std::map<std::string, SectionedFile> files{};  // by path; a missing path is an absent file
};

// ---- Operations, fault switches and observation -----------------------------

// One entry per platform operation.
enum class Op {
    KLIBCIsQuillbox,
    KLIBSystemPhysMemSizeGet,
    KLIBCSzListFind,
    KLIBCSzHashAlloc,
    KLIBCSzHashSetValue,
    KLIBCSzHashGetValue,
    KLIBCSzHashFree,
    KLIBCFileGetSectionValue,
    KLIBCErrGet,
    KLIBCErrorGetFile,
    KLIBCErrorGetLine,
    KLIBNetGetInterfaceInfo,
    KLIBNetVlanGet,
    KLIBNetOVSIfIsMaster,
    KORVNetLinkAggrGet,
    KORVPPPoeIntfGet,
    DiskInfoEnum,
    DiskInfoEnumFree,
    SupportEBox,
    KORVEBoxInfoEnum,
    KORVEBoxInfoEnumFree,
    KORVEBoxIsPoweron,
    KORVUSBDevEnum,
    KORVExtStgPartsVolInfoGet,
    KORVSpaceInfoEnum,
    KORVSpaceInfoFree,
    KORVFlashCacheConfigGet,
    KORVFlashCacheConfigFree,
    KORVVSpaceLayerPathGet,
    APIRunnerExec,
    JsonArrayHasString,
    Count_
};

const char *OpName(Op op);

enum class Fault {
    None,
    Fail,              // the operation gives its failure result
    FailLeavingList,   // list operations: fail, yet hand out the list as well
};

// A failing operation gives its contract's failure result (negative, 0 or
// null, as the operation's declaration says) and sets the platform's last
// error to `errorCode`. Operations without a failure result (the releases,
// the last-error queries) ignore the switch.
void SetFault(Op op, Fault fault = Fault::Fail, unsigned int errorCode = 0x0D01);

// The description that the operations answer from.
HostDescription &Host();

// Empties the description, clears every fault, the counters, the journal and
// the last error. Outstanding allocations are real and stay counted.
void Reset();

// Answers from the live host again, as before any test described one: every
// enumeration probes this machine afresh. Faults and counters stay.
void UseLiveHost();

// Number of calls of `op` since the last Reset.
int CallCount(Op op);

// Platform lists, hashes and string lists handed out and not yet released.
int OutstandingAllocations();

// When on, every call is journalled as "Name(arg, ...)" (off after Reset).
void SetJournal(bool on);
const std::vector<std::string> &Journal();

// The strings file that the web interface keeps its English texts in.
inline constexpr const char kStringsFilePath[] = "/usr/korv/korvman/webman/texts/enu/strings";

}  // namespace korvstandin

#endif
