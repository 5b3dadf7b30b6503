// Logging of the collector daemon's units. Every message goes to syslog as
// "<unit>:<line> <text>"; the daemon opens syslog with LOG_PERROR, so each
// message reaches stderr too. Each unit names itself by defining kLogUnit
// (its source file's name without extension) before it logs.
#ifndef KORVSNMPCD_COLLECTOR_LOG_H
#define KORVSNMPCD_COLLECTOR_LOG_H

#include <syslog.h>

// `format` must be a string literal; "%m" stands for the current errno's text.
#define KORVSNMPCD_LOG(priority, format, ...) \
    syslog((priority), "%s:%d " format, kLogUnit, __LINE__, ##__VA_ARGS__)

#endif
