// Measures a running collector under a crowd of idle, slow and garbage
// clients: the latency of well-formed requests, and the collector's open
// descriptors and resident memory before, during and after the crowd.
//
//   korvsnmpcd_crowd SOCKET PID [IDLE SLOW GARBAGE PROBES PROBE_LIMIT_S]
//
// Defaults: 2000 idle, 300 slow, 600 garbage clients, 200 probes, 60 s per probe.
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "client_crowd.h"

namespace {

using namespace std::chrono;

constexpr auto kSettle = seconds(2);           // the crowd connects and starts sending
constexpr auto kProbeGap = milliseconds(20);   // between two probes
constexpr auto kDrainWait = seconds(30);       // for the descriptors to return after the crowd

size_t ResidentKiB(pid_t pid)
{
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    std::string line;
    while (std::getline(status, line)) {
        if (line.compare(0, 6, "VmRSS:") == 0)
            return std::stoul(line.substr(6));
    }
    return 0;
}

void Report(const char *when, pid_t pid)
{
    std::printf("%-16s descriptors %zu, resident %zu KiB\n", when,
                korvtest::OpenDescriptorCount(pid), ResidentKiB(pid));
}

}  // namespace

int main(int argc, char **argv)
{
    if (argc != 3 && argc != 8) {
        std::fprintf(stderr, "Usage: %s SOCKET PID [IDLE SLOW GARBAGE PROBES PROBE_LIMIT_S]\n",
                     argv[0]);
        return 2;
    }
    const std::string path = argv[1];
    const pid_t pid = static_cast<pid_t>(std::atol(argv[2]));
    korvtest::CrowdSize size{2000, 300, 600};
    size_t probes = 200;
    auto limit = milliseconds(60000);
    if (argc == 8) {
        size = {std::strtoul(argv[3], nullptr, 10), std::strtoul(argv[4], nullptr, 10),
                std::strtoul(argv[5], nullptr, 10)};
        probes = std::strtoul(argv[6], nullptr, 10);
        limit = milliseconds(std::atol(argv[7]) * 1000);
    }

    const size_t baseline = korvtest::OpenDescriptorCount(pid);
    Report("before:", pid);
    std::vector<microseconds> latencies;
    size_t failures = 0;
    {
        korvtest::ClientCrowd crowd(path, size);
        std::this_thread::sleep_for(kSettle);
        std::printf("crowd: %zu idle, %zu slow, %zu garbage; %zu connected\n", size.idle,
                    size.slow, size.garbage, crowd.Connected());
        Report("with the crowd:", pid);
        for (size_t i = 0; i < probes; ++i) {
            microseconds took = korvtest::TimedProbe(path, limit);
            if (took.count() < 0)
                ++failures;
            else
                latencies.push_back(took);
            std::this_thread::sleep_for(kProbeGap);
        }
        Report("after probes:", pid);
        std::printf("crowd: %zu connected, %zu closed by the collector\n", crowd.Connected(),
                    crowd.ClosedByPeer());
    }
    auto drained = steady_clock::now();
    while (korvtest::OpenDescriptorCount(pid) > baseline && steady_clock::now() - drained < kDrainWait)
        std::this_thread::sleep_for(milliseconds(50));
    std::printf("descriptors back to %zu after %.1f s\n", korvtest::OpenDescriptorCount(pid),
                duration<double>(steady_clock::now() - drained).count());
    Report("crowd gone:", pid);
    auto ms = [](microseconds us) { return static_cast<double>(us.count()) / 1000.0; };
    std::printf("probes: %zu answered, %zu failed; p50 %.2f ms, p99 %.2f ms, max %.2f ms\n",
                latencies.size(), failures, ms(korvtest::Percentile(latencies, 50)),
                ms(korvtest::Percentile(latencies, 99)), ms(korvtest::Percentile(latencies, 100)));
    return failures == 0 ? 0 : 1;
}
