// Scrapes korvsnmp-exporter serving the large appliance of examples/ (about
// 3000 series): korvsnmpcd replays its recorded reply on a private socket,
// the exporter reaches it through the tests' connect() redirection, and
// this program times SCRAPES scrapes of /metrics, one after the other, each
// on a new connection. It prints the series count, the median, p99 and
// largest scrape time, the exporter's CPU time a scrape (what a loaded
// machine does not inflate), its resident memory, and whether p99 meets the
// target of 5 ms. When Debian's prometheus-node-exporter is installed it
// scrapes that the same way, for comparison.
//
//   exporter_scrape [SCRAPES]   (default 2000)
#include <signal.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "collector_process.h"
#include "http_get.h"

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kWarmUp = 50;
constexpr int kDefaultScrapes = 2000;
constexpr double kTargetP99Ms = 5.0;
constexpr char kNodeExporter[] = "/usr/bin/prometheus-node-exporter";

size_t StatusKiB(pid_t pid, const std::string &field)
{
    std::ifstream status("/proc/" + std::to_string(pid) + "/status");
    for (std::string line; std::getline(status, line);)
        if (line.compare(0, field.size(), field) == 0)
            return std::stoul(line.substr(field.size()));
    return 0;
}

size_t SeriesIn(const std::string &body)
{
    size_t series = 0;
    size_t start = 0;
    for (size_t end; (end = body.find('\n', start)) != std::string::npos; start = end + 1)
        series += end > start && body[start] != '#';
    return series;
}

// The CPU time that process `pid` has used, user and system, in ms.
double CpuMs(pid_t pid)
{
    std::ifstream stat("/proc/" + std::to_string(pid) + "/stat");
    std::string text((std::istreambuf_iterator<char>(stat)), std::istreambuf_iterator<char>());
    const size_t afterName = text.rfind(')');
    unsigned long long user = 0;
    unsigned long long system = 0;
    if (afterName == std::string::npos ||
        std::sscanf(text.c_str() + afterName + 1, " %*c %*d %*d %*d %*d %*d %*u %*u %*u %*u %*u %llu %llu",
                    &user, &system) != 2)
        return 0;
    return static_cast<double>(user + system) * 1000.0 / static_cast<double>(sysconf(_SC_CLK_TCK));
}

struct Figures {
    double cpuMsPerScrape = 0;
    size_t series = 0;
    double medianMs = 0;
    double p99Ms = 0;
    double maxMs = 0;
    bool failed = false;
};

Figures Measure(int port, pid_t pid, int scrapes)
{
    Figures figures;
    for (int i = 0; i < kWarmUp; ++i)
        figures.series = SeriesIn(korvtest::HttpGet(port, "/metrics").body);
    const double cpuBefore = CpuMs(pid);
    std::vector<double> times;
    for (int i = 0; i < scrapes; ++i) {
        const Clock::time_point start = Clock::now();
        const korvtest::HttpReply reply = korvtest::HttpGet(port, "/metrics");
        times.push_back(std::chrono::duration<double, std::milli>(Clock::now() - start).count());
        figures.failed |= reply.status != 200;
    }
    figures.cpuMsPerScrape = (CpuMs(pid) - cpuBefore) / scrapes;
    std::sort(times.begin(), times.end());
    figures.medianMs = times[times.size() / 2];
    figures.p99Ms = times[std::min(times.size() - 1, times.size() * 99 / 100)];
    figures.maxMs = times.back();
    return figures;
}

void Print(const char *name, const Figures &figures, pid_t pid)
{
    std::printf("%s: %zu series, scrape median %.3f ms, p99 %.3f ms, max %.3f ms, CPU %.3f ms a scrape, "
                "resident %zu KiB (peak %zu KiB)%s\n",
                name, figures.series, figures.medianMs, figures.p99Ms, figures.maxMs, figures.cpuMsPerScrape,
                StatusKiB(pid, "VmRSS:"),
                StatusKiB(pid, "VmHWM:"), figures.failed ? ", SOME SCRAPES FAILED" : "");
}

// Where the exporter's log names its port; 0 until it does.
int ServedPort(const korvtest::CollectorProcess &exporter)
{
    int port = 0;
    const std::string log = exporter.Log();
    const size_t at = log.find("http://127.0.0.1:");
    if (at != std::string::npos)
        std::sscanf(log.c_str() + at, "http://127.0.0.1:%d", &port);
    return port;
}

}  // namespace

int main(int argc, char **argv)
{
    const int scrapes = argc > 1 ? std::atoi(argv[1]) : kDefaultScrapes;
    if (scrapes <= 0) {
        std::fprintf(stderr, "usage: exporter_scrape [SCRAPES]\n");
        return 2;
    }
    const std::string socket = "/tmp/korvsnmp-bench-" + std::to_string(getpid()) + ".sock";
    korvtest::CollectorProcess collector(KORVSNMPCD_PATH, {"--foreground", "--socket", socket, "--replay",
                                         KORVSNMP_EXAMPLES_DIR "/large-appliance.reply.json"}, socket + ".log");
    if (!korvtest::WaitUntilConnectable(socket)) {
        std::fprintf(stderr, "the collector did not start: %s\n", collector.Log().c_str());
        return 1;
    }
    korvtest::CollectorProcess exporter("/usr/bin/env", {"LD_PRELOAD=" KORVTEST_REDIRECT_LIBRARY,
        "KORVTEST_COLLECTOR_SOCKET=" + socket, "KORVPLATFORM_HOST=" KORVSNMP_EXAMPLES_DIR "/large-appliance.host.json",
        KORVSNMP_EXPORTER_PATH, "--listen", "127.0.0.1:0"}, socket + ".exporter");
    int port = 0;
    if (!korvtest::Eventually([&] { return (port = ServedPort(exporter)) != 0; })) {
        std::fprintf(stderr, "the exporter did not start: %s\n", exporter.Log().c_str());
        return 1;
    }
    const Figures figures = Measure(port, exporter.Pid(), scrapes);
    Print("korvsnmp-exporter", figures, exporter.Pid());
    std::printf("target p99 <= %.0f ms: %s\n", kTargetP99Ms, figures.p99Ms <= kTargetP99Ms ? "met" : "MISSED");

    if (access(kNodeExporter, X_OK) == 0) {
        const int nodePort = korvtest::FreeLoopbackPort();
        korvtest::CollectorProcess node(kNodeExporter, {"--web.listen-address=127.0.0.1:" + std::to_string(nodePort)},
                                        socket + ".node");
        if (korvtest::Eventually([&] { return korvtest::HttpGet(nodePort, "/metrics").status == 200; })) {
            const Figures nodeFigures = Measure(nodePort, node.Pid(), scrapes);
            Print("node_exporter", nodeFigures, node.Pid());
            std::printf("korvsnmp-exporter / node_exporter: median %.2f, p99 %.2f, CPU a scrape %.2f\n",
                        figures.medianMs / nodeFigures.medianMs, figures.p99Ms / nodeFigures.p99Ms,
                        figures.cpuMsPerScrape / nodeFigures.cpuMsPerScrape);
        }
        node.Stop(SIGTERM);
    }
    exporter.Stop(SIGTERM);
    collector.Stop(SIGTERM);
    return figures.failed ? 1 : 0;
}
