#include "command_line.h"

#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <optional>

namespace korvsnmpcd {
namespace {

constexpr double kMinSeconds = 0.01;
constexpr double kMaxSeconds = 3600;
constexpr double kMsPerSecond = 1000;
constexpr unsigned long kMaxConnectionCap = 1000000;

std::string Quoted(const std::string &text)
{
    return "[" + text + "]";
}

// A number of seconds from kMinSeconds to kMaxSeconds, or what is wrong with it.
std::optional<std::chrono::milliseconds> Seconds(const std::string &option,
                                                 const std::string &text, std::string &error)
{
    char *end = nullptr;
    errno = 0;
    double seconds = std::strtod(text.c_str(), &end);
    if (text.empty() || end != text.c_str() + text.size() || errno == ERANGE ||
        !std::isfinite(seconds)) {
        error = option + " " + Quoted(text) + " is not a number of seconds";
        return std::nullopt;
    }
    if (!(seconds >= kMinSeconds && seconds <= kMaxSeconds)) {
        error = option + " " + Quoted(text) + " is out of range: from 0.01 to 3600 seconds";
        return std::nullopt;
    }
    return std::chrono::milliseconds(static_cast<long long>(seconds * kMsPerSecond + 0.5));
}

std::optional<size_t> ConnectionCap(const std::string &option, const std::string &text,
                                    std::string &error)
{
    char *end = nullptr;
    errno = 0;
    unsigned long value = std::strtoul(text.c_str(), &end, 10);
    if (text.empty() || text[0] == '-' || text[0] == '+' || end != text.c_str() + text.size() ||
        errno == ERANGE || value < 1 || value > kMaxConnectionCap) {
        error = option + " " + Quoted(text) + " is not a whole number from 1 to 1000000";
        return std::nullopt;
    }
    return static_cast<size_t>(value);
}

}  // namespace

bool ParseOptions(int argc, const char *const *argv, Options &options, std::string &error)
{
    for (int i = 1; i < argc; ++i) {
        std::string name = argv[i];
        std::optional<std::string> inlineValue;
        size_t equals = name.find('=');
        if (name.compare(0, 2, "--") == 0 && equals != std::string::npos) {
            inlineValue = name.substr(equals + 1);
            name.erase(equals);
        }
        // The option's value: after '=', or the next argument.
        auto value = [&]() -> std::optional<std::string> {
            if (inlineValue)
                return inlineValue;
            if (i + 1 < argc)
                return std::string(argv[++i]);
            error = name + " needs a value";
            return std::nullopt;
        };
        auto path = [&](std::string &into) {
            std::optional<std::string> text = value();
            if (text && text->empty())
                error = name + " needs a non-empty path";
            if (!text || text->empty())
                return false;
            into = *text;
            return true;
        };
        auto flag = [&](bool &into) {
            if (inlineValue) {
                error = name + " takes no value";
                return false;
            }
            into = true;
            return true;
        };

        bool ok;
        if (name == "--socket") {
            ok = path(options.server.socketPath);
        } else if (name == "--pidfile") {
            ok = path(options.pidFile);
        } else if (name == "--replay") {
            ok = path(options.replayPath);
        } else if (name == "--simulate") {
            ok = path(options.simulatePath);
        } else if (name == "--record") {
            ok = path(options.server.recordPath);
        } else if (name == "--proc-root") {
            ok = path(options.procRoot);
        } else if (name == "--sys-root") {
            ok = path(options.sysRoot);
        } else if (name == "--interval" || name == "--client-timeout") {
            std::optional<std::string> text = value();
            auto seconds = text ? Seconds(name, *text, error) : std::nullopt;
            ok = seconds.has_value();
            if (ok)
                (name == "--interval" ? options.server.interval : options.server.clientTimeout) =
                    *seconds;
        } else if (name == "--max-connections") {
            std::optional<std::string> text = value();
            auto cap = text ? ConnectionCap(name, *text, error) : std::nullopt;
            ok = cap.has_value();
            if (ok)
                options.server.maxConnections = *cap;
        } else if (name == "--daemon") {
            ok = flag(options.detach);
        } else if (name == "--foreground") {
            ok = flag(options.foreground);
        } else if (name == "--help" || name == "-h") {
            ok = flag(options.help);
        } else if (name == "--probe") {
            ok = flag(options.probe);
        } else if (name == "--version") {
            ok = flag(options.version);
        } else {
            error = (name.compare(0, 1, "-") == 0 ? "unknown option " : "unexpected argument ") +
                    Quoted(argv[i]);
            ok = false;
        }
        if (!ok)
            return false;
    }
    if (!options.replayPath.empty() && !options.simulatePath.empty()) {
        error = "--replay and --simulate exclude each other";
        return false;
    }
    if (options.detach && options.foreground) {
        error = "--daemon and --foreground exclude each other";
        return false;
    }
    return true;
}

void PrintUsage(FILE *to)
{
    std::fprintf(to,
                 "Usage: korvsnmpcd [OPTION]...\n"
                 "Collects this host's statistics and answers libkorvsnmp's requests.\n"
                 "  --socket PATH             listen on PATH (default %s)\n"
                 "  --interval SECONDS        sampling interval, 0.01 to 3600 (default 1)\n"
                 "  --client-timeout SECONDS  time a client has for its exchange (default 2)\n"
                 "  --max-connections N       connections served at once (default %zu)\n"
                 "  --replay FILE             answer with the reply in FILE instead of sampling\n"
                 "  --simulate FILE           answer with an appliance whose average load is the\n"
                 "                            reply in FILE, moving from sample to sample\n"
                 "  --record FILE             write the next statistics reply to FILE\n"
                 "  --proc-root DIR           read the kernel's statistics from DIR, not /proc\n"
                 "  --sys-root DIR            read the block devices and the iSCSI target from\n"
                 "                            DIR, not /sys\n"
                 "  --daemon                  detach once the socket is listening\n"
                 "  --foreground              stay attached and log to stderr too\n"
                 "  --pidfile PATH            write the process id to PATH\n"
                 "  --probe                   exit 0 when something listens on the socket path,\n"
                 "                            1 when not; start nothing\n"
                 "  --version                 print the version and exit\n"
                 "  --help                    print this help and exit\n",
                 kDefaultSocketPath, kDefaultMaxConnections);
}

}  // namespace korvsnmpcd
