// A shell command run by a test, for the tools it drives (snmpwalk, tmux).
#ifndef KORVTEST_SHELL_COMMAND_H
#define KORVTEST_SHELL_COMMAND_H

#include <string>

namespace korvtest {

// Runs `command` with sh -c; its standard output and error together, or ""
// when it could not be started.
std::string RunCommand(const std::string &command);

// `text` quoted for sh: 'text', with each ' written as '\''.
std::string ShellQuoted(const std::string &text);

}  // namespace korvtest

#endif
