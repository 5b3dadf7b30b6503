// KORVSNMP-MIB's subtree in net-snmp's agent (the subagent's or snmpd's own):
// one handler that answers GET and GETNEXT (GETBULK arrives as GETNEXTs)
// from the sampler's latest snapshot in O(log n), without copying it, and
// never calls the library.
#ifndef KORVAGENTX_AGENTX_HANDLER_H
#define KORVAGENTX_AGENTX_HANDLER_H

#include "sampler.h"

namespace korvagentx {

// Registers the subtree with the agent, answering from `sampler` (which must
// outlive the registration). Returns false (logged) when registration fails.
bool RegisterSubtree(const Sampler &sampler);

// Unregisters it again; harmless when not registered.
void UnregisterSubtree();

}  // namespace korvagentx

#endif
