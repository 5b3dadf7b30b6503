// Captures what the code under test sends to syslog. The test program
// defines syslog() and its fortified variants itself, so the library's
// messages land here instead of in the system log.
#ifndef KORVTEST_SYSLOG_CAPTURE_H
#define KORVTEST_SYSLOG_CAPTURE_H

#include <ostream>
#include <string>
#include <vector>

#include <gmock/gmock.h>

namespace korvtest {

struct LogEntry {
    int priority;      // LOG_ERR, LOG_INFO...
    std::string text;  // formatted, "%m" expanded
};

void PrintTo(const LogEntry &entry, std::ostream *out);

// Messages logged since the last ClearLog().
std::vector<LogEntry> LoggedMessages();
void ClearLog();

// Matches a message "<unit>:<line> <text>" (any line number) at `priority`.
MATCHER_P3(Logged, priority, unit, text,
           std::string("logs \"") + unit + ":<line> " + text + "\" at priority " +
               std::to_string(priority))
{
    const std::string prefix = std::string(unit) + ":";
    const std::string &line = arg.text;
    if (arg.priority != priority || line.compare(0, prefix.size(), prefix) != 0)
        return false;
    size_t digits = line.find_first_not_of("0123456789", prefix.size());
    return digits != std::string::npos && digits > prefix.size() &&
           line.compare(digits, std::string::npos, std::string(" ") + text) == 0;
}

}  // namespace korvtest

#endif
