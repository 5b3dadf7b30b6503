// korvsnmp-stat: what libkorvsnmp reports for this appliance, for operators
// and scripts.
#include <syslog.h>
#include <unistd.h>

#include <chrono>
#include <iostream>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include "atomic_file.h"
#include "exposition/exposition.h"
#include "korvsnmp/korvsnmp.h"
#include "options.h"
#include "protocol/collector_protocol.h"
#include "table_format.h"
#include "top_layout.h"
#include "top_view.h"
#include "watch.h"

namespace {

constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;
constexpr char kHostName[] = "localhost";
constexpr char kClearScreen[] = "\033[H\033[2J";
constexpr double kTopSeconds = 2;  // as top's delay

int Fail(const std::string &what)
{
    std::cerr << "korvsnmp-stat: " << what << '\n';
    return kExitFailure;
}

// Why a control request failed, as far as this side can tell: the collector
// takes them only from root (or its own user).
std::string ControlFailure(const char *what)
{
    std::string text = what;
    if (geteuid() != 0)
        text += "; control requests need root, and this runs as uid " + std::to_string(geteuid());
    return text;
}

Json::Value BuildRequest(const std::vector<std::string> &resources)
{
    Json::Value request(Json::objectValue);
    Json::Value &list = request["resource"] = Json::Value(Json::arrayValue);
    for (const std::string &name : resources)
        list.append(name);
    return request;
}

void Print(const Json::Value &result, const korvstat::Options &options, std::ostream &out)
{
    switch (options.format) {
    case korvstat::Format::Table:
        korvstat::WriteTables(result, options.rawNumbers, out);
        break;
    case korvstat::Format::OpenMetrics:
        korvexposition::WriteOpenMetrics(
            korvexposition::BuildExposition(result, korvexposition::AskNetworkKinds(result)), out);
        break;
    case korvstat::Format::CompactJson:
        out << korvproto::CompactJson(result) << '\n';
        break;
    case korvstat::Format::PrettyJson:
        out << result.toStyledString();
        break;
    }
}

// One sample of `resources`: true with `result`, or false with `error`.
bool Sample(const std::vector<std::string> &resources, Json::Value &result, std::string &error)
{
    const Json::Value request = BuildRequest(resources);
    Transmitor transmitor(kHostName);
    if (transmitor.Transmit(request) != 0) {
        error = std::string("no statistics from the collector on ") + korvproto::kCollectorSocketPath;
        return false;
    }
    Json::Value reply;
    if (transmitor.GetDataJson(reply) != 0) {
        error = "the collector's reply is not JSON";
        return false;
    }
    result = Json::Value(Json::objectValue);
    if (!SNMPParseReplyData(request, std::move(reply), result)) {
        error = "the collector's reply could not be assembled into statistics";
        return false;
    }
    return true;
}

int Statistics(const korvstat::Options &options)
{
    Json::Value result;
    std::string error;
    if (!Sample(options.resources, result, error))
        return Fail(error);
    if (options.outputPath.empty()) {
        Print(result, options, std::cout);
        return 0;
    }
    std::ostringstream text;
    Print(result, options, text);
    return korvstat::ReplaceFile(options.outputPath, text.str(), error) ? 0 : Fail(error);
}

// The live view, sampling every --watch seconds.
int Top(const korvstat::Options &options)
{
    const double seconds = options.watchSeconds > 0 ? options.watchSeconds : kTopSeconds;
    return korvstat::RunTop(std::chrono::milliseconds(static_cast<long>(seconds * 1000)),
                            [](Json::Value &result, std::string &error) {
                                return Sample(korvstat::top::Resources(), result, error);
                            });
}

// Statistics every --watch seconds, each on a cleared terminal.
int WatchStatistics(const korvstat::Options &options)
{
    const bool terminal = isatty(STDOUT_FILENO) == 1 && options.outputPath.empty();
    const auto interval = std::chrono::milliseconds(static_cast<long>(options.watchSeconds * 1000));
    return korvstat::Watch(
        interval, options.watchCount,
        [&] {
            if (terminal)
                std::cout << kClearScreen;
            const int status = Statistics(options);
            std::cout << std::flush;
            return status;
        },
        korvstat::WaitUnlessInterrupted);
}

}  // namespace

int main(int argc, char **argv)
{
    korvstat::Options options;
    std::string error;
    if (!korvstat::ParseOptions(std::vector<std::string>(argv + 1, argv + argc), options, error)) {
        std::cerr << "korvsnmp-stat: " << error << "\n\n" << korvstat::kUsage;
        return kExitUsage;
    }
    // The library's messages go to standard error as well as to the system log.
    openlog("korvsnmp-stat", LOG_PERROR, LOG_USER);

    switch (options.action) {
    case korvstat::Action::Help:
        std::cout << korvstat::kUsage;
        return 0;
    case korvstat::Action::Version:
        std::cout << "korvsnmp-stat " KORVSNMP_VERSION "\n";
        return 0;
    case korvstat::Action::Reload:
        if (!Transmitor::Reload())
            return Fail(ControlFailure("the collector did not reload"));
        std::cout << "The collector reloaded.\n";
        return 0;
    case korvstat::Action::HistoryMode:
        if (!Transmitor::EnterHistoryMode(options.reason))
            return Fail(ControlFailure("the collector did not enter history mode"));
        std::cout << "The collector entered history mode: " << options.reason << "\n";
        return 0;
    case korvstat::Action::Statistics:
        break;
    }
    if (options.top)
        return Top(options);
    return options.watchSeconds > 0 ? WatchStatistics(options) : Statistics(options);
}
