// The agent's sysUpTime for the sampling thread. net-snmp keeps the agent's
// uptime on the agent's own thread (a subagent's in step with its master);
// that thread publishes the start it implies, as a time of the steady clock,
// and any thread reads the uptime from it.
#ifndef KORVAGENTX_AGENT_UPTIME_H
#define KORVAGENTX_AGENT_UPTIME_H

#include <cstdint>

namespace korvagentx {

// Publishes net-snmp's agent uptime. Call it on the agent's thread only,
// after net-snmp may have changed it (after each agent_check_and_process).
void PublishAgentUpTime();

// The agent's sysUpTime now, in hundredths of a second, as last published
// (0 before the first publication counts from the steady clock's start).
// Any thread; never negative.
uint32_t AgentUpTime();

}  // namespace korvagentx

#endif
