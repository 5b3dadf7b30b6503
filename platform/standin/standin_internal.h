// Shared plumbing of the stand-in's units: call accounting, fault switches,
// the platform's last error and the allocation count.
#ifndef KORV_STANDIN_INTERNAL_H
#define KORV_STANDIN_INTERNAL_H

#include <sstream>
#include <string>

#include "korv_standin.h"

namespace korvstandin::detail {

// The parts of the description that the live host is probed for.
enum class Domain { Model, Memory, Disks, Network, Storage, Luns, Files };

// The description that the operations answer from. While no test has
// described a host (through Host() or Reset()), `domain` is first probed
// afresh from the live host.
const HostDescription &Current(Domain domain);

bool JournalOn();
void Record(std::string entry);

// Counts a call of `op`, journals it with `args` when the journal is on, and
// returns the fault switched on for `op`. A fault sets the last error.
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

// Bookkeeping of what the stand-in hands out and takes back.
void Allocated();
void Released();

// Copies `text` into `buffer` of `size` bytes, cut to fit and NUL-terminated.
void CopyText(char *buffer, size_t size, const std::string &text);

// String lists, for the records that carry one; released with their record.
KLIBCSzList *NewSzList(const std::vector<std::string> &items);
void FreeSzList(KLIBCSzList *list);

}  // namespace korvstandin::detail

#endif
