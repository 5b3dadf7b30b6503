// korvsnmpcd: the reference statistics collector for hosts without the
// appliance's own. See README.md for the options, the replies and their units.
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "protocol/unit_log.h"
#include "sampler.h"
#include "server.h"
#include "protocol/unique_fd.h"

namespace {

constexpr char kLogUnit[] = "main";
constexpr char kProgram[] = "korvsnmpcd";
constexpr double kMinSeconds = 0.01;
constexpr double kMaxSeconds = 3600;
constexpr double kMsPerSecond = 1000;
constexpr int kUsageError = 2;

void PrintUsage(FILE *to)
{
    std::fprintf(to,
                 "Usage: %s [--socket PATH] [--interval SECONDS] [--client-timeout SECONDS]"
                 " [--daemon]\n"
                 "  --socket PATH             listen on PATH (default %s)\n"
                 "  --interval SECONDS        sampling interval (default 1)\n"
                 "  --client-timeout SECONDS  time a client has for its exchange (default 2)\n"
                 "  --daemon                  detach once the socket is listening\n",
                 kProgram, korvsnmpcd::kDefaultSocketPath);
}

bool ParseSeconds(const char *text, std::chrono::milliseconds &value)
{
    char *end = nullptr;
    errno = 0;
    double seconds = std::strtod(text, &end);
    if (errno != 0 || end == text || *end != '\0' || !(seconds >= kMinSeconds) ||
        seconds > kMaxSeconds)
        return false;
    value = std::chrono::milliseconds(static_cast<long long>(seconds * kMsPerSecond + 0.5));
    return true;
}

struct Options {
    korvsnmpcd::ServerOptions server;
    bool detach = false;
};

bool ParseOptions(int argc, char **argv, Options &options)
{
    for (int i = 1; i < argc; ++i) {
        std::string option = argv[i];
        bool hasValue = i + 1 < argc;
        if (option == "--socket" && hasValue) {
            options.server.socketPath = argv[++i];
        } else if (option == "--interval" && hasValue) {
            if (!ParseSeconds(argv[++i], options.server.interval))
                return false;
        } else if (option == "--client-timeout" && hasValue) {
            if (!ParseSeconds(argv[++i], options.server.clientTimeout))
                return false;
        } else if (option == "--daemon") {
            options.detach = true;
        } else {
            return false;
        }
    }
    return true;
}

// Leaves the caller's session: the parent exits at once (without running
// destructors, which would remove the socket file it shares with the child).
bool Detach()
{
    pid_t child = fork();
    if (child < 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot detach: %m");
        return false;
    }
    if (child > 0)
        _exit(EXIT_SUCCESS);
    setsid();
    if (chdir("/") != 0)
        KORVSNMP_LOG(LOG_WARNING, "Cannot change to /: %m");
    korvproto::UniqueFd null(open("/dev/null", O_RDWR | O_CLOEXEC));
    for (int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
        if (null.Valid())
            dup2(null.Get(), stream);
    }
    return true;
}

}  // namespace

int main(int argc, char **argv)
{
    Options options;
    if (argc == 2 && (std::strcmp(argv[1], "--help") == 0 || std::strcmp(argv[1], "-h") == 0)) {
        PrintUsage(stdout);
        return EXIT_SUCCESS;
    }
    if (!ParseOptions(argc, argv, options)) {
        PrintUsage(stderr);
        return kUsageError;
    }

    openlog(kProgram, LOG_PID | LOG_PERROR, LOG_DAEMON);
    signal(SIGPIPE, SIG_IGN);

    korvsnmpcd::Server server(options.server);
    if (!server.Listen())
        return EXIT_FAILURE;
    korvsnmpcd::Sampler sampler;
    if (options.detach && !Detach())
        return EXIT_FAILURE;
    KORVSNMP_LOG(LOG_INFO, "Listening on [%s], sampling every %lld ms",
                   options.server.socketPath.c_str(),
                   static_cast<long long>(options.server.interval.count()));
    bool served = server.Run(sampler);
    closelog();
    return served ? EXIT_SUCCESS : EXIT_FAILURE;
}
