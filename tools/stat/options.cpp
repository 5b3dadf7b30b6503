#include "options.h"

#include <getopt.h>

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <map>
#include <sstream>

#include "protocol/collector_protocol.h"

namespace korvstat {

const std::string kUsage =
    std::string("Usage: korvsnmp-stat [--resource LIST] [--format json|table|openmetrics]\n"
    "                     [--compact] [--bytes] [--watch SECONDS] [--output FILE]\n"
    "       korvsnmp-stat --top [--watch SECONDS]\n"
    "       korvsnmp-stat --reload\n"
    "       korvsnmp-stat --history-mode REASON\n"
    "       korvsnmp-stat --help | --version\n"
    "\n") +
    "Asks the collector daemon korvsnmpcd (on " + korvproto::kCollectorSocketPath + ") for the\n"
    "appliance's current statistics, names them from the host's configuration\n"
    "with libkorvsnmp, and prints them.\n"
    "\n"
    "  --resource LIST        comma-separated sections to ask for: all (default),\n"
    "                         cpu, memory, network, disk, space, lun, nfs\n"
    "  --format FORMAT        json (default, indented), table (aligned tables per\n"
    "                         section) or openmetrics (OpenMetrics text exposition)\n"
    "  --compact              JSON on one line (with --format json only)\n"
    "  --bytes                exact numbers in tables instead of 1.5M (table only)\n"
    "  --watch SECONDS        redraw every SECONDS (0.1 to 86400) until interrupted\n"
    "  --output FILE          replace FILE with the output, atomically (a file\n"
    "                         beside it, then renamed), instead of standard output\n"
    "  --top                  live view of disks, interfaces, volumes and LUNs,\n"
    "                         busiest first, sampled every --watch SECONDS (2);\n"
    "                         Tab or 1-4 switch section, < > sort column, q quits\n"
    "  --reload               make the collector reload, instead of asking statistics\n"
    "  --history-mode REASON  put the collector into history mode, with REASON\n"
    "  -h, --help             this text\n"
    "  -V, --version          the version\n"
    "\n"
    "Options take their value as `--option VALUE` or `--option=VALUE`. The\n"
    "library's log messages appear on standard error too. The exit status is\n"
    "0 on success, 1 when the exchange or the assembly failed or the collector\n"
    "refused, 2 on a bad command line.\n";

const std::vector<std::string> &KnownResources()
{
    static const std::vector<std::string> names = {"all",   "cpu", "memory", "network",
                                                   "disk", "space", "lun",   "nfs"};
    return names;
}

namespace {

constexpr double kWatchMinSeconds = 0.1;
constexpr double kWatchMaxSeconds = 86400;

// getopt_long's codes for the options without a short form.
enum LongOnly : int {
    kResource = 256,
    kFormat,
    kCompact,
    kBytes,
    kWatch,
    kWatchCount,
    kOutput,
    kReload,
    kHistoryMode,
    kTop,
};

const option kLongOptions[] = {
    {"resource", required_argument, nullptr, kResource},
    {"format", required_argument, nullptr, kFormat},
    {"compact", no_argument, nullptr, kCompact},
    {"bytes", no_argument, nullptr, kBytes},
    {"watch", required_argument, nullptr, kWatch},
    {"watch-count", required_argument, nullptr, kWatchCount},  // for tests; not in the usage
    {"output", required_argument, nullptr, kOutput},
    {"reload", no_argument, nullptr, kReload},
    {"history-mode", required_argument, nullptr, kHistoryMode},
    {"top", no_argument, nullptr, kTop},
    {"help", no_argument, nullptr, 'h'},
    {"version", no_argument, nullptr, 'V'},
    {nullptr, 0, nullptr, 0},
};
// Leading '+': stop at the first operand; ':': report a missing value apart.
constexpr char kShortOptions[] = "+:hV";

// Options that only a statistics request takes.
constexpr int kStatisticsOptions[] = {kResource, kFormat, kCompact, kBytes, kWatch, kWatchCount,
                                      kOutput, kTop};
// Options that the live view does not take: it chooses its sections and draws them itself.
constexpr int kNotWithTop[] = {kResource, kFormat, kCompact, kBytes, kWatchCount, kOutput};
// Options that choose another action; at most one per command line.
constexpr int kActionOptions[] = {kReload, kHistoryMode, 'h', 'V'};

std::string OptionName(int code)
{
    for (const option *o = kLongOptions; o->name != nullptr; ++o)
        if (o->val == code)
            return std::string("--") + o->name;
    return "?";
}

bool ParseResources(const std::string &list, std::vector<std::string> &resources, std::string &error)
{
    resources.clear();
    std::istringstream stream(list);
    std::string name;
    while (std::getline(stream, name, ',')) {
        const auto &known = KnownResources();
        if (std::find(known.begin(), known.end(), name) == known.end()) {
            error = "unknown resource \"" + name + "\"";
            return false;
        }
        resources.push_back(name);
    }
    if (resources.empty()) {
        error = "--resource needs at least one name";
        return false;
    }
    return true;
}

bool ParseFormat(const std::string &name, Format &format, std::string &error)
{
    static const std::map<std::string, Format> formats = {
        {"json", Format::PrettyJson}, {"table", Format::Table}, {"openmetrics", Format::OpenMetrics}};
    auto found = formats.find(name);
    if (found == formats.end()) {
        error = "unknown format \"" + name + "\"";
        return false;
    }
    format = found->second;
    return true;
}

bool ParseWatchSeconds(const std::string &text, double &seconds, std::string &error)
{
    char *end = nullptr;
    errno = 0;
    seconds = std::strtod(text.c_str(), &end);
    if (text.empty() || *end != '\0' || errno != 0 || !std::isfinite(seconds) ||
        seconds < kWatchMinSeconds || seconds > kWatchMaxSeconds) {
        error = "--watch needs seconds from 0.1 to 86400, not \"" + text + "\"";
        return false;
    }
    return true;
}

bool ParseCount(const std::string &text, unsigned &count, std::string &error)
{
    char *end = nullptr;
    errno = 0;
    const unsigned long value = std::strtoul(text.c_str(), &end, 10);
    if (text.empty() || text[0] == '-' || *end != '\0' || errno != 0 || value == 0 ||
        value > 1000000) {
        error = "--watch-count needs a number of draws, not \"" + text + "\"";
        return false;
    }
    count = static_cast<unsigned>(value);
    return true;
}

// What getopt_long could not take: an unknown option, or a value given to
// an option that takes none.
std::string Rejected(const std::string &text)
{
    const size_t equals = text.find('=');
    if (text.rfind("--", 0) == 0 && equals != std::string::npos) {
        const std::string name = text.substr(2, equals - 2);
        for (const option *o = kLongOptions; o->name != nullptr; ++o)
            if (o->has_arg == no_argument && std::string(o->name).rfind(name, 0) == 0)
                return std::string("--") + o->name + " takes no value";
    }
    return "unknown option \"" + text + "\"";
}

// The rules between options that each parsed well.
bool CheckCombination(const std::vector<int> &given, const Options &options, std::string &error)
{
    auto has = [&](int code) { return std::find(given.begin(), given.end(), code) != given.end(); };
    int action = 0;
    for (int code : kActionOptions) {
        if (!has(code))
            continue;
        if (action != 0) {
            error = OptionName(action) + " and " + OptionName(code) + " cannot be combined";
            return false;
        }
        action = code;
    }
    for (int code : kStatisticsOptions) {
        if (action != 0 && has(code)) {
            error = OptionName(action) + " and " + OptionName(code) + " cannot be combined";
            return false;
        }
    }
    for (int code : kNotWithTop) {
        if (has(kTop) && has(code)) {
            error = "--top and " + OptionName(code) + " cannot be combined";
            return false;
        }
    }
    if (has(kCompact) && has(kFormat) && options.format != Format::PrettyJson) {
        error = "--compact applies to --format json only";
        return false;
    }
    if (has(kBytes) && options.format != Format::Table) {
        error = "--bytes applies to --format table only";
        return false;
    }
    if (has(kWatchCount) && !has(kWatch)) {
        error = "--watch-count needs --watch";
        return false;
    }
    return true;
}

}  // namespace

bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error)
{
    std::vector<std::string> words{"korvsnmp-stat"};
    words.insert(words.end(), arguments.begin(), arguments.end());
    std::vector<char *> argv;
    for (std::string &word : words)
        argv.push_back(word.data());
    argv.push_back(nullptr);
    const int argc = static_cast<int>(words.size());

    optind = 0;  // GNU: start afresh
    opterr = 0;
    std::vector<int> given;
    bool compact = false;
    for (int code; (code = getopt_long(argc, argv.data(), kShortOptions, kLongOptions, nullptr)) != -1;) {
        if (code == '?') {
            const bool shortOption = optopt != 0 && optopt < kResource &&
                                     words[optind - 1].rfind("--", 0) != 0;
            error = shortOption
                        ? "unknown option \"-" + std::string(1, static_cast<char>(optopt)) + "\""
                        : Rejected(words[optind - 1]);
            return false;
        }
        if (code == ':') {
            error = (optopt >= kResource ? OptionName(optopt) : words[optind - 1]) + " needs a value";
            return false;
        }
        if (std::find(given.begin(), given.end(), code) != given.end()) {
            error = OptionName(code) + " given more than once";
            return false;
        }
        given.push_back(code);
        const std::string value = optarg != nullptr ? optarg : "";
        switch (code) {
        case 'h': options.action = Action::Help; break;
        case 'V': options.action = Action::Version; break;
        case kReload: options.action = Action::Reload; break;
        case kCompact: compact = true; break;
        case kBytes: options.rawNumbers = true; break;
        case kTop: options.top = true; break;
        case kHistoryMode:
            options.action = Action::HistoryMode;
            options.reason = value;
            if (value.find_first_not_of(" \t\n") == std::string::npos) {
                error = "--history-mode needs a reason that is not empty";
                return false;
            }
            break;
        case kResource:
            if (!ParseResources(value, options.resources, error))
                return false;
            break;
        case kFormat:
            if (!ParseFormat(value, options.format, error))
                return false;
            break;
        case kWatch:
            if (!ParseWatchSeconds(value, options.watchSeconds, error))
                return false;
            break;
        case kOutput:
            options.outputPath = value;
            if (value.empty() || value.back() == '/') {
                error = "--output needs a file name, not \"" + value + "\"";
                return false;
            }
            break;
        case kWatchCount:
            if (!ParseCount(value, options.watchCount, error))
                return false;
            break;
        }
    }
    if (optind < argc) {
        error = "unexpected argument \"" + words[optind] + "\"";
        return false;
    }
    if (!CheckCombination(given, options, error))
        return false;
    if (compact)
        options.format = Format::CompactJson;
    return true;
}

}  // namespace korvstat
