// A scripted collector daemon on "/tmp/korvsnmpcd.sock", for tests.
//
// It serves one connection at a time, on a thread of its own: it reads the
// client's request frame, records the exact bytes, and answers with the next
// scripted Answer. Every test that touches the fixed socket path holds the
// path's test lock (an flock, so that test programs running at the same time
// wait for each other too).
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

#include "protocol/collector_protocol.h"

namespace korvtest {

using korvproto::kCollectorSocketPath;

// A reply frame: the 4-byte big-endian length of `body`, then `body`.
std::string Frame(std::string_view body);
// A frame whose prefix claims `length`, whatever `body` holds.
std::string FrameClaiming(uint32_t length, std::string_view body);

struct Answer {
    std::string bytes;         // sent after the request has been read
    bool hangUp = true;        // close at once; false: wait until the client closes
    bool readRequest = true;   // false: close on accept, reading and sending nothing
};

// Holds the fixed socket path's test lock for its lifetime.
class SocketPathLock {
public:
    SocketPathLock();
    ~SocketPathLock();
    SocketPathLock(const SocketPathLock &) = delete;
    SocketPathLock &operator=(const SocketPathLock &) = delete;

private:
    int lockFd_;
};

// No collector at all: the path is locked and its socket file removed.
class NoCollector {
public:
    NoCollector();

private:
    SocketPathLock lock_;
};

class TestCollector {
public:
    TestCollector();  // locks the path and listens on it; aborts the test program if it cannot
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
    void Serve();
    void Handle(int connection, const Answer &answer);

    SocketPathLock lock_;
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
