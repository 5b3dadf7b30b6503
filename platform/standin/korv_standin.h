// Test control of the stand-in for the host platform (libkorvplatform.so.1).
//
// The stand-in implements every operation of korv_platform.h by its contract
// (record layouts, list allocation and release, failure results) and answers
// from one description of a host: the live machine, the file named by
// KORVPLATFORM_HOST (host_file.h), or one that a test fills in here. Tests
// also switch operations to fail and watch the calls; libkorvsnmp sees only
// the platform operations. This header is not installed.
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
    std::optional<int> neededClaim{};  // size stored by the size query instead of the true one
    std::optional<int> countClaim{};   // filling call's answer instead of the number of devices
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
    std::optional<std::string> spacePath{};   // none: the record carries a null pointer
    std::optional<std::string> volumePath{};  // none: the record carries a null pointer
    std::string layerPath{};     // what KORVVSpaceLayerPathGet answers for this cache
    bool layerFails = false;   // KORVVSpaceLayerPathGet fails for it
};

struct Lun {
    Json::Value uuid{};  // normally strings; other types make malformed LUN objects
    Json::Value name{};  // a null member is left out of the LUN object
};

// How the web API answers "list" of "KORV.Core.ISCSI.LUN".
enum class LunAnswer {
    Normal,
    Unsuccessful,
    WithoutData,
    WithoutLuns,
    SuccessNotBoolean,  // "success" is the string "true"
    LunsNotArray,       // "luns" is an object holding the LUNs by UUID
};

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
    std::optional<int> interfaceCountClaim{};  // KLIBNetGetInterfaceInfo's answer instead of the count filled
    std::string pppoeInterface{};  // empty: no PPPoE link

    std::vector<Space> spaces{};
    std::vector<FlashCache> flashCaches{};

    std::vector<Lun> luns{};
    LunAnswer lunAnswer = LunAnswer::Normal;

    std::map<std::string, SectionedFile> files{};  // by path; a missing path is an absent file

    // Malformed answers: texts as long as their fixed field or longer fill it
    // without a terminating NUL; the last error names no source file (null).
    bool unterminatedFields = false;
    bool nullErrorFile = false;
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

// Which calls of an operation a fault hits, counted from 1 since Reset.
struct Calls {
    int first = 1;
    bool later = true;  // also every call after `first`

    static Calls Every() { return {1, true}; }
    static Calls Only(int call) { return {call, false}; }
    static Calls From(int call) { return {call, true}; }
};

// The last error of a call that ran out of memory, and the default of faults.
inline constexpr unsigned int kOutOfMemoryError = 0x0D01;

// A failing operation gives its contract's failure result (negative, 0 or
// null, as the operation's declaration says) and sets the platform's last
// error to `errorCode` ("standin" and the operation's index as its file and
// line). Operations without a failure result (the releases, the last-error
// queries, KLIBCIsQuillbox) ignore the switch. One switch per operation: a
// new call replaces the old one.
void SetFault(Op op, Fault fault = Fault::Fail, unsigned int errorCode = kOutOfMemoryError,
              Calls calls = Calls::Every());

// A call of one operation: the `call`-th since Reset.
struct CallRef {
    Op op;
    int call;
};

// Calls that ran out of memory (std::bad_alloc, or a null from a
// non-throwing allocation) since Reset, in order. Such a call releases what
// it had built, sets the last error as a fault with kOutOfMemoryError does,
// and gives its failure result: no exception leaves an operation.
const std::vector<CallRef> &OutOfMemoryCalls();

// The description that the operations answer from.
HostDescription &Host();

// Empties the description, clears every fault, the counters, the journal,
// the out-of-memory calls and the last error. Outstanding allocations are
// real and stay counted.
void Reset();

// Answers as in a process that no test controls, as before any test
// described a host: the next call reads KORVPLATFORM_HOST afresh and answers
// from that file, or from the live host (probed afresh by every query) when
// the variable is unset. Faults and counters stay.
void UseProcessHost();

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
