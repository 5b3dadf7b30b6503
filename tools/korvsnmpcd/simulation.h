// A simulated appliance (korvsnmpcd --simulate FILE): the reply in FILE is
// the appliance's average load; every sample is drawn afresh from it, each
// device with a load of its own that drifts over time, and cumulative
// counters that grow by exactly what the rates say.
#ifndef KORVSNMPCD_SIMULATION_H
#define KORVSNMPCD_SIMULATION_H

#include <functional>
#include <map>
#include <string>

#include <json/value.h>

#include "statistics_source.h"

namespace korvsnmpcd {

class Simulation : public StatisticsSource {
public:
    // Seconds since the epoch, with fractions; the sample times and the
    // intervals that the rates cover come from it.
    using Clock = std::function<double()>;

    // `path`: the reply file that gives the devices and their average rates.
    // `clock`: the real time unless a test gives its own.
    explicit Simulation(std::string path, Clock clock = {});

    // Reads the file and draws the first sample; false (logged) when the
    // file cannot be read or holds no reply object with a "data" object.
    bool Load();

    // Draws the next sample, for the time since the previous one.
    void Tick() override;
    const std::string &Reply() override { return reply_; }

private:
    void Sample(double interval);

    std::string path_;
    Clock clock_;
    Json::Value model_;                      // the file's reply: the average load
    Json::Value current_;                    // the sample being served
    std::map<std::string, double> totals_;   // the cumulative counters, by section, device and member
    double sampledAt_ = 0;
    unsigned long long samples_ = 0;
    std::string reply_;
};

}  // namespace korvsnmpcd

#endif
