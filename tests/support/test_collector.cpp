#include "test_collector.h"

#include "connect_redirect.h"
#include "protocol/collector_protocol.h"

#include <dirent.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace korvtest {
namespace {

constexpr char kPrivateDirectoryPattern[] = "/tmp/korvtest-XXXXXX";
constexpr char kPrivateSocketName[] = "/korvsnmpcd.sock";
constexpr int kPeerWaitMs = 5000;  // a client that stalls longer has failed its test anyway

[[noreturn]] void Die(const char *what)
{
    std::perror(what);
    std::abort();
}

// Waits for `fd` to become readable, or for the stop pipe. False on stop or time-out.
bool WaitReadable(int fd, int stopFd)
{
    pollfd fds[2] = {{fd, POLLIN, 0}, {stopFd, POLLIN, 0}};
    return poll(fds, 2, kPeerWaitMs) > 0 && fds[1].revents == 0;
}

// Reads exactly `count` bytes, appending them to `into`; false on EOF, error or stall.
bool ReadExactly(int fd, int stopFd, size_t count, std::string &into)
{
    char buffer[4096];
    while (count > 0) {
        if (!WaitReadable(fd, stopFd))
            return false;
        ssize_t got = read(fd, buffer, std::min(count, sizeof buffer));
        if (got <= 0)
            return false;
        into.append(buffer, static_cast<size_t>(got));
        count -= static_cast<size_t>(got);
    }
    return true;
}

std::string gPrivateDirectory;

void RemovePrivateDirectory()
{
    unlink(PrivateCollectorPath().c_str());
    rmdir(gPrivateDirectory.c_str());
}

std::string MakePrivatePath()
{
    char directory[] = "/tmp/korvtest-XXXXXX";
    static_assert(sizeof directory == sizeof kPrivateDirectoryPattern);
    if (mkdtemp(directory) == nullptr)
        Die("making the private collector directory");
    gPrivateDirectory = directory;
    std::string path = gPrivateDirectory + kPrivateSocketName;
    if (setenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE, path.c_str(), 1) != 0)
        Die("setting " KORVTEST_COLLECTOR_SOCKET_VARIABLE);
    return path;
}

// Set up before any test runs, so that no connect() ever reaches the real path.
const bool gRedirected = [] {
    PrivateCollectorPath();
    return std::atexit(RemovePrivateDirectory) == 0;
}();

std::string ShellQuoted(const std::string &word)
{
    std::string quoted = "'";
    for (char c : word)
        quoted += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return quoted + "'";
}

}  // namespace

const std::string &PrivateCollectorPath()
{
    static const std::string path = MakePrivatePath();
    return path;
}

std::vector<std::string> RedirectedChildVariables()
{
    const char *sanitizer = getenv("ASAN_OPTIONS");
    const std::string asan =
        sanitizer != nullptr && *sanitizer != '\0' ? std::string(sanitizer) + ":" : "";
    return {std::string("LD_PRELOAD=") + KORVTEST_REDIRECT_LIBRARY,
            std::string(KORVTEST_COLLECTOR_SOCKET_VARIABLE "=") + PrivateCollectorPath(),
            "ASAN_OPTIONS=" + asan + "verify_asan_link_order=0"};
}

std::string RedirectedChildPrefix()
{
    std::string prefix;
    for (const std::string &variable : RedirectedChildVariables()) {
        size_t equals = variable.find('=');
        prefix += variable.substr(0, equals + 1) + ShellQuoted(variable.substr(equals + 1)) + " ";
    }
    return prefix;
}

std::string FrameClaiming(uint32_t length, std::string_view body)
{
    return korvproto::EncodeFramePrefix(length).append(body);
}

std::string Frame(std::string_view body) { return korvproto::EncodeFrame(body); }

NoCollector::NoCollector() { unlink(PrivateCollectorPath().c_str()); }

TestCollector::TestCollector()
{
    unlink(PrivateCollectorPath().c_str());
    listenFd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (listenFd_ < 0)
        Die("test collector socket");
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (PrivateCollectorPath().size() >= sizeof address.sun_path)
        Die("the private collector path is too long");
    std::strcpy(address.sun_path, PrivateCollectorPath().c_str());
    if (bind(listenFd_, reinterpret_cast<sockaddr *>(&address), sizeof address) != 0 ||
        listen(listenFd_, 16) != 0)
        Die("test collector bind/listen");
    if (pipe2(stopPipe_, O_CLOEXEC) != 0)
        Die("test collector pipe");
    server_ = std::thread(&TestCollector::Serve, this);
}

TestCollector::~TestCollector()
{
    if (write(stopPipe_[1], "x", 1) != 1)
        Die("stopping the test collector");
    server_.join();
    close(listenFd_);
    close(stopPipe_[0]);
    close(stopPipe_[1]);
    unlink(PrivateCollectorPath().c_str());
}

void TestCollector::Script(Answer answer)
{
    std::lock_guard<std::mutex> lock(mutex_);
    script_.push_back(std::move(answer));
}

std::vector<std::string> TestCollector::Requests() const
{
    std::lock_guard<std::mutex> lock(mutex_);
    return requests_;
}

bool TestCollector::WaitForConnections(size_t count) const
{
    std::unique_lock<std::mutex> lock(mutex_);
    return changed_.wait_for(lock, std::chrono::milliseconds(kPeerWaitMs),
                             [&] { return requests_.size() >= count; });
}

void TestCollector::Serve()
{
    for (;;) {
        pollfd fds[2] = {{listenFd_, POLLIN, 0}, {stopPipe_[0], POLLIN, 0}};
        if (poll(fds, 2, -1) < 0 || fds[1].revents != 0)
            return;
        int connection = accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
        if (connection < 0)
            continue;
        Answer answer;
        {
            std::lock_guard<std::mutex> lock(mutex_);
            if (!script_.empty()) {
                answer = std::move(script_.front());
                script_.pop_front();
            }
        }
        Handle(connection, answer);
    }
}

void TestCollector::Handle(int connection, const Answer &answer)
{
    std::string received;
    if (answer.readRequest) {
        std::string prefix;
        if (ReadExactly(connection, stopPipe_[0], korvproto::kFramePrefixBytes, prefix)) {
            received = prefix;
            ReadExactly(connection, stopPipe_[0], korvproto::DecodeFramePrefix(prefix.data()),
                        received);
        } else {
            received = prefix;
        }
        if (!answer.bytes.empty() &&
            send(connection, answer.bytes.data(), answer.bytes.size(), MSG_NOSIGNAL) < 0)
            std::perror("test collector send");
        if (!answer.hangUp) {
            char ignored[256];
            while (WaitReadable(connection, stopPipe_[0]) &&
                   read(connection, ignored, sizeof ignored) > 0) {
            }
        }
    }
    close(connection);
    std::lock_guard<std::mutex> lock(mutex_);
    requests_.push_back(std::move(received));
    changed_.notify_all();
}

int OpenDescriptorCount()
{
    int count = 0;
    DIR *directory = opendir("/proc/self/fd");
    if (directory == nullptr)
        return -1;
    while (dirent *entry = readdir(directory))
        if (entry->d_name[0] != '.')
            ++count;
    closedir(directory);
    return count - 1;  // the directory's own descriptor
}

}  // namespace korvtest
