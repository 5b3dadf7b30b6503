// korvsnmp-snmpd.so: KORVSNMP-MIB inside snmpd itself, loaded with
//     dlmod korvsnmp /usr/lib/<multiarch>/korvsnmp/korvsnmp-snmpd.so
//     korvsnmpInterval 5
//     korvsnmpStateDir /var/lib/snmp/korvsnmp
// The same handler and sampler as korvsnmp-agentx; the row indexes are kept
// in the state directory (by default korvsnmp in snmpd's persistent
// directory, which snmpd's user may write), and the discontinuity times are
// snmpd's sysUpTime. The sampling thread starts from snmpd's main loop
// (after snmpd has forked into the background), never samples on snmpd's
// thread, and ends in deinit.
//
// snmpd unloads and loads every module again on SIGHUP. The module stays
// mapped (it is linked with -z nodelete), so its sampler, and with it the
// last snapshot, the failure count and the row indexes, carries over a
// reload: answers go on from the previous snapshot, with its age, until the
// first sample of the reloaded module.
#include <net-snmp/net-snmp-config.h>
#include <net-snmp/net-snmp-includes.h>
#include <net-snmp/agent/net-snmp-agent-includes.h>

#include <syslog.h>

#include <string>

#include "agent_uptime.h"
#include "agentx_handler.h"
#include "agentx_options.h"
#include "sampler.h"

namespace {

constexpr char kUnit[] = "snmpd_module";

// How many dlmod lines have loaded the module and not unloaded it yet: the
// first load serves, the last unload ends.
unsigned loads = 0;
korvagentx::Options options;  // stateDir empty unless a token names one
unsigned startAlarm = 0;

korvagentx::Sampler &TheSampler()
{
    // Stopped at exit at the latest; its state directory is set before each Start.
    static korvagentx::Sampler sampler(options.intervalSeconds, std::string(), korvagentx::AgentUpTime);
    return sampler;
}

void ParseIntervalToken(const char *token, char *line)
{
    std::string error;
    if (!korvagentx::ParseSeconds(token, line == nullptr ? "" : line, options.intervalSeconds, error))
        config_perror(error.c_str());
}

void ParseStateDirToken(const char *token, char *line)
{
    std::string error;
    if (!korvagentx::ParsePath(token, line == nullptr ? "" : line, options.stateDir, error))
        config_perror(error.c_str());
}

// Runs from snmpd's main loop, once the configuration has been read.
void StartSampling(unsigned, void *)
{
    startAlarm = 0;
    korvagentx::PublishAgentUpTime();  // snmpd's start stays where it is while snmpd runs
    TheSampler().SetInterval(options.intervalSeconds);
    TheSampler().SetStateDirectory(options.stateDir.empty() ? std::string(get_persistent_directory()) + "/" +
                                                                  korvagentx::kModuleStateDir
                                                            : options.stateDir);
    TheSampler().Start();
}

}  // namespace

extern "C" __attribute__((visibility("default"))) void init_korvsnmp(void)
{
    if (loads++ > 0) {
        syslog(LOG_WARNING, "%s:%d korvsnmp is loaded already; this load adds nothing", kUnit,
               __LINE__);
        return;
    }
    options = korvagentx::Options{};
    options.stateDir.clear();
    register_app_config_handler(korvagentx::kIntervalToken, ParseIntervalToken, nullptr,
                                korvagentx::kIntervalTokenHelp);
    register_app_config_handler(korvagentx::kStateDirToken, ParseStateDirToken, nullptr,
                                korvagentx::kStateDirTokenHelp);
    if (!korvagentx::RegisterSubtree(TheSampler()))
        return;  // logged; snmpd goes on without the subtree
    startAlarm = snmp_alarm_register(0, 0, StartSampling, nullptr);
}

extern "C" __attribute__((visibility("default"))) void deinit_korvsnmp(void)
{
    if (loads == 0 || --loads > 0)
        return;
    if (startAlarm != 0)
        snmp_alarm_unregister(startAlarm);
    startAlarm = 0;
    korvagentx::UnregisterSubtree();
    unregister_app_config_handler(korvagentx::kIntervalToken);
    unregister_app_config_handler(korvagentx::kStateDirToken);
    TheSampler().Stop();
}
