// The stand-in's state, shared by its units: the description answered from,
// call accounting, fault switches, the platform's last error and the
// allocation count.
#ifndef KORV_STANDIN_STATE_H
#define KORV_STANDIN_STATE_H

#include <new>
#include <sstream>
#include <string>

#include "korv_standin.h"

namespace korvstandin::detail {

// The parts of the description that the live host is probed for.
enum class Domain { Model, Memory, Disks, Storage, Luns, Files };

// True while the operations answer from a description (a test's or a host
// file's); false while they probe the live host query by query.
bool Described();

// The description that the operations answer from. On the live host,
// `domain` is first probed afresh; network queries probe only what they
// answer (see net.cpp).
const HostDescription &Current(Domain domain);

bool JournalOn();
void Record(std::string entry);

// Counts a call of `op`, journals it with `args` when the journal is on, and
// returns the fault that hits this call. A fault sets the last error. While
// the process's host file is unusable, every call fails.
Fault EnterFault(Op op);

template <typename... Args>
Fault Enter(Op op, const Args &...args)
{
    if (JournalOn()) {
        std::ostringstream entry;
        entry << OpName(op) << '(';
        [[maybe_unused]] const char *separator = "";
        ((entry << separator << args, separator = ", "), ...);
        entry << ')';
        Record(entry.str());
    }
    return EnterFault(op);
}

inline const char *Text(const char *text) { return text ? text : "(null)"; }

void SetLastError(unsigned int code, const char *file, int line);
bool NullErrorFile();

// Notes that the current call of `op` ran out of memory and sets the last error.
void OutOfMemory(Op op);

// Runs `body` for the current call of `op`; when it runs out of memory, the
// call is noted and gives `failure` instead. `body` releases what it built.
template <typename Result, typename Body>
Result Guarded(Op op, Result failure, Body &&body)
{
    try {
        return body();
    } catch (const std::bad_alloc &) {
        OutOfMemory(op);
        return failure;
    }
}

// Bookkeeping of what the stand-in hands out and takes back.
void Allocated();
void Released();

// Copies `text` into `buffer` of `size` bytes, cut to fit and NUL-terminated;
// on a host with unterminated fields a text that fills the buffer keeps no NUL.
void CopyText(char *buffer, size_t size, const std::string &text);

// String lists, for the records that carry one; released with their record.
KLIBCSzList *NewSzList(const std::vector<std::string> &items);
void FreeSzList(KLIBCSzList *list);

}  // namespace korvstandin::detail

#endif
