// The options of both front ends: korvsnmp-agentx's command line, and the
// snmpd.conf tokens of snmpd's module.
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
    // The state directory: the row indexes (kIndexFileName) and, for the
    // subagent, net-snmp's files.
    std::string stateDir = "/var/lib/korvsnmp-agentx";
    bool help = false;
    bool version = false;  // -V, --version
};

// Parses the arguments after the program name. On false, `error` says what
// is wrong.
bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error);

extern const char kUsage[];

// The module's snmpd.conf tokens for --interval and --state-dir, and their
// help texts. The module's state directory is, unless its token names one,
// kModuleStateDir inside snmpd's persistent directory.
inline constexpr char kIntervalToken[] = "korvsnmpInterval";
inline constexpr char kIntervalTokenHelp[] = "SECONDS (1-86400, default 5)";
inline constexpr char kStateDirToken[] = "korvsnmpStateDir";
inline constexpr char kStateDirTokenHelp[] = "DIR (default: korvsnmp in snmpd's persistent directory)";
inline constexpr char kModuleStateDir[] = "korvsnmp";

// Parses the value of `name` (an option or token), whole seconds from 1 to
// 86400, into `seconds`. On false, `error` says what is wrong and `seconds`
// is unchanged.
bool ParseSeconds(const std::string &name, const std::string &text, uint32_t &seconds,
                  std::string &error);

// Takes the value of `name` (an option or token) as a path into `path`; an
// empty value is refused (false, `error` says so, `path` unchanged).
bool ParsePath(const std::string &name, const std::string &text, std::string &path,
                    std::string &error);

}  // namespace korvagentx

#endif
