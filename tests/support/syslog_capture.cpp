#include "syslog_capture.h"

#include <syslog.h>

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>

namespace korvtest {
namespace {

std::mutex gMutex;
std::vector<LogEntry> gEntries;

// syslog's "%m" is the text of errno; vsnprintf knows nothing of it.
std::string ExpandErrno(const char *format, int savedErrno)
{
    std::string expanded;
    for (const char *p = format; *p != '\0'; ++p)
        if (p[0] != '%' || (p[1] != '%' && p[1] != 'm'))
            expanded += *p;
        else if (*++p == '%')
            expanded += "%%";
        else
            for (const char *c = std::strerror(savedErrno); *c != '\0'; ++c)
                expanded += (*c == '%') ? std::string("%%") : std::string(1, *c);
    return expanded;
}

void Capture(int priority, const char *format, va_list args)
{
    int savedErrno = errno;
    std::string expanded = ExpandErrno(format, savedErrno);
    va_list copy;
    va_copy(copy, args);
    int length = std::vsnprintf(nullptr, 0, expanded.c_str(), copy);
    va_end(copy);
    std::string text(length > 0 ? static_cast<size_t>(length) : 0, '\0');
    if (length > 0)
        std::vsnprintf(text.data(), text.size() + 1, expanded.c_str(), args);
    std::lock_guard<std::mutex> lock(gMutex);
    gEntries.push_back({priority & LOG_PRIMASK, text});
    errno = savedErrno;
}

}  // namespace

void PrintTo(const LogEntry &entry, std::ostream *out)
{
    *out << "{priority " << entry.priority << ", \"" << entry.text << "\"}";
}

std::vector<LogEntry> LoggedMessages() { std::lock_guard<std::mutex> lock(gMutex); return gEntries; }

void ClearLog() { std::lock_guard<std::mutex> lock(gMutex); gEntries.clear(); }

}  // namespace korvtest

extern "C" {

void vsyslog(int priority, const char *format, va_list args) { korvtest::Capture(priority, format, args); }

void syslog(int priority, const char *format, ...)
{
    va_list args;
    va_start(args, format);
    korvtest::Capture(priority, format, args);
    va_end(args);
}

void __vsyslog_chk(int priority, int, const char *format, va_list args)
{
    korvtest::Capture(priority, format, args);
}

void __syslog_chk(int priority, int, const char *format, ...)
{
    va_list args;
    va_start(args, format);
    korvtest::Capture(priority, format, args);
    va_end(args);
}

}  // extern "C"
