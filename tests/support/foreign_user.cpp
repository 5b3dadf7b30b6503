#include "foreign_user.h"

#include <fcntl.h>
#include <grp.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <filesystem>

#include "collector_process.h"

namespace korvtest {
namespace {

constexpr int kCannotDrop = 111;
constexpr int kWorkFailed = 112;
constexpr mode_t kStickyWorldWritable = 01777;
constexpr char kListeningMark = 'R';
constexpr int kWaitMs =
    static_cast<int>(std::chrono::duration_cast<std::chrono::milliseconds>(kProcessWait).count());

// In the child, right after fork: takes nobody's ids, then dies with the
// test program (the setting does not survive the change of ids).
bool BecomeNobody(pid_t parent)
{
    if (setgroups(0, nullptr) != 0 || setgid(kNobody) != 0 || setuid(kNobody) != 0)
        return false;
    return prctl(PR_SET_PDEATHSIG, SIGKILL) == 0 && getppid() == parent;
}

// Reads exactly `size` bytes, each piece within kProcessWait; false on end,
// error or stall.
bool ReadWithin(int fd, void *data, size_t size)
{
    auto *into = static_cast<char *>(data);
    while (size > 0) {
        pollfd ready{fd, POLLIN, 0};
        if (poll(&ready, 1, kWaitMs) != 1)
            return false;
        const ssize_t got = read(fd, into, size);
        if (got <= 0)
            return false;
        into += got;
        size -= static_cast<size_t>(got);
    }
    return true;
}

bool WriteWhole(int fd, const void *data, size_t size)
{
    const auto *from = static_cast<const char *>(data);
    while (size > 0) {
        const ssize_t put = write(fd, from, size);
        if (put < 0 && errno == EINTR)
            continue;
        if (put <= 0)
            return false;
        from += put;
        size -= static_cast<size_t>(put);
    }
    return true;
}

void KillAndReap(pid_t &pid)
{
    if (pid > 0 && kill(pid, SIGKILL) == 0)
        waitpid(pid, nullptr, 0);
    pid = -1;
}

// The child's side of a NobodyListener; only system calls after the fork.
[[noreturn]] void Listen(const sockaddr_un &address, const std::string &reply, int reports)
{
    const int listener = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (listener < 0 || bind(listener, reinterpret_cast<const sockaddr *>(&address), sizeof address) != 0 ||
        listen(listener, 16) != 0 || !WriteWhole(reports, &kListeningMark, 1))
        _exit(kWorkFailed);
    while (true) {
        const int client = accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
        if (client < 0)
            continue;
        send(client, reply.data(), reply.size(), MSG_NOSIGNAL);
        uint64_t received = 0;
        char buffer[1024];
        for (ssize_t got; (got = read(client, buffer, sizeof buffer)) > 0;)
            received += static_cast<uint64_t>(got);
        close(client);
        if (!WriteWhole(reports, &received, sizeof received))
            _exit(kWorkFailed);
    }
}

}  // namespace

bool CanRunAsNobody() { return geteuid() == 0; }

StickyDirectory::StickyDirectory()
{
    char name[] = "/tmp/korvtest-sticky-XXXXXX";
    if (mkdtemp(name) != nullptr && chmod(name, kStickyWorldWritable) == 0)
        path_ = name;
}

StickyDirectory::~StickyDirectory()
{
    std::error_code ignored;
    if (!path_.empty())
        std::filesystem::remove_all(path_, ignored);
}

AsNobody::AsNobody(const std::function<std::string()> &work)
{
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0)
        return;
    korvproto::UniqueFd readEnd(ends[0]);
    korvproto::UniqueFd writeEnd(ends[1]);
    const pid_t parent = getpid();
    pid_ = fork();
    if (pid_ == 0) {
        readEnd.Reset();
        if (!BecomeNobody(parent))
            _exit(kCannotDrop);
        const std::string result = work();
        _exit(WriteWhole(writeEnd.Get(), result.data(), result.size()) ? 0 : kWorkFailed);
    }
    if (pid_ > 0)
        output_ = std::move(readEnd);
}

AsNobody::~AsNobody() { KillAndReap(pid_); }

std::optional<std::string> AsNobody::Result()
{
    if (pid_ <= 0)
        return std::nullopt;
    std::string result;
    char piece[4096];
    for (pollfd ready{output_.Get(), POLLIN, 0}; poll(&ready, 1, kWaitMs) == 1;) {
        const ssize_t got = read(output_.Get(), piece, sizeof piece);
        if (got <= 0)
            break;
        result.append(piece, static_cast<size_t>(got));
    }
    int status = 0;
    if (!Eventually([&] { return waitpid(pid_, &status, WNOHANG) == pid_; }))
        return std::nullopt;
    pid_ = -1;
    if (!WIFEXITED(status) || WEXITSTATUS(status) != 0)
        return std::nullopt;
    return result;
}

NobodyListener::NobodyListener(const std::string &path, const std::string &reply)
{
    int ends[2];
    if (pipe2(ends, O_CLOEXEC) != 0)
        return;
    korvproto::UniqueFd readEnd(ends[0]);
    korvproto::UniqueFd writeEnd(ends[1]);
    const sockaddr_un address = SocketAddress(path);
    const pid_t parent = getpid();
    pid_ = fork();
    if (pid_ == 0) {
        readEnd.Reset();
        if (!BecomeNobody(parent))
            _exit(kCannotDrop);
        Listen(address, reply, writeEnd.Get());
    }
    if (pid_ > 0)
        reports_ = std::move(readEnd);
}

NobodyListener::~NobodyListener() { KillAndReap(pid_); }

bool NobodyListener::Listening()
{
    char mark = 0;
    return pid_ > 0 && ReadWithin(reports_.Get(), &mark, 1) && mark == kListeningMark;
}

std::vector<size_t> NobodyListener::Received(size_t connections)
{
    std::vector<size_t> counts;
    uint64_t received = 0;
    while (counts.size() < connections && ReadWithin(reports_.Get(), &received, sizeof received))
        counts.push_back(static_cast<size_t>(received));
    return counts;
}

}  // namespace korvtest
