// The agent's sysUpTime, published for the sampling thread.
#include "agent_uptime.h"

#include <net-snmp/net-snmp-config.h>
#include <net-snmp/net-snmp-includes.h>
#include <net-snmp/agent/net-snmp-agent-includes.h>

#include <algorithm>
#include <atomic>
#include <chrono>

namespace korvagentx {

namespace {

constexpr int64_t kMsPerTick = 10;  // sysUpTime counts hundredths of a second

std::atomic<int64_t> agentStartMs{0};

int64_t SteadyNowMs()
{
    return std::chrono::duration_cast<std::chrono::milliseconds>(
               std::chrono::steady_clock::now().time_since_epoch())
        .count();
}

}  // namespace

void PublishAgentUpTime()
{
    agentStartMs = SteadyNowMs() - static_cast<int64_t>(netsnmp_get_agent_uptime()) * kMsPerTick;
}

uint32_t AgentUpTime()
{
    return static_cast<uint32_t>(std::max<int64_t>(SteadyNowMs() - agentStartMs.load(), 0) / kMsPerTick);
}

}  // namespace korvagentx
