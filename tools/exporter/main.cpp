// korvsnmp-exporter: the appliance's statistics for Prometheus, over HTTP.
#include <signal.h>
#include <syslog.h>

#include <exception>
#include <iostream>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include <prometheus/exposer.h>

#include "exporter_options.h"
#include "exposition/network_kinds.h"
#include "korvsnmp/korvsnmp.h"
#include "metrics_handler.h"
#include "snapshot_exporter.h"

namespace {

constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;
constexpr char kUnit[] = "korvsnmp-exporter";
constexpr char kHostName[] = "localhost";
constexpr size_t kServerThreads = 2;

// The library's whole road for one sample of everything.
bool TakeSample(Json::Value &result, korvexposition::NetworkKinds &kinds)
{
    Json::Value request(Json::objectValue);
    request["resource"].append("all");
    Transmitor transmitor(kHostName);
    Json::Value reply;
    if (transmitor.Transmit(request) != 0 || transmitor.GetDataJson(reply) != 0)
        return false;
    result = Json::Value(Json::objectValue);
    try {
        if (!SNMPParseReplyData(request, std::move(reply), result))
            return false;
    } catch (const std::bad_alloc &) {
        throw;
    } catch (const std::exception &error) {
        syslog(LOG_ERR, "%s:%d The library could not assemble the reply: %s", kUnit, __LINE__, error.what());
        return false;
    }
    kinds = korvexposition::AskNetworkKinds(result);
    return true;
}

int Serve(const korvexporter::Options &options)
{
    // The stop signals are taken by sigwait below, on no other thread.
    sigset_t stop;
    sigemptyset(&stop);
    sigaddset(&stop, SIGTERM);
    sigaddset(&stop, SIGINT);
    pthread_sigmask(SIG_BLOCK, &stop, nullptr);

    auto exporter = std::make_unique<korvexporter::SnapshotExporter>(
        std::chrono::seconds(options.intervalSeconds), TakeSample);
    exporter->SampleOnce();
    const CivetCallbacks callbacks = korvexporter::MetricsCallbacks(*exporter);
    std::unique_ptr<prometheus::Exposer> exposer;
    try {
        exposer = std::make_unique<prometheus::Exposer>(options.listen, kServerThreads, &callbacks);
    } catch (const std::exception &error) {
        syslog(LOG_ERR, "%s:%d Cannot listen on %s: %s", kUnit, __LINE__, options.listen.c_str(), error.what());
        std::cerr << "korvsnmp-exporter: cannot listen on " << options.listen << '\n';
        return kExitFailure;
    }
    exporter->Start();
    const std::vector<int> ports = exposer->GetListeningPorts();
    const std::string host = options.listen.substr(0, options.listen.rfind(':'));
    syslog(LOG_INFO, "%s:%d Serving http://%s:%d%s", kUnit, __LINE__, host.c_str(), ports.empty() ? 0 : ports[0],
           korvexporter::kMetricsPath);

    int signal = 0;
    sigwait(&stop, &signal);
    exporter->Stop();
    return 0;
}

}  // namespace

int main(int argc, char **argv)
{
    korvexporter::Options options;
    std::string error;
    if (!korvexporter::ParseOptions(std::vector<std::string>(argv + 1, argv + argc), options, error)) {
        std::cerr << "korvsnmp-exporter: " << error << "\n\n" << korvexporter::kUsage;
        return kExitUsage;
    }
    switch (options.action) {
    case korvexporter::Action::Help:
        std::cout << korvexporter::kUsage;
        return 0;
    case korvexporter::Action::Version:
        std::cout << "korvsnmp-exporter " KORVSNMP_VERSION "\n";
        return 0;
    case korvexporter::Action::Serve:
        break;
    }
    // Messages go to standard error too, where systemd's journal takes them.
    openlog(kUnit, LOG_PERROR, LOG_DAEMON);
    return Serve(options);
}
