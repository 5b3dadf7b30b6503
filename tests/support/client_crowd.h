// A crowd of hostile local clients of a collector socket, and a timed probe.
//
// Idle clients connect and send nothing; slow clients send a well-formed
// request one byte every kCrowdTick; garbage clients send a few random bytes
// (random length claims included) every kCrowdTick. Every client whose
// connection the collector closes connects again on the next tick, so the
// crowd keeps its size, as a user who keeps reconnecting would. A thread of
// its own drives the crowd until the ClientCrowd goes; it then closes every
// connection it holds.
#ifndef KORVTEST_CLIENT_CROWD_H
#define KORVTEST_CLIENT_CROWD_H

#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <cstddef>
#include <string>
#include <thread>
#include <vector>

namespace korvtest {

inline constexpr std::chrono::milliseconds kCrowdTick{100};

struct CrowdSize {
    size_t idle = 0;
    size_t slow = 0;
    size_t garbage = 0;
};

class ClientCrowd {
public:
    // Opens the idle clients' connections before it returns (those the
    // backlog refuses are retried on each tick). `reconnect` false: a client
    // whose connection is closed stays away.
    ClientCrowd(std::string socketPath, CrowdSize size, bool reconnect = true);
    ~ClientCrowd();
    ClientCrowd(const ClientCrowd &) = delete;
    ClientCrowd &operator=(const ClientCrowd &) = delete;

    // Connections open now, and the count of closes by the collector so far.
    size_t Connected() const { return connected_.load(); }
    size_t ClosedByPeer() const { return closedByPeer_.load(); }

private:
    struct Client;
    void Drive();

    std::string path_;
    bool reconnect_;
    std::vector<Client> clients_;
    std::atomic<size_t> connected_{0};
    std::atomic<size_t> closedByPeer_{0};
    std::atomic<bool> stop_{false};
    std::thread driver_;
};

// One well-formed statistics request on a connection of its own, as the
// library sends it. The time from connect until the whole reply is in, or
// a negative duration when it failed or took longer than `limit`.
std::chrono::microseconds TimedProbe(const std::string &socketPath,
                                     std::chrono::milliseconds limit);

// The p-th percentile (0-100) of `samples`, nearest rank; 0 when empty.
std::chrono::microseconds Percentile(std::vector<std::chrono::microseconds> samples, double p);

// Open descriptors of process `pid`, from /proc.
size_t OpenDescriptorCount(pid_t pid);

}  // namespace korvtest

#endif
