// korvsnmp-agentx's command line and the module's tokens.
#include "agentx_options.h"

#include <cerrno>
#include <cstdlib>

namespace korvagentx {

namespace {

constexpr uint32_t kMaxSeconds = 86400;

}  // namespace

bool ParseSeconds(const std::string &name, const std::string &text, uint32_t &seconds,
                  std::string &error)
{
    errno = 0;
    const unsigned long long value =
        text.empty() || text.find_first_not_of("0123456789") != std::string::npos
            ? 0
            : std::strtoull(text.c_str(), nullptr, 10);
    if (errno != 0 || value < 1 || value > kMaxSeconds) {
        error = name + " wants whole seconds from 1 to 86400, not \"" + text + "\"";
        return false;
    }
    seconds = static_cast<uint32_t>(value);
    return true;
}

bool ParsePath(const std::string &name, const std::string &text, std::string &path,
                    std::string &error)
{
    if (text.empty()) {
        error = name + " needs a non-empty value";
        return false;
    }
    path = text;
    return true;
}

const char kUsage[] =
    "Usage: korvsnmp-agentx [--agentx-socket PATH] [--interval SECONDS]\n"
    "                       [--ping-interval SECONDS] [--state-dir DIR]\n"
    "       korvsnmp-agentx --help | --version\n"
    "\n"
    "An AgentX subagent that serves KORVSNMP-MIB from libkorvsnmp's statistics.\n"
    "  --agentx-socket PATH     the master agent's AgentX socket (/var/agentx/master)\n"
    "  --interval SECONDS       time between samples, 1-86400 (5)\n"
    "  --ping-interval SECONDS  how often the master is pinged, to find a restarted\n"
    "                           one again, 1-86400 (5)\n"
    "  --state-dir DIR          where the row indexes and net-snmp's state are kept\n"
    "                           (/var/lib/korvsnmp-agentx); --persistent-dir is\n"
    "                           an older name of it\n"
    "SIGHUP takes a sample at once; SIGTERM or SIGINT stops it.\n";

bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error)
{
    for (size_t i = 0; i < arguments.size(); ++i) {
        const std::string &argument = arguments[i];
        if (argument == "-h" || argument == "--help") {
            options.help = true;
            continue;
        }
        if (argument == "-V" || argument == "--version") {
            options.version = true;
            continue;
        }
        const bool takesValue = argument == "--agentx-socket" || argument == "--interval" ||
                                argument == "--ping-interval" || argument == "--state-dir" ||
                                argument == "--persistent-dir";
        if (!takesValue) {
            error = "unknown argument \"" + argument + "\"";
            return false;
        }
        if (i + 1 == arguments.size()) {
            error = argument + " needs a value";
            return false;
        }
        const std::string &value = arguments[++i];
        if (argument == "--agentx-socket" || argument == "--state-dir" || argument == "--persistent-dir") {
            if (!ParsePath(argument, value,
                           argument == "--agentx-socket" ? options.agentxSocket : options.stateDir, error))
                return false;
        } else if (!ParseSeconds(argument, value,
                                 argument == "--interval" ? options.intervalSeconds
                                                          : options.pingSeconds,
                                 error)) {
            return false;
        }
    }
    return true;
}

}  // namespace korvagentx
