// korvsnmpcd: the reference statistics collector for hosts without the
// appliance's own. See korvsnmpcd(8) for the options, the replies and their units.
#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "protocol/unit_log.h"
#include "command_line.h"
#include "pid_file.h"
#include "reply_file.h"
#include "sampler.h"
#include "server.h"
#include "simulation.h"
#include "service_notify.h"
#include "protocol/unique_fd.h"

namespace {

constexpr char kLogUnit[] = "main";
constexpr char kProgram[] = "korvsnmpcd";
constexpr int kUsageError = 2;
constexpr int kFirstInherited = STDERR_FILENO + 1;

// Closes every descriptor but the standard streams, so that a daemon keeps
// none of its caller's pipes open (a caller reading one until its end would
// wait forever).
void CloseInheritedDescriptors()
{
    if (close_range(kFirstInherited, UINT_MAX, 0) == 0)
        return;
    std::vector<int> inherited;  // close_range() is missing: list them, then close
    if (DIR *entries = opendir("/proc/self/fd")) {
        while (dirent *entry = readdir(entries)) {
            int fd = std::atoi(entry->d_name);
            if (fd >= kFirstInherited && fd != dirfd(entries))
                inherited.push_back(fd);
        }
        closedir(entries);
    }
    for (int fd : inherited)
        close(fd);
}

// Leaves the caller's session. Only the child returns, with the write end
// of a pipe: the caller returns when the child writes to it (exit status 0,
// the daemon is ready) or closes it without writing (exit status 1).
korvproto::UniqueFd Detach()
{
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot detach: %m");
        return korvproto::UniqueFd();
    }
    korvproto::UniqueFd readyRead(ends[0]);
    korvproto::UniqueFd readyWrite(ends[1]);
    pid_t child = fork();
    if (child < 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot detach: %m");
        return korvproto::UniqueFd();
    }
    if (child > 0) {
        // Without running destructors, which would remove the socket file it shares with the child.
        readyWrite.Reset();
        char ready = 0;
        ssize_t got;
        do {
            got = read(readyRead.Get(), &ready, 1);
        } while (got < 0 && errno == EINTR);
        _exit(got == 1 ? EXIT_SUCCESS : EXIT_FAILURE);
    }
    setsid();
    if (chdir("/") != 0)
        KORVSNMP_LOG(LOG_WARNING, "Cannot change to /: %m");
    return readyWrite;
}

// `path` from the current directory, which a daemon leaves for /.
void MakeAbsolute(std::string &path)
{
    if (path.empty() || path[0] == '/')
        return;
    char here[PATH_MAX];
    if (getcwd(here, sizeof here) != nullptr)
        path = std::string(here) + "/" + path;
}

void SilenceStandardStreams()
{
    korvproto::UniqueFd null(open("/dev/null", O_RDWR | O_CLOEXEC));
    for (int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
        if (null.Valid())
            dup2(null.Get(), stream);
    }
}

}  // namespace

int main(int argc, char **argv)
{
    korvsnmpcd::Options options;
    std::string error;
    if (!korvsnmpcd::ParseOptions(argc, argv, options, error)) {
        std::fprintf(stderr, "%s: %s\nTry '%s --help'.\n", kProgram, error.c_str(), kProgram);
        return kUsageError;
    }
    if (options.help) {
        korvsnmpcd::PrintUsage(stdout);
        return EXIT_SUCCESS;
    }
    if (options.version) {
        std::printf("%s %s\n", kProgram, KORVSNMPCD_VERSION);
        return EXIT_SUCCESS;
    }
    if (options.probe)
        return korvsnmpcd::SomethingListensOn(options.server.socketPath) ? EXIT_SUCCESS
                                                                         : EXIT_FAILURE;
    if (options.detach) {
        CloseInheritedDescriptors();
        for (std::string *path : {&options.server.socketPath, &options.server.recordPath,
                                  &options.pidFile, &options.replayPath, &options.procRoot,
                                  &options.sysRoot, &options.simulatePath})
            MakeAbsolute(*path);
    }

    // Until it is ready, its caller sees on stderr why it did not start, also
    // with no syslog to read (no /dev/log); then stderr only when asked for.
    const bool keepStderr = options.foreground || isatty(STDERR_FILENO);
    openlog(kProgram, LOG_PID | LOG_PERROR, LOG_DAEMON);
    signal(SIGPIPE, SIG_IGN);

    // The daemon detaches first: the signal descriptor and the poller must
    // belong to the process that waits on them. The caller still returns
    // only when the daemon is ready, with status 1 when it is not.
    korvproto::UniqueFd ready;
    if (options.detach) {
        ready = Detach();
        if (!ready.Valid())
            return EXIT_FAILURE;
    }

    std::unique_ptr<korvsnmpcd::StatisticsSource> source;
    if (!options.replayPath.empty()) {
        auto replay = std::make_unique<korvsnmpcd::ReplayFile>(options.replayPath);
        if (!replay->Load())
            return EXIT_FAILURE;
        source = std::move(replay);
    } else if (!options.simulatePath.empty()) {
        auto simulation = std::make_unique<korvsnmpcd::Simulation>(options.simulatePath);
        if (!simulation->Load())
            return EXIT_FAILURE;
        source = std::move(simulation);
    }
    korvsnmpcd::Server server(options.server);
    if (!server.Listen())
        return EXIT_FAILURE;
    if (!source)
        source = std::make_unique<korvsnmpcd::Sampler>(
            korvsnmpcd::SourcePathsUnder(options.procRoot, options.sysRoot));

    korvsnmpcd::PidFile pidFile;
    if (!options.pidFile.empty() && !pidFile.Create(options.pidFile))
        return EXIT_FAILURE;
    if (options.detach) {
        SilenceStandardStreams();
        if (write(ready.Get(), "", 1) != 1)
            KORVSNMP_LOG(LOG_WARNING, "Cannot tell the caller that the daemon is ready: %m");
        ready.Reset();
    }
    korvsnmpcd::NotifyReady();
    if (!keepStderr) {
        closelog();
        openlog(kProgram, LOG_PID, LOG_DAEMON);
    }
    if (!options.simulatePath.empty())
        KORVSNMP_LOG(LOG_INFO, "Listening on [%s], simulating [%s] every %lld ms",
                     options.server.socketPath.c_str(), options.simulatePath.c_str(),
                     static_cast<long long>(options.server.interval.count()));
    else if (options.replayPath.empty())
        KORVSNMP_LOG(LOG_INFO, "Listening on [%s], sampling every %lld ms",
                       options.server.socketPath.c_str(),
                       static_cast<long long>(options.server.interval.count()));
    else
        KORVSNMP_LOG(LOG_INFO, "Listening on [%s], replaying [%s]",
                       options.server.socketPath.c_str(), options.replayPath.c_str());
    bool served = server.Run(*source);
    closelog();
    return served ? EXIT_SUCCESS : EXIT_FAILURE;
}
