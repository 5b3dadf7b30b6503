#include "private_snmpd.h"

#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <thread>

#include "shell_command.h"
#include "test_collector.h"

namespace korvtest {
namespace {

using Clock = std::chrono::steady_clock;
constexpr std::chrono::milliseconds kReadyBound{20000}, kPollStep{50};
constexpr char kSnmpd[] = "/usr/sbin/snmpd";
constexpr char kSubtree[] = ".1.3.6.1.3.7947";  // korvsnmpMIB, as snmpd.conf wants it

uint16_t FreePort(int type)
{
    const int fd = socket(AF_INET, type | SOCK_CLOEXEC, 0);
    sockaddr_in address{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    socklen_t length = sizeof address;
    bind(fd, reinterpret_cast<sockaddr *>(&address), sizeof address);
    getsockname(fd, reinterpret_cast<sockaddr *>(&address), &length);
    close(fd);
    return ntohs(address.sin_port);
}

}  // namespace

uint16_t FreeUdpPort() { return FreePort(SOCK_DGRAM); }
uint16_t FreeTcpPort() { return FreePort(SOCK_STREAM); }

bool PollUntil(const std::function<bool()> &done)
{
    for (auto end = Clock::now() + kReadyBound; !done(); std::this_thread::sleep_for(kPollStep))
        if (Clock::now() >= end)
            return false;
    return true;
}

PrivateSnmpd::PrivateSnmpd(std::string directory) : directory_(std::move(directory)), port_(FreeUdpPort())
{
    std::ofstream(Path("snmpd.conf")) << "agentaddress udp:127.0.0.1:" << port_ << "\nmaster agentx\nagentXSocket "
                                      << Path("agentx.sock") << "\nagentXTimeout 1\nview korvview included "
                                      << kSubtree << "\nrocommunity public 127.0.0.1 -V korvview\n";
}

bool PrivateSnmpd::Start()
{
    std::filesystem::remove(Path("agentx.sock"));  // a killed snmpd leaves it behind
    process_.reset();  // run through env(1), as the subagent is
    process_.emplace("/usr/bin/env", std::vector<std::string>{"SNMP_PERSISTENT_DIR=" + Path("state"), kSnmpd, "-f",
                     "-C", "-c", Path("snmpd.conf"), "-M", "", "-m", "", "-Lo"}, Path("snmpd.out"));
    return access(kSnmpd, X_OK) == 0 && PollUntil([&] { return std::filesystem::exists(Path("agentx.sock")); });
}

std::vector<std::string> PrivateSnmpd::SubagentCommand(const std::string &subagent, const std::string &hostFile,
                                                       const std::vector<std::string> &options) const
{
    std::vector<std::string> words = RedirectedChildVariables();
    words.insert(words.end(), {"SNMP_PERSISTENT_DIR=" + Path("state"), "KORVPLATFORM_HOST=" + hostFile, subagent,
                               "--agentx-socket", Path("agentx.sock"), "--persistent-dir", Path("state")});
    words.insert(words.end(), options.begin(), options.end());
    return words;
}

std::string PrivateSnmpd::Client(const std::string &mibDirs, const std::string &tool,
                                 const std::string &arguments) const
{
    return RunCommand("SNMP_PERSISTENT_DIR=" + Path("client ") + tool + " -v2c -c public -t 1 -r 0 -M " + mibDirs +
                      " -m KORVSNMP-MIB -Os -Oe -OU " + (tool.find("walk") == std::string::npos ? "-OQ " : "") +
                      "127.0.0.1:" + std::to_string(port_) + " " + arguments);
}

}  // namespace korvtest
