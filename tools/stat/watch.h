// Redrawing on an interval, as watch(1) does, until interrupted.
#ifndef KORVSNMP_STAT_WATCH_H
#define KORVSNMP_STAT_WATCH_H

#include <chrono>
#include <functional>

namespace korvstat {

// Waits `interval`; false when SIGINT or SIGTERM came first (the signal is
// taken, so the program goes on to exit normally). The signals stay fatal
// outside this wait.
bool WaitUnlessInterrupted(std::chrono::milliseconds interval);

// Calls `draw` (which returns an exit status), then `wait(interval)`, and
// again, until `wait` returns false or `count` draws are done (0: no limit).
// Returns the status of the last draw, or 0 when interrupted.
int Watch(std::chrono::milliseconds interval, unsigned count, const std::function<int()> &draw,
          const std::function<bool(std::chrono::milliseconds)> &wait);

}  // namespace korvstat

#endif
