#include "test_collector.h"

#include "connect_redirect.h"
#include "protocol/collector_protocol.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <iterator>

namespace korvtest {
namespace {

constexpr int kPeerWaitMs = 5000;  // a client that stalls longer has failed its test anyway

// Ends the test program when the harness itself cannot work.
void Require(bool ok, const char *what) { if (!ok) std::perror(what), std::abort(); }

// Waits for `fd` to become readable, or for the stop pipe. False on stop,
// error or time-out (`timeoutMs`, -1: none).
bool WaitReadable(int fd, int stopFd, int timeoutMs = kPeerWaitMs)
{
    pollfd fds[2] = {{fd, POLLIN, 0}, {stopFd, POLLIN, 0}};
    return poll(fds, 2, timeoutMs) > 0 && fds[1].revents == 0;
}

// Reads exactly `count` bytes, appending them to `into`; false on EOF, error or stall.
bool ReadExactly(int fd, int stopFd, size_t count, std::string &into)
{
    char buffer[4096];
    for (ssize_t got; count > 0 && WaitReadable(fd, stopFd) &&
                      (got = read(fd, buffer, std::min(count, sizeof buffer))) > 0; count -= size_t(got))
        into.append(buffer, size_t(got));
    return count == 0;
}

std::string gPrivateDirectory;

// Set up before any test runs, so that no connect() ever reaches the real
// path; the directory goes at exit.
const bool gRedirected = [] {
    PrivateCollectorPath();
    return std::atexit([] {
        std::error_code ignored;  // the tests' files in it go too
        std::filesystem::remove_all(gPrivateDirectory, ignored);
    }) == 0;
}();

}  // namespace

const std::string &PrivateCollectorPath()
{
    static const std::string path = [] {
        char directory[] = "/tmp/korvtest-XXXXXX";
        Require(mkdtemp(directory) != nullptr, "making the private collector directory");
        const std::string socket = (gPrivateDirectory = directory) + "/korvsnmpcd.sock";
        Require(setenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE, socket.c_str(), 1) == 0,
                "setting " KORVTEST_COLLECTOR_SOCKET_VARIABLE);
        return socket;
    }();
    return path;
}

std::vector<std::string> RedirectedChildVariables()
{
    const char *sanitizer = getenv("ASAN_OPTIONS");
    const std::string asan = sanitizer != nullptr && *sanitizer != '\0' ? std::string(sanitizer) + ":" : "";
    return {std::string("LD_PRELOAD=") + KORVTEST_REDIRECT_LIBRARY,
            std::string(KORVTEST_COLLECTOR_SOCKET_VARIABLE "=") + PrivateCollectorPath(),
            "ASAN_OPTIONS=" + asan + "verify_asan_link_order=0"};
}

std::string RedirectedChildPrefix()
{
    std::string prefix;
    for (const std::string &variable : RedirectedChildVariables()) {
        const size_t equals = variable.find('=');
        prefix += variable.substr(0, equals + 1) + "'";  // the value single-quoted
        for (char c : variable.substr(equals + 1)) prefix += c == '\'' ? "'\\''" : std::string(1, c);
        prefix += "' ";
    }
    return prefix;
}

std::string FrameClaiming(uint32_t length, std::string_view body)
{ return korvproto::EncodeFramePrefix(length).append(body); }

std::string Frame(std::string_view body) { return korvproto::EncodeFrame(body); }

NoCollector::NoCollector() { unlink(PrivateCollectorPath().c_str()); }

TestCollector::TestCollector()
{
    unlink(PrivateCollectorPath().c_str());
    listenFd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{AF_UNIX, {}};
    std::strncpy(address.sun_path, PrivateCollectorPath().c_str(), sizeof address.sun_path - 1);
    const auto *named = reinterpret_cast<sockaddr *>(&address);
    Require(listenFd_ >= 0 && bind(listenFd_, named, sizeof address) == 0 && listen(listenFd_, 16) == 0 &&
            pipe2(stopPipe_, O_CLOEXEC) == 0, "starting the test collector");
    server_ = std::thread(&TestCollector::Serve, this);
}

TestCollector::~TestCollector()
{
    Require(write(stopPipe_[1], "x", 1) == 1, "stopping the test collector");
    server_.join();
    for (int fd : {listenFd_, stopPipe_[0], stopPipe_[1]}) close(fd);
    unlink(PrivateCollectorPath().c_str());
}

void TestCollector::Script(Answer answer)
{ std::lock_guard lock(mutex_); script_.push_back(std::move(answer)); }

std::vector<std::string> TestCollector::Requests() const
{ std::lock_guard lock(mutex_); return requests_; }

bool TestCollector::WaitForConnections(size_t count) const
{
    std::unique_lock<std::mutex> lock(mutex_);
    return changed_.wait_for(lock, std::chrono::milliseconds(kPeerWaitMs),
                             [&] { return requests_.size() >= count; });
}

void TestCollector::Serve()
{
    while (WaitReadable(listenFd_, stopPipe_[0], -1)) {
        const int fd = accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
        if (fd < 0) continue;
        std::unique_lock<std::mutex> lock(mutex_);
        const Answer answer = script_.empty() ? Answer{} : std::move(script_.front());
        if (!script_.empty()) script_.pop_front();
        lock.unlock();
        std::string received;
        if (answer.readRequest) {
            if (ReadExactly(fd, stopPipe_[0], korvproto::kFramePrefixBytes, received))
                ReadExactly(fd, stopPipe_[0], korvproto::DecodeFramePrefix(received.data()), received);
            if (!answer.bytes.empty() && send(fd, answer.bytes.data(), answer.bytes.size(), MSG_NOSIGNAL) < 0)
                std::perror("test collector send");
            char ignored[256];
            while (!answer.hangUp && WaitReadable(fd, stopPipe_[0]) &&
                   read(fd, ignored, sizeof ignored) > 0) {}
        }
        close(fd);
        lock.lock();
        requests_.push_back(std::move(received));
        changed_.notify_all();
    }
}

int OpenDescriptorCount()
{
    std::error_code error;
    std::filesystem::directory_iterator entries("/proc/self/fd", error);
    // Less the iterator's own descriptor.
    return error ? -1 : static_cast<int>(std::distance(begin(entries), end(entries))) - 1;
}

}  // namespace korvtest
