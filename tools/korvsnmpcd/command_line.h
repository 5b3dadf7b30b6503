// korvsnmpcd's command line.
#ifndef KORVSNMPCD_COMMAND_LINE_H
#define KORVSNMPCD_COMMAND_LINE_H

#include <cstdio>
#include <string>

#include "sampler.h"
#include "server.h"

namespace korvsnmpcd {

struct Options {
    ServerOptions server;
    bool detach = false;      // --daemon
    bool foreground = false;  // --foreground: log to stderr too
    bool help = false;
    bool version = false;
    bool probe = false;       // only tell whether something listens on the socket path
    std::string pidFile;
    std::string replayPath;   // serve this file's reply instead of sampling
    std::string procRoot = kProcRoot;  // what stands for /proc, for /sys
    std::string sysRoot = kSysRoot;
    std::string simulatePath; // simulate the appliance whose average reply is in this file
};

// Reads argv[1..argc-1] into `options`: "--name value" or "--name=value".
// False with `error` saying what is wrong (one line, no program name) for
// an unknown option or argument, a missing or empty value, a number out of
// its range, or options that exclude each other.
bool ParseOptions(int argc, const char *const *argv, Options &options, std::string &error);

void PrintUsage(FILE *to);

}  // namespace korvsnmpcd

#endif
