// korvsnmp-agentx's command line.
#ifndef KORVAGENTX_AGENTX_OPTIONS_H
#define KORVAGENTX_AGENTX_OPTIONS_H

#include <cstdint>
#include <string>
#include <vector>

namespace korvagentx {

struct Options {
    std::string agentxSocket = "/var/agentx/master";
    uint32_t intervalSeconds = 5;
    uint32_t pingSeconds = 5;  // AgentX ping: how soon a restarted master is found again
    // The state directory: the row indexes (kIndexFileName) and net-snmp's files.
    std::string stateDir = "/var/lib/korvsnmp-agentx";
    bool help = false;
    bool version = false;  // -V, --version
};

// Parses the arguments after the program name. On false, `error` says what
// is wrong.
bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error);

extern const char kUsage[];

}  // namespace korvagentx

#endif
