// The statistics road on a large synthetic appliance: 72 disks (internal
// bays, five expansion units, USB and eSATA), 32 interfaces with VLANs and
// two aggregations, 64 spaces with flash caches, 512 LUNs.
//
//   floor:    the reply's bytes over the UNIX socket, parsed by Json::Reader
//   road:     Transmit + GetDataJson + SNMPParseReplyData
//   assembly: SNMPParseReplyData alone
//   copy:     a deep copy of the reply's sections, the least that taking
//             them over into a result costs
//
// After the runs it prints road/floor, assembly/floor and the peak memory of
// one whole-road call over the reply's size. Needs root (it makes block
// device nodes for the spaces) and takes over /tmp/korvsnmpcd.sock.
#include <arpa/inet.h>
#include <malloc.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <map>
#include <new>
#include <string>
#include <thread>
#include <vector>

#include <benchmark/benchmark.h>
#include <json/reader.h>
#include <json/writer.h>

#include "appliance.h"
#include "korv_standin.h"
#include "korvsnmp/korvsnmp.h"
#include "protocol/collector_protocol.h"

// ---- Allocation accounting, for the peak memory of one call ---------------

namespace {
std::atomic<long long> gLiveBytes{0};
std::atomic<long long> gPeakBytes{0};

void *Allocate(size_t size)
{
    void *block = std::malloc(size ? size : 1);
    if (block == nullptr)
        throw std::bad_alloc();
    long long live = gLiveBytes += static_cast<long long>(malloc_usable_size(block));
    long long peak = gPeakBytes.load();
    while (live > peak && !gPeakBytes.compare_exchange_weak(peak, live)) {
    }
    return block;
}

void Release(void *block)
{
    if (block == nullptr)
        return;
    gLiveBytes -= static_cast<long long>(malloc_usable_size(block));
    std::free(block);
}
}  // namespace

void *operator new(size_t size) { return Allocate(size); }
void *operator new[](size_t size) { return Allocate(size); }
void operator delete(void *block) noexcept { Release(block); }
void operator delete[](void *block) noexcept { Release(block); }
void operator delete(void *block, size_t) noexcept { Release(block); }
void operator delete[](void *block, size_t) noexcept { Release(block); }

// The library's messages (failures only) go to standard error, not to the
// system log.
extern "C" void vsyslog(int, const char *format, va_list args)
{
    std::vfprintf(stderr, format, args);
    std::fputc('\n', stderr);
}
extern "C" void syslog(int priority, const char *format, ...)
{
    va_list args;
    va_start(args, format);
    vsyslog(priority, format, args);
    va_end(args);
}
extern "C" void __syslog_chk(int priority, int, const char *format, ...)
{
    va_list args;
    va_start(args, format);
    vsyslog(priority, format, args);
    va_end(args);
}

namespace {

using korvproto::kCollectorSocketPath;
constexpr int kSpaces = 64;  // as many nodes as the large appliance has spaces

// Real block-device nodes for the spaces: the library resolves each through
// /sys/dev/block, as on the appliance.
struct SpaceNodes {
    std::filesystem::path directory;
    std::vector<std::string> kernelNames;  // per space
    std::vector<std::string> paths;

    SpaceNodes()
    {
        char pattern[] = "/tmp/korvsnmp-bench-XXXXXX";
        directory = mkdtemp(pattern);
        std::vector<std::pair<std::string, std::string>> devices;  // "major:minor", kernel name
        for (const auto &entry : std::filesystem::directory_iterator("/sys/dev/block"))
            devices.emplace_back(entry.path().filename().string(),
                                 std::filesystem::read_symlink(entry.path()).filename().string());
        for (int i = 0; i < kSpaces && !devices.empty(); ++i) {
            const auto &[numbers, kernelName] = devices[i % devices.size()];
            unsigned major = 0, minor = 0;
            std::sscanf(numbers.c_str(), "%u:%u", &major, &minor);
            std::string path = (directory / ("space" + std::to_string(i))).string();
            if (mknod(path.c_str(), S_IFBLK | 0600, makedev(major, minor)) != 0)
                break;
            paths.push_back(path);
            kernelNames.push_back(kernelName);
        }
    }
    ~SpaceNodes() { std::filesystem::remove_all(directory); }
};

// Describes the appliance to the stand-in, and returns the collector's reply.
std::string DescribeAppliance(const SpaceNodes &nodes)
{
    std::vector<korvexample::SpaceDevice> devices;
    for (size_t i = 0; i < nodes.paths.size(); ++i)
        devices.push_back({nodes.paths[i], nodes.kernelNames[i]});
    korvexample::Appliance appliance = korvexample::MakeAppliance(korvexample::LargeAppliance(), devices);
    korvstandin::Reset();
    korvstandin::Host() = std::move(appliance.host);
    return Json::FastWriter().write(appliance.reply);
}

// Serves the framed reply to every connection, on its own thread.
class Collector {
public:
    explicit Collector(const std::string &reply) : reply_(reply)
    {
        unlink(kCollectorSocketPath);
        listenFd_ = socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, kCollectorSocketPath);
        if (bind(listenFd_, reinterpret_cast<sockaddr *>(&address), sizeof address) != 0 ||
            listen(listenFd_, 16) != 0) {
            std::perror("benchmark collector");
            std::exit(1);
        }
        frame_ = korvproto::EncodeFrame(reply_);
        server_ = std::thread([this] { Serve(); });
    }
    ~Collector()
    {
        stop_ = true;
        close(Connect());  // wakes the accept
        server_.join();
        close(listenFd_);
        unlink(kCollectorSocketPath);
    }

    static int Connect()
    {
        int fd = socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, kCollectorSocketPath);
        connect(fd, reinterpret_cast<sockaddr *>(&address), sizeof address);
        return fd;
    }

private:
    // Reads one whole request frame: its length, then that many bytes.
    static bool ReadRequest(int fd, std::vector<char> &buffer)
    {
        char prefix[korvproto::kFramePrefixBytes];
        if (read(fd, prefix, sizeof prefix) != static_cast<ssize_t>(sizeof prefix))
            return false;
        size_t missing = std::min<size_t>(korvproto::DecodeFramePrefix(prefix), buffer.size());
        while (missing > 0) {
            ssize_t n = read(fd, buffer.data(), missing);
            if (n <= 0)
                return false;
            missing -= static_cast<size_t>(n);
        }
        return true;
    }

    void Serve()
    {
        std::vector<char> request(65536);
        while (!stop_) {
            int fd = accept(listenFd_, nullptr, nullptr);
            if (fd < 0)
                continue;
            if (!stop_ && ReadRequest(fd, request))
                for (size_t sent = 0; sent < frame_.size();) {
                    ssize_t n = write(fd, frame_.data() + sent, frame_.size() - sent);
                    if (n <= 0)
                        break;
                    sent += static_cast<size_t>(n);
                }
            close(fd);
        }
    }

    std::string reply_;
    std::string frame_;
    int listenFd_;
    std::atomic<bool> stop_{false};
    std::thread server_;
};

Json::Value Request()
{
    Json::Value request(Json::objectValue);
    request["resource"].append("all");
    return request;
}

void Floor(benchmark::State &state)
{
    const std::string frame = korvproto::EncodeRequestFrame(Request());
    std::vector<char> piece(65536);
    for (auto _ : state) {
        int fd = Collector::Connect();
        if (write(fd, frame.data(), frame.size()) != static_cast<ssize_t>(frame.size()))
            state.SkipWithError("write");
        std::string received;
        for (ssize_t n; (n = read(fd, piece.data(), piece.size())) > 0;)
            received.append(piece.data(), static_cast<size_t>(n));
        close(fd);
        Json::Value reply;
        Json::Reader().parse(received.data() + 4, received.data() + received.size(), reply, true);
        benchmark::DoNotOptimize(reply);
    }
}

void Road(benchmark::State &state)
{
    const Json::Value request = Request();
    for (auto _ : state) {
        Transmitor transmitor("localhost");
        Json::Value reply, result(Json::objectValue);
        if (transmitor.Transmit(request) != 0 || transmitor.GetDataJson(reply) != 0 ||
            !SNMPParseReplyData(request, reply, result))
            state.SkipWithError("the whole road failed");
        benchmark::DoNotOptimize(result);
    }
}

Json::Value gParsedReply;

void Assembly(benchmark::State &state)
{
    const Json::Value request = Request();
    for (auto _ : state) {
        Json::Value result(Json::objectValue);
        if (!SNMPParseReplyData(request, gParsedReply, result))
            state.SkipWithError("assembly failed");
        benchmark::DoNotOptimize(result);
    }
}

// A deep copy of the reply's sections: what taking them over into a result
// costs at the least, before any naming.
void Copy(benchmark::State &state)
{
    for (auto _ : state) {
        Json::Value copy = gParsedReply["data"];
        benchmark::DoNotOptimize(copy);
    }
}

// Keeps each benchmark's mean time per iteration, for the ratios.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run> &runs) override
    {
        for (const Run &run : runs)
            if (run.run_type == Run::RT_Iteration && !run.error_occurred)
                nanoseconds[run.benchmark_name()] = run.GetAdjustedRealTime();
        ConsoleReporter::ReportRuns(runs);
    }
    std::map<std::string, double> nanoseconds;
};

}  // namespace

int main(int argc, char **argv)
{
    SpaceNodes nodes;
    const std::string reply = DescribeAppliance(nodes);
    Collector collector(reply);
    Json::Reader().parse(reply, gParsedReply);
    std::printf("reply: %zu bytes; %zu spaces with block-device nodes\n", reply.size(),
                nodes.paths.size());

    // Peak memory of one whole-road call, above what was live before it.
    {
        const Json::Value request = Request();
        long long before = gLiveBytes.load();
        gPeakBytes = before;
        {
            Transmitor transmitor("localhost");
            Json::Value parsed, result(Json::objectValue);
            if (transmitor.Transmit(request) != 0 || transmitor.GetDataJson(parsed) != 0 ||
                !SNMPParseReplyData(request, parsed, result)) {
                std::fprintf(stderr, "the whole road failed\n");
                return 1;
            }
        }
        double ratio = static_cast<double>(gPeakBytes.load() - before) / reply.size();
        std::printf("peak memory of one whole-road call: %lld bytes, %.2f x the reply (target <= 4)\n",
                    gPeakBytes.load() - before, ratio);
    }

    benchmark::RegisterBenchmark("floor", Floor)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("road", Road)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("assembly", Assembly)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("copy", Copy)->Unit(benchmark::kMicrosecond);
    benchmark::Initialize(&argc, argv);
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);

    auto &ns = reporter.nanoseconds;
    if (ns.count("floor") && ns.count("road") && ns.count("assembly")) {
        std::printf("road/floor:     %.2f (target <= 1.3)\n", ns["road"] / ns["floor"]);
        std::printf("assembly/floor: %.2f (target <= 0.25)\n", ns["assembly"] / ns["floor"]);
        if (ns.count("copy"))
            std::printf("copy/floor:     %.2f (the sections' deep copy alone)\n", ns["copy"] / ns["floor"]);
    }
    korvstandin::Reset();
    return 0;
}
