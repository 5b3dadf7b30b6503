// The command line of korvsnmp-stat.
#ifndef KORVSNMP_STAT_OPTIONS_H
#define KORVSNMP_STAT_OPTIONS_H

#include <string>
#include <vector>

namespace korvstat {

enum class Format { PrettyJson, CompactJson, Table, OpenMetrics };
enum class Action { Statistics, Reload, HistoryMode, Help, Version };

struct Options {
    Action action = Action::Statistics;
    Format format = Format::PrettyJson;
    std::vector<std::string> resources{"all"};
    std::string reason;          // HistoryMode
    bool rawNumbers = false;     // --bytes: tables show exact counts, not 1.5M
    double watchSeconds = 0;     // --watch: redraw every so many seconds; 0: once
    unsigned watchCount = 0;     // hidden --watch-count: stop after so many draws; 0: never
    std::string outputPath;      // --output: replace this file with each draw; "": standard output
    bool top = false;            // --top: the live view, sampling every --watch seconds (default 2)
};

// The resource names that a request may carry.
const std::vector<std::string> &KnownResources();

// Parses argv[1..] (`--option value` and `--option=value` alike). False with
// `error` saying what is wrong on an unknown, repeated, malformed or
// conflicting option, or a stray operand; `options` is then unspecified.
bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error);

extern const std::string kUsage;

}  // namespace korvstat

#endif
