#include "options.h"

#include <algorithm>
#include <sstream>

#include "protocol/collector_protocol.h"

namespace korvstat {

const std::string kUsage =
    std::string("Usage: korvsnmp-stat [--resource LIST] [--format json|table] [--compact]\n"
    "       korvsnmp-stat --reload\n"
    "       korvsnmp-stat --history-mode REASON\n"
    "\n") +
    "Asks the collector daemon korvsnmpcd (on " + korvproto::kCollectorSocketPath + ") for the\n"
    "appliance's current statistics, names them from the host's configuration\n"
    "with libkorvsnmp, and prints them.\n"
    "\n"
    "  --resource LIST       comma-separated sections to ask for: all (default),\n"
    "                        cpu, memory, network, disk, space, lun, nfs\n"
    "  --format json|table   JSON (default, indented) or aligned tables per section\n"
    "  --compact             JSON on one line\n"
    "  --reload              make the collector reload, instead of asking statistics\n"
    "  --history-mode REASON put the collector into history mode, with REASON\n"
    "  -h, --help            this text\n"
    "\n"
    "The library's log messages appear on standard error too. The exit status is\n"
    "0 on success, 1 when the exchange or the assembly failed or the collector\n"
    "refused, 2 on a bad command line.\n";

const std::vector<std::string> &KnownResources()
{
    static const std::vector<std::string> names = {"all",   "cpu", "memory", "network",
                                                   "disk", "space", "lun",   "nfs"};
    return names;
}

namespace {

bool ParseResources(const std::string &list, std::vector<std::string> &resources, std::string &error)
{
    resources.clear();
    std::istringstream stream(list);
    std::string name;
    while (std::getline(stream, name, ',')) {
        const auto &known = KnownResources();
        if (std::find(known.begin(), known.end(), name) == known.end()) {
            error = "unknown resource \"" + name + "\"";
            return false;
        }
        resources.push_back(name);
    }
    if (resources.empty()) {
        error = "--resource needs at least one name";
        return false;
    }
    return true;
}

}  // namespace

bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error)
{
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string &argument = arguments[i];
        const bool takesValue =
            argument == "--resource" || argument == "--format" || argument == "--history-mode";
        if (takesValue && i + 1 >= arguments.size()) {
            error = argument + " needs a value";
            return false;
        }
        if (argument == "-h" || argument == "--help") {
            options.action = Action::Help;
        } else if (argument == "--compact") {
            options.format = Format::CompactJson;
        } else if (argument == "--reload") {
            options.action = Action::Reload;
        } else if (argument == "--history-mode") {
            options.action = Action::HistoryMode;
            options.reason = arguments[++i];
        } else if (argument == "--resource") {
            if (!ParseResources(arguments[++i], options.resources, error))
                return false;
        } else if (argument == "--format") {
            const std::string &format = arguments[++i];
            if (format == "json") {
                if (options.format == Format::Table)
                    options.format = Format::PrettyJson;
            } else if (format == "table") {
                options.format = Format::Table;
            } else {
                error = "unknown format \"" + format + "\"";
                return false;
            }
        } else {
            error = "unknown argument \"" + argument + "\"";
            return false;
        }
    }
    return true;
}

}  // namespace korvstat
