// Logging of the library's and the collector's units. Every message goes to
// syslog as "<unit>:<line> <text>"; each unit names itself by defining
// kLogUnit (its source file's name without extension) before it logs.
#ifndef KORVPROTO_UNIT_LOG_H
#define KORVPROTO_UNIT_LOG_H

#include <syslog.h>

// `format` must be a string literal; "%m" stands for the current errno's text.
#define KORVSNMP_LOG(priority, format, ...) \
    syslog((priority), "%s:%d " format, kLogUnit, __LINE__, ##__VA_ARGS__)

#endif
