#include "watch.h"

#include <poll.h>
#include <signal.h>
#include <time.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cerrno>

namespace korvstat {

bool WaitUnlessInterrupted(std::chrono::milliseconds interval)
{
    // The stop signals are blocked for the wait and read from a signalfd,
    // so that one that comes at any moment of it ends the wait.
    sigset_t stops, previous;
    sigemptyset(&stops);
    sigaddset(&stops, SIGINT);
    sigaddset(&stops, SIGTERM);
    sigprocmask(SIG_BLOCK, &stops, &previous);
    bool elapsed = true;
    const int fd = signalfd(-1, &stops, SFD_CLOEXEC);
    if (fd >= 0) {
        pollfd ready{fd, POLLIN, 0};
        int polled;
        // A stop-continue (EINTR) restarts the whole interval, as watch does.
        while ((polled = poll(&ready, 1, static_cast<int>(interval.count()))) < 0 && errno == EINTR) {
        }
        signalfd_siginfo taken;
        if (polled > 0 && read(fd, &taken, sizeof taken) == sizeof taken)
            elapsed = false;
        close(fd);
    } else {  // no descriptor to spare: wait for the signal itself
        const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(interval);
        const timespec limit{static_cast<time_t>(seconds.count()),
                             static_cast<long>(std::chrono::nanoseconds(interval - seconds).count())};
        elapsed = sigtimedwait(&stops, nullptr, &limit) < 0;
    }
    sigprocmask(SIG_SETMASK, &previous, nullptr);
    return elapsed;
}

int Watch(std::chrono::milliseconds interval, unsigned count, const std::function<int()> &draw,
          const std::function<bool(std::chrono::milliseconds)> &wait)
{
    for (unsigned drawn = 1;; ++drawn) {
        const int status = draw();
        if (count != 0 && drawn >= count)
            return status;
        if (!wait(interval))
            return 0;
    }
}

}  // namespace korvstat
