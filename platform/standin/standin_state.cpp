// The stand-in's state: the description, fault switches and observation.
#include "standin_state.h"

#include <syslog.h>

#include <array>
#include <cstdlib>
#include <cstring>

#include "host_file.h"
#include "live_host.h"

namespace korvstandin {
namespace {

struct FaultSwitch {
    Fault fault = Fault::None;
    unsigned int errorCode = 0;
    Calls calls{};
};

struct LastError {
    unsigned int code = 0;
    std::string file;
    int line = 0;
};

// Where the description comes from.
enum class Source {
    Test,         // a test fills it in
    Undecided,    // a process host: KORVPLATFORM_HOST not yet looked at
    LiveHost,     // probed from this machine
    HostFile,     // read from the host file
    BadHostFile,  // the host file is unusable: every operation fails
};

struct State {
    HostDescription host;
    Source source = Source::Undecided;
    std::array<FaultSwitch, static_cast<size_t>(Op::Count_)> faults{};
    std::array<int, static_cast<size_t>(Op::Count_)> calls{};
    bool journalOn = false;
    std::vector<std::string> journal;
    std::vector<CallRef> outOfMemory;
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

constexpr char kFaultFile[] = "standin";
// The last error of every call while the host file is unusable.
constexpr unsigned int kBadHostFileError = 0x0D03;

size_t Index(Op op) { return static_cast<size_t>(op); }

// A process host: the file that KORVPLATFORM_HOST names, else the live host.
void ChooseProcessHost(State &state)
{
    const char *path = std::getenv(kHostFileVariable);
    if (path == nullptr) {
        state.source = Source::LiveHost;
        return;
    }
    std::string error;
    HostDescription host;
    bool read = false;
    try {
        read = ReadHostFile(path, host, error);
    } catch (const std::bad_alloc &) {
        error = "out of memory";
    }
    if (read) {
        state.host = std::move(host);
        state.source = Source::HostFile;
        return;
    }
    state.source = Source::BadHostFile;
    syslog(LOG_ERR, "%s:%d Host description %s: %s; every platform operation fails", "korvplatform",
           __LINE__, path, error.c_str());
}

bool HitsCall(const FaultSwitch &fault, int call)
{
    return fault.fault != Fault::None &&
           (call == fault.calls.first || (fault.calls.later && call > fault.calls.first));
}

}  // namespace

const char *OpName(Op op) { return op < Op::Count_ ? kOpNames[Index(op)] : "?"; }

void SetFault(Op op, Fault fault, unsigned int errorCode, Calls calls)
{
    if (op < Op::Count_)
        TheState().faults[Index(op)] = {fault, errorCode, calls};
}

HostDescription &Host()
{
    TheState().source = Source::Test;
    return TheState().host;
}

void Reset()
{
    State &state = TheState();
    state.source = Source::Test;
    state.host = HostDescription{};
    state.faults.fill({});
    state.calls.fill(0);
    state.journalOn = false;
    state.journal.clear();
    state.outOfMemory.clear();
    state.lastError = {};
}

void UseProcessHost()
{
    TheState().source = Source::Undecided;
    TheState().host = HostDescription{};
}

int CallCount(Op op) { return op < Op::Count_ ? TheState().calls[Index(op)] : 0; }

const std::vector<CallRef> &OutOfMemoryCalls() { return TheState().outOfMemory; }

int OutstandingAllocations() { return TheState().outstanding; }

void SetJournal(bool on) { TheState().journalOn = on; }

const std::vector<std::string> &Journal() { return TheState().journal; }

namespace detail {

bool Described() { return TheState().source != Source::LiveHost; }

const HostDescription &Current(Domain domain)
{
    State &state = TheState();
    if (state.source != Source::LiveHost)
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
    if (state.source == Source::Undecided)
        ChooseProcessHost(state);
    const int call = ++state.calls[Index(op)];
    if (state.source == Source::BadHostFile) {
        SetLastError(kBadHostFileError, kFaultFile, static_cast<int>(Index(op)));
        return Fault::Fail;
    }
    const FaultSwitch &fault = state.faults[Index(op)];
    if (!HitsCall(fault, call))
        return Fault::None;
    SetLastError(fault.errorCode, kFaultFile, static_cast<int>(Index(op)));
    return fault.fault;
}

void SetLastError(unsigned int code, const char *file, int line)
{
    TheState().lastError = {code, file, line};
}

bool NullErrorFile() { return TheState().source != Source::LiveHost && TheState().host.nullErrorFile; }

void OutOfMemory(Op op)
{
    State &state = TheState();
    SetLastError(kOutOfMemoryError, kFaultFile, static_cast<int>(Index(op)));
    state.outOfMemory.push_back({op, state.calls[Index(op)]});
}

void Allocated() { ++TheState().outstanding; }
void Released() { --TheState().outstanding; }

void CopyText(char *buffer, size_t size, const std::string &text)
{
    if (buffer == nullptr || size == 0)
        return;
    const State &state = TheState();
    if (state.source != Source::LiveHost && state.host.unterminatedFields && text.size() >= size) {
        std::memcpy(buffer, text.data(), size);
        return;
    }
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
    if (korvstandin::detail::NullErrorFile())
        return nullptr;
    return korvstandin::TheState().lastError.file.c_str();
}

extern "C" int KLIBCErrorGetLine(void)
{
    korvstandin::detail::Enter(Op::KLIBCErrorGetLine);
    return korvstandin::TheState().lastError.line;
}
