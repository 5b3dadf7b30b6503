// The stand-in's host description, fault switches and observation.
#include <array>
#include <cstring>

#include "live_host.h"
#include "standin_internal.h"

namespace korvstandin {
namespace {

struct FaultSwitch {
    Fault fault = Fault::None;
    unsigned int errorCode = 0;
};

struct LastError {
    unsigned int code = 0;
    std::string file;
    int line = 0;
};

struct State {
    HostDescription host;
    bool described = false;  // a test describes the host; else it is probed live
    std::array<FaultSwitch, static_cast<size_t>(Op::Count_)> faults{};
    std::array<int, static_cast<size_t>(Op::Count_)> calls{};
    bool journalOn = false;
    std::vector<std::string> journal;
    LastError lastError;
    int outstanding = 0;
};

State &TheState()
{
    static State state;
    return state;
}

constexpr const char *kOpNames[] = {
    "KLIBCIsQuillbox",        "KLIBSystemPhysMemSizeGet", "KLIBCSzListFind",
    "KLIBCSzHashAlloc",       "KLIBCSzHashSetValue",      "KLIBCSzHashGetValue",
    "KLIBCSzHashFree",        "KLIBCFileGetSectionValue", "KLIBCErrGet",
    "KLIBCErrorGetFile",      "KLIBCErrorGetLine",        "KLIBNetGetInterfaceInfo",
    "KLIBNetVlanGet",         "KLIBNetOVSIfIsMaster",     "KORVNetLinkAggrGet",
    "KORVPPPoeIntfGet",       "DiskInfoEnum",             "DiskInfoEnumFree",
    "SupportEBox",            "KORVEBoxInfoEnum",         "KORVEBoxInfoEnumFree",
    "KORVEBoxIsPoweron",      "KORVUSBDevEnum",           "KORVExtStgPartsVolInfoGet",
    "KORVSpaceInfoEnum",      "KORVSpaceInfoFree",        "KORVFlashCacheConfigGet",
    "KORVFlashCacheConfigFree", "KORVVSpaceLayerPathGet", "KORV::APIRunner::Exec",
    "KORV::WebAPIUtil::JsonArrayHasString",
};
static_assert(std::size(kOpNames) == static_cast<size_t>(Op::Count_), "one name per operation");

size_t Index(Op op) { return static_cast<size_t>(op); }

}  // namespace

const char *OpName(Op op) { return op < Op::Count_ ? kOpNames[Index(op)] : "?"; }

void SetFault(Op op, Fault fault, unsigned int errorCode)
{
    if (op < Op::Count_)
        TheState().faults[Index(op)] = {fault, errorCode};
}

HostDescription &Host()
{
    TheState().described = true;
    return TheState().host;
}

void Reset()
{
    State &state = TheState();
    state.described = true;
    state.host = HostDescription{};
    state.faults.fill({});
    state.calls.fill(0);
    state.journalOn = false;
    state.journal.clear();
    state.lastError = {};
}

void UseLiveHost()
{
    TheState().described = false;
    TheState().host = HostDescription{};
}

int CallCount(Op op) { return op < Op::Count_ ? TheState().calls[Index(op)] : 0; }

int OutstandingAllocations() { return TheState().outstanding; }

void SetJournal(bool on) { TheState().journalOn = on; }

const std::vector<std::string> &Journal() { return TheState().journal; }

namespace detail {

const HostDescription &Current(Domain domain)
{
    State &state = TheState();
    if (state.described)
        return state.host;
    HostDescription &host = state.host;
    const std::string liveRoot;  // the real /
    switch (domain) {
    case Domain::Model:  // an ordinary Linux host: no Quillbox, no expansion units
        break;
    case Domain::Memory:
        host.physMemSize = live::ProbeMemory();
        break;
    case Domain::Disks:
        host.disks.clear();
        host.usb = {};
        host.esata = {};
        host.expansionUnits.clear();
        live::ProbeDisks(liveRoot, host);
        break;
    case Domain::Network:
        host.interfaces.clear();
        host.pppoeInterface.clear();
        live::ProbeNetwork(liveRoot, host);
        break;
    case Domain::Storage:
        host.spaces.clear();
        host.flashCaches.clear();
        live::ProbeSpaces(liveRoot, host);
        break;
    case Domain::Luns:
        host.luns.clear();
        live::ProbeLuns(liveRoot, host);
        break;
    case Domain::Files:
        host.files.clear();
        live::ProbeStrings(liveRoot, host);
        break;
    }
    return host;
}

bool JournalOn() { return TheState().journalOn; }

void Record(std::string entry) { TheState().journal.push_back(std::move(entry)); }

Fault EnterFault(Op op)
{
    State &state = TheState();
    ++state.calls[Index(op)];
    const FaultSwitch &fault = state.faults[Index(op)];
    if (fault.fault != Fault::None)
        SetLastError(fault.errorCode, "standin", static_cast<int>(Index(op)));
    return fault.fault;
}

void SetLastError(unsigned int code, const char *file, int line)
{
    TheState().lastError = {code, file, line};
}

void Allocated() { ++TheState().outstanding; }
void Released() { --TheState().outstanding; }

void CopyText(char *buffer, size_t size, const std::string &text)
{
    if (buffer == nullptr || size == 0)
        return;
    size_t length = std::min(text.size(), size - 1);
    std::memcpy(buffer, text.data(), length);
    buffer[length] = '\0';
}

}  // namespace detail
}  // namespace korvstandin

// ---- The last-error queries ---------------------------------------------------

using korvstandin::Op;

extern "C" unsigned int KLIBCErrGet(void)
{
    korvstandin::detail::Enter(Op::KLIBCErrGet);
    return korvstandin::TheState().lastError.code;
}

extern "C" const char *KLIBCErrorGetFile(void)
{
    korvstandin::detail::Enter(Op::KLIBCErrorGetFile);
    return korvstandin::TheState().lastError.file.c_str();
}

extern "C" int KLIBCErrorGetLine(void)
{
    korvstandin::detail::Enter(Op::KLIBCErrorGetLine);
    return korvstandin::TheState().lastError.line;
}
