// korvsnmp-agentx: an AgentX subagent that serves KORVSNMP-MIB from the
// library's statistics, sampled on a thread of its own.
#include <net-snmp/net-snmp-config.h>
#include <net-snmp/net-snmp-includes.h>
#include <net-snmp/agent/net-snmp-agent-includes.h>

#include <fcntl.h>
#include <signal.h>
#include <syslog.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>

#include "agent_uptime.h"
#include "agentx_handler.h"
#include "agentx_options.h"
#include "sampler.h"

namespace {

constexpr char kAppName[] = "korvsnmp-agentx";

volatile sig_atomic_t stopRequested = 0;
int signalPipe[2] = {-1, -1};
korvagentx::Sampler *theSampler = nullptr;

void OnStop(int)
{
    stopRequested = 1;
    if (signalPipe[1] >= 0) {
        ssize_t ignored = write(signalPipe[1], "q", 1);
        (void)ignored;
    }
}

void OnHangUp(int)
{
    if (theSampler != nullptr)
        theSampler->SampleNow();
}

// Wakes the agent's select() so that a stop is seen at once.
void DrainSignalPipe(int fd, void *)
{
    char buffer[16];
    while (read(fd, buffer, sizeof buffer) > 0) {
    }
}

void Configure(const korvagentx::Options &options)
{
    netsnmp_ds_set_boolean(NETSNMP_DS_APPLICATION_ID, NETSNMP_DS_AGENT_ROLE, 1);
    netsnmp_ds_set_string(NETSNMP_DS_APPLICATION_ID, NETSNMP_DS_AGENT_X_SOCKET,
                          options.agentxSocket.c_str());
    netsnmp_ds_set_int(NETSNMP_DS_APPLICATION_ID, NETSNMP_DS_AGENT_AGENTX_PING_INTERVAL,
                       static_cast<int>(options.pingSeconds));
    // No configuration files, no MIB files, and state only in our own place.
    netsnmp_ds_set_boolean(NETSNMP_DS_LIBRARY_ID, NETSNMP_DS_LIB_DONT_READ_CONFIGS, 1);
    netsnmp_ds_set_string(NETSNMP_DS_LIBRARY_ID, NETSNMP_DS_LIB_PERSISTENT_DIR,
                          options.stateDir.c_str());
    netsnmp_ds_set_boolean(NETSNMP_DS_LIBRARY_ID, NETSNMP_DS_LIB_DONT_PERSIST_STATE, 1);
    netsnmp_ds_set_boolean(NETSNMP_DS_LIBRARY_ID, NETSNMP_DS_LIB_DISABLE_PERSISTENT_LOAD, 1);
    netsnmp_ds_set_boolean(NETSNMP_DS_LIBRARY_ID, NETSNMP_DS_LIB_DISABLE_PERSISTENT_SAVE, 1);
    setenv("MIBS", "", 1);
    setenv("SNMP_PERSISTENT_DIR", options.stateDir.c_str(), 1);
}

}  // namespace

int main(int argc, char **argv)
{
    korvagentx::Options options;
    std::string error;
    if (!korvagentx::ParseOptions(std::vector<std::string>(argv + 1, argv + argc), options, error)) {
        std::fprintf(stderr, "%s: %s\n\n%s", kAppName, error.c_str(), korvagentx::kUsage);
        return 2;
    }
    if (options.help) {
        std::fputs(korvagentx::kUsage, stdout);
        return 0;
    }
    if (options.version) {
        std::printf("%s %s\n", kAppName, KORVSNMP_VERSION);
        return 0;
    }

    openlog(kAppName, LOG_PID | LOG_PERROR, LOG_DAEMON);
    snmp_disable_log();
    snmp_enable_stderrlog();
    Configure(options);

    // The sampling thread must not take the signals: block them until it runs.
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGHUP);
    pthread_sigmask(SIG_BLOCK, &signals, nullptr);

    korvagentx::PublishAgentUpTime();
    korvagentx::Sampler sampler(options.intervalSeconds, options.stateDir, korvagentx::AgentUpTime);
    theSampler = &sampler;
    if (pipe2(signalPipe, O_CLOEXEC | O_NONBLOCK) != 0) {
        std::fprintf(stderr, "%s: cannot create a pipe\n", kAppName);
        return 1;
    }

    init_agent(kAppName);
    const bool registered = korvagentx::RegisterSubtree(sampler);
    init_snmp(kAppName);
    // Starting the library resets the ping interval; the reconnect timer reads it later.
    netsnmp_ds_set_int(NETSNMP_DS_APPLICATION_ID, NETSNMP_DS_AGENT_AGENTX_PING_INTERVAL,
                       static_cast<int>(options.pingSeconds));
    register_readfd(signalPipe[0], DrainSignalPipe, nullptr);
    korvagentx::PublishAgentUpTime();
    sampler.Start();

    struct sigaction stop {};
    stop.sa_handler = OnStop;
    sigaction(SIGTERM, &stop, nullptr);
    sigaction(SIGINT, &stop, nullptr);
    struct sigaction hangUp {};
    hangUp.sa_handler = OnHangUp;
    hangUp.sa_flags = SA_RESTART;
    sigaction(SIGHUP, &hangUp, nullptr);
    pthread_sigmask(SIG_UNBLOCK, &signals, nullptr);

    while (registered && !stopRequested) {
        agent_check_and_process(1);
        korvagentx::PublishAgentUpTime();
    }

    pthread_sigmask(SIG_BLOCK, &signals, nullptr);
    sampler.Stop();
    unregister_readfd(signalPipe[0]);
    korvagentx::UnregisterSubtree();
    snmp_shutdown(kAppName);
    shutdown_agent();
    theSampler = nullptr;
    close(signalPipe[0]);
    close(signalPipe[1]);
    closelog();
    return registered ? 0 : 1;
}
