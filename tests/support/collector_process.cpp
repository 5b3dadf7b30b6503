#include "collector_process.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <fstream>
#include <sstream>
#include <thread>

#include "protocol/collector_protocol.h"

extern char **environ;

namespace korvtest {
namespace {

using Clock = std::chrono::steady_clock;
constexpr auto kRetry = std::chrono::milliseconds(10);

}  // namespace

CollectorProcess::CollectorProcess(const std::string &program,
                                   const std::vector<std::string> &args, std::string logPath,
                                   int inheritedFd, int inheritedAs)
    : logPath_(std::move(logPath))
{
    std::vector<std::string> words = {program};
    words.insert(words.end(), args.begin(), args.end());
    std::vector<char *> argv;
    for (std::string &word : words)
        argv.push_back(word.data());
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, logPath_.c_str(),
                                     O_WRONLY | O_CREAT | O_TRUNC, 0600);
    posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
    if (inheritedFd >= 0)
        posix_spawn_file_actions_adddup2(&actions, inheritedFd, inheritedAs);
    if (posix_spawn(&pid_, argv[0], &actions, nullptr, argv.data(), environ) != 0)
        pid_ = -1;
    posix_spawn_file_actions_destroy(&actions);
}

CollectorProcess::~CollectorProcess()
{
    if (pid_ > 0) {
        kill(pid_, SIGKILL);
        waitpid(pid_, nullptr, 0);
    }
    unlink(logPath_.c_str());
}

std::string CollectorProcess::Log() const
{
    return ReadWholeFile(logPath_);
}

int CollectorProcess::WaitForExit()
{
    Clock::time_point giveUp = Clock::now() + kProcessWait;
    while (pid_ > 0 && Clock::now() < giveUp) {
        int status = 0;
        if (waitpid(pid_, &status, WNOHANG) == pid_) {
            pid_ = -1;
            return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
        }
        std::this_thread::sleep_for(kRetry);
    }
    return -1;
}

int CollectorProcess::Stop(int signal)
{
    if (pid_ <= 0)
        return -1;
    kill(pid_, signal);
    return WaitForExit();
}

korvproto::UniqueFd ConnectTo(const std::string &path)
{
    korvproto::UniqueFd fd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address;
    std::memset(&address, 0, sizeof address);
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    if (fd.Valid() && connect(fd.Get(), reinterpret_cast<sockaddr *>(&address), sizeof address) == 0)
        return fd;
    return korvproto::UniqueFd();
}

bool WaitUntilConnectable(const std::string &path)
{
    Clock::time_point giveUp = Clock::now() + kProcessWait;
    while (Clock::now() < giveUp) {
        if (ConnectTo(path).Valid())
            return true;
        std::this_thread::sleep_for(kRetry);
    }
    return false;
}

std::string ExchangeWith(const std::string &path, const std::string &frame)
{
    korvproto::UniqueFd connection = ConnectTo(path);
    if (!connection.Valid())
        return "";
    const int fd = connection.Get();
    std::string reply;
    bool closed = false;
    if (send(fd, frame.data(), frame.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(frame.size())) {
        Clock::time_point giveUp = Clock::now() + kProcessWait;
        char buffer[65536];
        while (!closed && Clock::now() < giveUp) {
            pollfd readable = {fd, POLLIN, 0};
            if (poll(&readable, 1, static_cast<int>(kRetry.count())) <= 0)
                continue;
            ssize_t got = read(fd, buffer, sizeof buffer);
            closed = got <= 0;
            if (got > 0)
                reply.append(buffer, static_cast<size_t>(got));
        }
    }
    const size_t prefix = korvproto::kFramePrefixBytes;
    if (!closed || reply.size() < prefix ||
        korvproto::DecodeFramePrefix(reply.data()) != reply.size() - prefix)
        return "";
    return reply.substr(prefix);
}

std::string ReadWholeFile(const std::string &path)
{
    std::ifstream in(path, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    return text.str();
}

}  // namespace korvtest
