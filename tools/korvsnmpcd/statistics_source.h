// Where the collector's statistics reply comes from: the host's kernel
// (Sampler) or a recorded reply (ReplayFile).
#ifndef KORVSNMPCD_STATISTICS_SOURCE_H
#define KORVSNMPCD_STATISTICS_SOURCE_H

#include <string>

namespace korvsnmpcd {

class StatisticsSource {
public:
    virtual ~StatisticsSource() = default;
    // Called once every sampling interval.
    virtual void Tick() = 0;
    // The whole reply body to a statistics request, as of now. The reference
    // stays valid until the next call of Tick() or Reply().
    virtual const std::string &Reply() = 0;
};

}  // namespace korvsnmpcd

#endif
