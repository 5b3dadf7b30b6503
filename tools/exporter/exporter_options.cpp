#include "exporter_options.h"

#include <getopt.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>

namespace korvexporter {

const char kUsage[] =
    "Usage: korvsnmp-exporter [--listen ADDRESS:PORT] [--interval SECONDS]\n"
    "       korvsnmp-exporter --help | --version\n"
    "\n"
    "Serves the appliance's statistics from libkorvsnmp to Prometheus on\n"
    "http://ADDRESS:PORT/metrics, sampled every SECONDS on a thread of its own.\n"
    "\n"
    "  --listen ADDRESS:PORT  where to listen (default 127.0.0.1:9747; [::1]:9747\n"
    "                         for IPv6; PORT 0: any free port)\n"
    "  --interval SECONDS     sampling interval, 1 to 3600 (default 5)\n"
    "  -h, --help             this text\n"
    "  -V, --version          the version\n";

namespace {

constexpr unsigned long kMinInterval = 1;
constexpr unsigned long kMaxInterval = 3600;
constexpr unsigned long kMaxPort = 65535;

enum LongOnly : int { kListen = 256, kInterval };

const option kLongOptions[] = {
    {"listen", required_argument, nullptr, kListen},
    {"interval", required_argument, nullptr, kInterval},
    {"help", no_argument, nullptr, 'h'},
    {"version", no_argument, nullptr, 'V'},
    {nullptr, 0, nullptr, 0},
};

bool ParseNumber(const std::string &text, unsigned long low, unsigned long high, unsigned long &value)
{
    char *end = nullptr;
    errno = 0;
    value = std::strtoul(text.c_str(), &end, 10);
    return !text.empty() && text.find_first_not_of("0123456789") == std::string::npos && *end == '\0' &&
           errno == 0 && value >= low && value <= high;
}

// ADDRESS:PORT with a numeric port; an IPv6 address in brackets.
bool ValidListen(const std::string &listen)
{
    const size_t colon = listen.rfind(':');
    if (colon == std::string::npos || colon == 0)
        return false;
    const std::string host = listen.substr(0, colon);
    const bool bracketed = host.front() == '[' && host.back() == ']' && host.size() > 2;
    if (!bracketed && host.find_first_of(":[],") != std::string::npos)
        return false;
    unsigned long port = 0;
    return ParseNumber(listen.substr(colon + 1), 0, kMaxPort, port);
}

}  // namespace

bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error)
{
    std::vector<std::string> words{"korvsnmp-exporter"};
    words.insert(words.end(), arguments.begin(), arguments.end());
    std::vector<char *> argv;
    for (std::string &word : words)
        argv.push_back(word.data());
    argv.push_back(nullptr);
    const int argc = static_cast<int>(words.size());

    optind = 0;
    opterr = 0;
    std::vector<int> given;
    for (int code; (code = getopt_long(argc, argv.data(), "+:hV", kLongOptions, nullptr)) != -1;) {
        if (code == '?' || code == ':') {
            error = (code == '?' ? "unknown option \"" : "a value is missing for \"") + words[optind - 1] + "\"";
            return false;
        }
        if (std::find(given.begin(), given.end(), code) != given.end()) {
            error = "\"" + words[optind - 1] + "\" given more than once";
            return false;
        }
        given.push_back(code);
        const std::string value = optarg != nullptr ? optarg : "";
        unsigned long number = 0;
        switch (code) {
        case 'h': options.action = Action::Help; break;
        case 'V': options.action = Action::Version; break;
        case kListen:
            if (!ValidListen(value)) {
                error = "--listen needs ADDRESS:PORT, not \"" + value + "\"";
                return false;
            }
            options.listen = value;
            break;
        case kInterval:
            if (!ParseNumber(value, kMinInterval, kMaxInterval, number)) {
                error = "--interval needs whole seconds from 1 to 3600, not \"" + value + "\"";
                return false;
            }
            options.intervalSeconds = static_cast<uint32_t>(number);
            break;
        }
    }
    if (optind < argc) {
        error = "unexpected argument \"" + words[optind] + "\"";
        return false;
    }
    return true;
}

}  // namespace korvexporter
