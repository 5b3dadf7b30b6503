// Keeps a frequent event from flooding the log: the first occurrence is
// reported at once, later ones are counted and reported together once a
// period has passed since the last report.
#ifndef KORVSNMPCD_EVENT_THROTTLE_H
#define KORVSNMPCD_EVENT_THROTTLE_H

#include <chrono>
#include <cstdint>

namespace korvsnmpcd {

class EventThrottle {
public:
    using Clock = std::chrono::steady_clock;

    explicit EventThrottle(std::chrono::milliseconds period) : period_(period) {}

    // Records one event at `now`. The number of events to report now (the
    // unreported ones, this one included), or 0 to stay silent.
    uint64_t Record(Clock::time_point now);

    // The events not yet reported, once a period has passed since the last
    // report (they count as reported then); 0 otherwise.
    uint64_t Due(Clock::time_point now);

    std::chrono::milliseconds Period() const { return period_; }

private:
    std::chrono::milliseconds period_;
    bool reported_ = false;  // whether any report was made yet
    Clock::time_point lastReport_;
    uint64_t pending_ = 0;
};

}  // namespace korvsnmpcd

#endif
