// The seam for the collector client's waits. The test program defines
// select() itself: every call is recorded, with the wait it asked for, and a
// test may make the waits end at once instead of lasting 10.5 s or 90 s.
#ifndef KORVTEST_SELECT_HOOK_H
#define KORVTEST_SELECT_HOOK_H

#include <sys/time.h>

#include <vector>

namespace korvtest {

enum class SelectMode {
    Real,           // a real select() with the wait asked for
    TimeOut,        // the wait ran out: 0 at once
    Fail,           // -1 with errno EINTR
    ReadyUnmarked,  // 1, yet the descriptor is not marked in its set
};

struct SelectCall {
    int nfds;
    bool readSet;
    bool writeSet;
    bool exceptSet;
    bool hasTimeout;
    timeval timeout;
};

// For its lifetime, select() calls that watch a write set behave as
// `onWrite`, the others as `onRead`; the record starts empty.
class SelectHook {
public:
    SelectHook(SelectMode onWrite, SelectMode onRead);
    ~SelectHook();
    SelectHook(const SelectHook &) = delete;
    SelectHook &operator=(const SelectHook &) = delete;

    std::vector<SelectCall> Calls() const;
};

}  // namespace korvtest

#endif
