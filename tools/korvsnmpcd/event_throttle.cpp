#include "event_throttle.h"

namespace korvsnmpcd {

uint64_t EventThrottle::Record(Clock::time_point now)
{
    ++pending_;
    if (reported_ && now - lastReport_ < period_)
        return 0;
    reported_ = true;
    lastReport_ = now;
    uint64_t report = pending_;
    pending_ = 0;
    return report;
}

uint64_t EventThrottle::Due(Clock::time_point now)
{
    if (pending_ == 0 || now - lastReport_ < period_)
        return 0;
    lastReport_ = now;
    uint64_t report = pending_;
    pending_ = 0;
    return report;
}

}  // namespace korvsnmpcd
