#include "select_hook.h"

#include <dlfcn.h>
#include <sys/select.h>

#include <cerrno>
#include <mutex>

namespace korvtest {
namespace {

std::mutex gMutex;
SelectMode gOnWrite = SelectMode::Real, gOnRead = SelectMode::Real;
std::vector<SelectCall> gCalls;

using SelectFn = int (*)(int, fd_set *, fd_set *, fd_set *, timeval *);

SelectFn RealSelect()
{
    static const auto real = reinterpret_cast<SelectFn>(dlsym(RTLD_NEXT, "select"));
    return real;
}

}  // namespace

SelectHook::SelectHook(SelectMode onWrite, SelectMode onRead)
{
    std::lock_guard<std::mutex> lock(gMutex);
    gOnWrite = onWrite;
    gOnRead = onRead;
    gCalls.clear();
}

SelectHook::~SelectHook() { std::lock_guard<std::mutex> lock(gMutex); gOnWrite = gOnRead = SelectMode::Real; }

std::vector<SelectCall> SelectHook::Calls() const
{
    std::lock_guard<std::mutex> lock(gMutex);
    return gCalls;
}

}  // namespace korvtest

extern "C" int select(int nfds, fd_set *readfds, fd_set *writefds, fd_set *exceptfds,
                      timeval *timeout)
{
    using korvtest::SelectMode;
    std::unique_lock<std::mutex> lock(korvtest::gMutex);
    korvtest::gCalls.push_back({nfds, readfds != nullptr, writefds != nullptr, exceptfds != nullptr,
                                timeout != nullptr, timeout ? *timeout : timeval{}});
    const SelectMode mode = writefds != nullptr ? korvtest::gOnWrite : korvtest::gOnRead;
    lock.unlock();
    switch (mode) {
    case SelectMode::TimeOut:
        return 0;
    case SelectMode::Fail:
        errno = EINTR;
        return -1;
    case SelectMode::ReadyUnmarked:
        for (fd_set *set : {readfds, writefds, exceptfds})
            if (set != nullptr) FD_ZERO(set);
        return 1;
    case SelectMode::Real:
        break;
    }
    return korvtest::RealSelect()(nfds, readfds, writefds, exceptfds, timeout);
}
