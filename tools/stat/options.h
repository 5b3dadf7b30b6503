// The command line of korvsnmp-stat.
#ifndef KORVSNMP_STAT_OPTIONS_H
#define KORVSNMP_STAT_OPTIONS_H

#include <string>
#include <vector>

namespace korvstat {

enum class Format { PrettyJson, CompactJson, Table };
enum class Action { Statistics, Reload, HistoryMode, Help };

struct Options {
    Action action = Action::Statistics;
    Format format = Format::PrettyJson;
    std::vector<std::string> resources{"all"};
    std::string reason;  // HistoryMode
};

// The resource names that a request may carry.
const std::vector<std::string> &KnownResources();

// Parses argv[1..]. False with `error` set on a bad command line.
bool ParseOptions(const std::vector<std::string> &arguments, Options &options, std::string &error);

extern const std::string kUsage;

}  // namespace korvstat

#endif
