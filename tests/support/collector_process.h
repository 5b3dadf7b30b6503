// The built korvsnmpcd, run as a child process by a test, and one exchange
// with a collector on a socket path.
#ifndef KORVTEST_COLLECTOR_PROCESS_H
#define KORVTEST_COLLECTOR_PROCESS_H

#include <sys/types.h>
#include <sys/un.h>

#include <chrono>
#include <functional>
#include <string>
#include <vector>

#include "protocol/unique_fd.h"

namespace korvtest {

inline constexpr std::chrono::seconds kProcessWait{10};

// Whether `condition` holds within kProcessWait, polled every few milliseconds.
bool Eventually(const std::function<bool()> &condition);

class CollectorProcess {
public:
    // Runs `program` with `args`; its stdout and stderr go to `logPath`.
    // `inheritedFd`, when not -1, is handed to the child as descriptor
    // `inheritedAs`, as a caller's open pipe would be.
    CollectorProcess(const std::string &program, const std::vector<std::string> &args,
                     std::string logPath, int inheritedFd = -1, int inheritedAs = -1);
    // Kills the child if it still runs; removes the log file.
    ~CollectorProcess();
    CollectorProcess(const CollectorProcess &) = delete;
    CollectorProcess &operator=(const CollectorProcess &) = delete;

    pid_t Pid() const { return pid_; }
    std::string Log() const;
    // The exit status (128 + signal when killed), or -1 when it did not exit within kProcessWait.
    int WaitForExit();
    // Sends `signal`, then waits for the exit as WaitForExit() does.
    int Stop(int signal);

private:
    std::string logPath_;
    pid_t pid_ = -1;
};

// The address of the UNIX socket `path` (cut to fit).
sockaddr_un SocketAddress(const std::string &path);

// A connection to the UNIX socket `path`; not Valid() when nobody accepts it.
korvproto::UniqueFd ConnectTo(const std::string &path);

// Whether something accepts connections on `path` within kProcessWait.
bool WaitUntilConnectable(const std::string &path);

// One exchange: `frame` sent on a new connection, the reply body (without
// its length prefix) read until the collector closes. Empty when the
// connection fails, the reply does not come within kProcessWait, or its
// prefix is not its length.
std::string ExchangeWith(const std::string &path, const std::string &frame);

std::string ReadWholeFile(const std::string &path);

}  // namespace korvtest

#endif
