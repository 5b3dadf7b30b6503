// What the library's check of who answers costs per exchange: the kernel's
// peer credentials (SO_PEERCRED) read on every new connection.
//
//   connect:          socket + connect + close, the floor of every exchange
//   connect+check:    the same with the peer's credentials read and judged
//   check:            reading and judging them alone, on one connection
//   SocketInit:       the library's own connect, check included
//   exchange:         Transmitor::Transmit of {} answered with {}, the
//                     smallest whole exchange
//
// The collector is a thread of this program on a private path, where the
// tests' connect() redirection takes the library. The check's cost is
// (connect+check - connect); compare it with exchange.
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>

#include <benchmark/benchmark.h>

#include "connect_redirect.h"
#include "korvsnmp/transmitor.h"
#include "protocol/collector_protocol.h"
#include "protocol/peer_credentials.h"
#include "protocol/unique_fd.h"

namespace {

using korvproto::UniqueFd;

bool ReadExactly(int fd, char *into, size_t size)
{
    while (size > 0) {
        const ssize_t got = read(fd, into, size);
        if (got <= 0)
            return false;
        into += got;
        size -= static_cast<size_t>(got);
    }
    return true;
}

// Answers every request with {} and closes every connection, on its own thread.
class Collector {
public:
    Collector()
    {
        char directory[] = "/tmp/korvsnmp-peer-bench-XXXXXX";
        if (mkdtemp(directory) == nullptr)
            std::abort();
        directory_ = directory;
        path_ = directory_ + "/korvsnmpcd.sock";
        listener_ = UniqueFd(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        sockaddr_un address = Address();
        if (bind(listener_.Get(), reinterpret_cast<sockaddr *>(&address), sizeof address) != 0 ||
            listen(listener_.Get(), 4096) != 0 ||
            setenv(KORVTEST_COLLECTOR_SOCKET_VARIABLE, path_.c_str(), 1) != 0)
            std::abort();
        server_ = std::thread([this] { Serve(); });
    }
    ~Collector()
    {
        stop_ = true;
        {
            // Wakes the server's accept; closed at once, so that its read ends.
            UniqueFd wake(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
            sockaddr_un address = Address();
            korvtest_connect_unredirected(wake.Get(), reinterpret_cast<sockaddr *>(&address),
                                          sizeof address);
        }
        server_.join();
        unlink(path_.c_str());
        rmdir(directory_.c_str());
    }

    sockaddr_un Address() const
    {
        sockaddr_un address{AF_UNIX, {}};
        std::strncpy(address.sun_path, path_.c_str(), sizeof address.sun_path - 1);
        return address;
    }

private:
    void Serve()
    {
        const std::string reply = korvproto::EncodeFrame("{}");
        while (!stop_) {
            UniqueFd client(accept4(listener_.Get(), nullptr, nullptr, SOCK_CLOEXEC));
            char prefix[korvproto::kFramePrefixBytes];
            if (!client.Valid() || !ReadExactly(client.Get(), prefix, sizeof prefix))
                continue;  // a client that only connected
            std::string body(korvproto::DecodeFramePrefix(prefix), '\0');
            if (ReadExactly(client.Get(), body.data(), body.size()))
                send(client.Get(), reply.data(), reply.size(), MSG_NOSIGNAL);
        }
    }

    std::string directory_;
    std::string path_;
    UniqueFd listener_;
    std::atomic<bool> stop_{false};
    std::thread server_;
};

Collector &TheCollector()
{
    static Collector collector;
    return collector;
}

UniqueFd Connect(const sockaddr_un &address)
{
    UniqueFd fd(socket(AF_UNIX, SOCK_STREAM, 0));
    if (korvtest_connect_unredirected(fd.Get(), reinterpret_cast<const sockaddr *>(&address),
                                      sizeof address) != 0)
        std::abort();
    return fd;
}

void BM_Connect(benchmark::State &state)
{
    const sockaddr_un address = TheCollector().Address();
    for (auto _ : state)
        benchmark::DoNotOptimize(Connect(address).Get());
}
BENCHMARK(BM_Connect);

void BM_ConnectAndCheck(benchmark::State &state)
{
    const sockaddr_un address = TheCollector().Address();
    for (auto _ : state) {
        UniqueFd fd = Connect(address);
        ucred peer;
        if (!korvproto::ReadPeerCredentials(fd.Get(), peer) || !korvproto::IsTrustedUser(peer.uid))
            state.SkipWithError("the peer is not trusted");
    }
}
BENCHMARK(BM_ConnectAndCheck);

// The check alone, on one connection.
void BM_Check(benchmark::State &state)
{
    const UniqueFd fd = Connect(TheCollector().Address());
    for (auto _ : state) {
        ucred peer;
        if (!korvproto::ReadPeerCredentials(fd.Get(), peer) || !korvproto::IsTrustedUser(peer.uid))
            state.SkipWithError("the peer is not trusted");
    }
}
BENCHMARK(BM_Check);

void BM_SocketInit(benchmark::State &state)
{
    TheCollector();
    for (auto _ : state) {
        UniqueFd fd(SocketInit());
        if (!fd.Valid())
            state.SkipWithError("SocketInit failed");
    }
}
BENCHMARK(BM_SocketInit);

void BM_Exchange(benchmark::State &state)
{
    TheCollector();
    const Json::Value request(Json::objectValue);
    Transmitor transmitor("localhost");
    for (auto _ : state) {
        if (transmitor.Transmit(request) != 0)
            state.SkipWithError("the exchange failed");
    }
}
BENCHMARK(BM_Exchange);

}  // namespace

BENCHMARK_MAIN();
