#include "watch.h"

#include <signal.h>
#include <time.h>

#include <cerrno>

namespace korvstat {

bool WaitUnlessInterrupted(std::chrono::milliseconds interval)
{
    sigset_t stops, previous;
    sigemptyset(&stops);
    sigaddset(&stops, SIGINT);
    sigaddset(&stops, SIGTERM);
    sigprocmask(SIG_BLOCK, &stops, &previous);
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(interval);
    timespec left{static_cast<time_t>(seconds.count()),
                  static_cast<long>(std::chrono::nanoseconds(interval - seconds).count())};
    int taken;
    do {
        // sigtimedwait does not give back the time left after EINTR (a
        // stop-continue); restarting the whole interval is what watch does too.
        taken = sigtimedwait(&stops, nullptr, &left);
    } while (taken < 0 && errno == EINTR);
    sigprocmask(SIG_SETMASK, &previous, nullptr);
    return taken < 0;
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
