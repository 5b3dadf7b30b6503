// A scripted collector daemon for tests, and the seam that keeps tests off
// the real collector's socket.
//
// The seam: the test program replaces connect() (connect_redirect.c), so that
// a connection to the collector's fixed path "/tmp/korvsnmpcd.sock" goes to a
// private path of this process, PrivateCollectorPath(), in a directory of its
// own; the program sets KORVTEST_COLLECTOR_SOCKET to it at start-up. Nothing
// in a test program binds, removes or reaches the real path, so the tests run
// beside a live collector and test programs run in parallel. A child process
// that a test runs (korvsnmp-stat, the SNMP subagent) gets the same
// redirection from the shim library libkorvtest_redirect.so: run it with
// RedirectedChildVariables() in its environment (or RedirectedChildPrefix()
// before a shell command).
//
// The collector serves one connection at a time, on a thread of its own: it
// reads the client's request frame, records the exact bytes, and answers with
// the next scripted Answer.
#ifndef KORVTEST_TEST_COLLECTOR_H
#define KORVTEST_TEST_COLLECTOR_H

#include <cstdint>
#include <condition_variable>
#include <deque>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

namespace korvtest {

// Where this process's connections to the fixed path go; made at start-up.
const std::string &PrivateCollectorPath();

// "LD_PRELOAD=<shim>", "KORVTEST_COLLECTOR_SOCKET=<private path>" and
// "ASAN_OPTIONS=<as ours>:verify_asan_link_order=0" (the shim is not built
// with the sanitizers), for a child's environment.
std::vector<std::string> RedirectedChildVariables();
// The same as shell words, each quoted, with a trailing space.
std::string RedirectedChildPrefix();

// A reply frame: the 4-byte big-endian length of `body`, then `body`.
std::string Frame(std::string_view body);
// A frame whose prefix claims `length`, whatever `body` holds.
std::string FrameClaiming(uint32_t length, std::string_view body);

struct Answer {
    std::string bytes;         // sent after the request has been read
    bool hangUp = true;        // close at once; false: wait until the client closes
    bool readRequest = true;   // false: close on accept, reading and sending nothing
};

// No collector at all: the private path holds no socket file.
class NoCollector {
public:
    NoCollector();
};

class TestCollector {
public:
    TestCollector();  // listens on the private path; aborts the test program if it cannot
    ~TestCollector();
    TestCollector(const TestCollector &) = delete;
    TestCollector &operator=(const TestCollector &) = delete;

    // Scripts the answer to the next connection not yet scripted. A
    // connection without a script is closed after its request is read.
    void Script(Answer answer);

    // The bytes received on each finished connection, in order.
    std::vector<std::string> Requests() const;

    // Waits (at most a few seconds) until `count` connections are finished.
    bool WaitForConnections(size_t count) const;

private:
    void Serve();  // answers each connection with the next scripted Answer

    int listenFd_ = -1;
    int stopPipe_[2] = {-1, -1};
    mutable std::mutex mutex_;
    mutable std::condition_variable changed_;
    std::deque<Answer> script_;
    std::vector<std::string> requests_;
    std::thread server_;
};

// Number of descriptors open in this process.
int OpenDescriptorCount();

}  // namespace korvtest

#endif
