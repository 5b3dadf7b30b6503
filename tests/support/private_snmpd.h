// Debian's snmpd as an AgentX master of a test's own, for korvsnmp-agentx:
// on a free UDP port of 127.0.0.1, with its configuration, AgentX socket
// and state in a directory of the test, the KORVSNMP-MIB subtree readable
// with the community "public".
#ifndef KORVTEST_PRIVATE_SNMPD_H
#define KORVTEST_PRIVATE_SNMPD_H

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "collector_process.h"

namespace korvtest {

// A port on 127.0.0.1 that was free a moment ago.
uint16_t FreeUdpPort();
uint16_t FreeTcpPort();

// Whether `done` holds within 20 s (generous for the sanitizer build), polled every 50 ms.
bool PollUntil(const std::function<bool()> &done);

class PrivateSnmpd {
public:
    // Writes the configuration into `directory`, which must exist.
    explicit PrivateSnmpd(std::string directory);

    // Starts snmpd, or starts it again (the running one killed); true once
    // its AgentX socket is there.
    bool Start();

    // env(1)'s arguments that run `subagent` (korvsnmp-agentx) under this
    // snmpd, with the tests' connect redirection, the host description
    // `hostFile`, its state beside snmpd's, and `options` after its own.
    std::vector<std::string> SubagentCommand(const std::string &subagent, const std::string &hostFile,
                                             const std::vector<std::string> &options) const;

    // Runs net-snmp's `tool` (snmpget, snmpwalk, ...) against this snmpd with
    // KORVSNMP-MIB loaded from `mibDirs`; its output. Values print without
    // their type (-OQ) except in walks, where a wrong type shows.
    std::string Client(const std::string &mibDirs, const std::string &tool, const std::string &arguments) const;

    uint16_t Port() const { return port_; }
    std::string Log() const { return process_ ? process_->Log() : ""; }

private:
    std::string Path(const char *name) const { return directory_ + "/" + name; }

    std::string directory_;
    uint16_t port_;
    std::optional<CollectorProcess> process_;
};

}  // namespace korvtest

#endif
