#include "collector_process.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <iterator>
#include <thread>

#include "protocol/collector_protocol.h"

extern char **environ;

namespace korvtest {

using Clock = std::chrono::steady_clock;
constexpr auto kRetry = std::chrono::milliseconds(10);

bool Eventually(const std::function<bool()> &condition)
{
    for (Clock::time_point giveUp = Clock::now() + kProcessWait; Clock::now() < giveUp;
         std::this_thread::sleep_for(kRetry))
        if (condition()) return true;
    return condition();
}

CollectorProcess::CollectorProcess(const std::string &program,
                                   const std::vector<std::string> &args, std::string logPath,
                                   int inheritedFd, int inheritedAs)
    : logPath_(std::move(logPath))
{
    std::vector<char *> argv = {const_cast<char *>(program.c_str())};
    for (const std::string &arg : args) argv.push_back(const_cast<char *>(arg.c_str()));
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, logPath_.c_str(),
                                     O_WRONLY | O_CREAT | O_TRUNC, 0600);
    posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
    if (inheritedFd >= 0) posix_spawn_file_actions_adddup2(&actions, inheritedFd, inheritedAs);
    if (posix_spawn(&pid_, argv[0], &actions, nullptr, argv.data(), environ) != 0) pid_ = -1;
    posix_spawn_file_actions_destroy(&actions);
}

CollectorProcess::~CollectorProcess()
{
    if (pid_ > 0 && kill(pid_, SIGKILL) == 0) waitpid(pid_, nullptr, 0);
    unlink(logPath_.c_str());
}

std::string CollectorProcess::Log() const { return ReadWholeFile(logPath_); }

int CollectorProcess::WaitForExit()
{
    int status = 0;
    if (pid_ <= 0 || !Eventually([&] { return waitpid(pid_, &status, WNOHANG) == pid_; }))
        return -1;
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

int CollectorProcess::Stop(int sig) { return pid_ > 0 && kill(pid_, sig) == 0 ? WaitForExit() : -1; }

sockaddr_un SocketAddress(const std::string &path)
{
    sockaddr_un address{AF_UNIX, {}};
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    return address;
}

korvproto::UniqueFd ConnectTo(const std::string &path)
{
    korvproto::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address = SocketAddress(path);
    if (fd.Valid() && connect(fd.Get(), reinterpret_cast<sockaddr *>(&address), sizeof address) == 0)
        return fd;
    return korvproto::UniqueFd();
}

bool WaitUntilConnectable(const std::string &p) { return Eventually([&] { return ConnectTo(p).Valid(); }); }

std::string ExchangeWith(const std::string &path, const std::string &frame)
{
    const korvproto::UniqueFd connection = ConnectTo(path);
    const int fd = connection.Get();
    if (!connection.Valid() ||
        send(fd, frame.data(), frame.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(frame.size()))
        return "";
    std::string reply;
    char buffer[65536];
    ssize_t got = 1;
    pollfd readable = {fd, POLLIN, 0};
    const bool closed = Eventually([&] {  // read all there is, until the collector closes
        while (got > 0 && poll(&readable, 1, 0) > 0 && (got = read(fd, buffer, sizeof buffer)) > 0)
            reply.append(buffer, static_cast<size_t>(got));
        return got <= 0;
    });
    const size_t prefix = korvproto::kFramePrefixBytes, size = reply.size();
    const bool framed = size >= prefix && korvproto::DecodeFramePrefix(reply.data()) == size - prefix;
    return closed && framed ? reply.substr(prefix) : "";
}

std::string ReadWholeFile(const std::string &path)
{
    std::ifstream in(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(in), {});
}

}  // namespace korvtest
