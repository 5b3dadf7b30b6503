// The statistics road on a large synthetic appliance: 72 disks (internal
// bays, five expansion units, USB and eSATA), 32 interfaces with VLANs and
// two aggregations, 64 spaces with flash caches, 512 LUNs.
//
//   floor:    the reply's bytes over the UNIX socket, parsed by Json::Reader
//   road:     Transmit + GetDataJson + SNMPParseReplyData (copying the reply)
//   moving road: the same, the parsed reply handed over with std::move
//   assembly, moving assembly: SNMPParseReplyData alone
//   platform: what a moving road must spend beyond the floor whatever the
//             library does: the platform's operations, the stat and readlink
//             calls of the spaces, and the socket calls beyond the floor's
//             (1024-byte reads, the waits)
//
// Without arguments it measures the peak memory of one road (every malloc of
// the process counted), then runs the probes interleaved, one iteration of
// each in turn (--interleaved=<rounds>, 200 by default), and ends with the
// medians' ratios as "NAME: VALUE" lines: road/floor, moving road/floor,
// own share/floor (moving road - floor - platform), moving peak/reply, and
// the load average. Google Benchmark's flags (--benchmark_...) add its runs;
// with --benchmark_repetitions it prints the medians' ratios.
//
// Needs root (it makes block device nodes for the spaces) and takes over
// /tmp/korvsnmpcd.sock.
#include <arpa/inet.h>
#include <dlfcn.h>
#include <linux/perf_event.h>
#include <malloc.h>
#include <sys/syscall.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <benchmark/benchmark.h>
#include <json/reader.h>

#include "appliance.h"
#include "korv_standin.h"
#include "korv_webapi.h"
#include "korvsnmp/korvsnmp.h"
#include "protocol/collector_protocol.h"

// ---- Allocation accounting at malloc, for the peak memory of one call -----
//
// The program defines malloc and its relatives, so every allocation of the
// process (jsoncpp's strings and keys, the standard library's, the
// library's) comes through here. Blocks are counted by their usable size,
// only while a peak is being measured, so that the timed runs pay nothing
// but a flag test. The sanitizers bring their own allocator: there the peak
// is not counted.
#if defined(__SANITIZE_ADDRESS__)
constexpr bool kCountsAllocations = false;
#else
constexpr bool kCountsAllocations = true;
#endif

namespace {
std::atomic<bool> gCounting{false};
std::atomic<long long> gLiveBytes{0};  // since counting began; frees of older blocks count too
std::atomic<long long> gPeakBytes{0};

[[maybe_unused]] void Count(void *block)
{
    if (block == nullptr || !gCounting.load(std::memory_order_relaxed))
        return;
    long long live = gLiveBytes.fetch_add(static_cast<long long>(malloc_usable_size(block)),
                                          std::memory_order_relaxed) +
                     static_cast<long long>(malloc_usable_size(block));
    long long peak = gPeakBytes.load(std::memory_order_relaxed);
    while (live > peak && !gPeakBytes.compare_exchange_weak(peak, live, std::memory_order_relaxed)) {
    }
}

[[maybe_unused]] void Uncount(void *block)
{
    if (block != nullptr && gCounting.load(std::memory_order_relaxed))
        gLiveBytes.fetch_sub(static_cast<long long>(malloc_usable_size(block)),
                             std::memory_order_relaxed);
}
}  // namespace

#if !defined(__SANITIZE_ADDRESS__)
extern "C" {
void *__libc_malloc(size_t size);
void *__libc_calloc(size_t count, size_t size);
void *__libc_realloc(void *block, size_t size);
void *__libc_memalign(size_t alignment, size_t size);
void __libc_free(void *block);

void *malloc(size_t size)
{
    void *block = __libc_malloc(size);
    Count(block);
    return block;
}
void *calloc(size_t count, size_t size)
{
    void *block = __libc_calloc(count, size);
    Count(block);
    return block;
}
void *realloc(void *block, size_t size)
{
    Uncount(block);
    void *moved = __libc_realloc(block, size);
    // A failed realloc keeps the old block; a zero size may free it.
    Count(moved != nullptr ? moved : (size != 0 ? block : nullptr));
    return moved;
}
void free(void *block)
{
    Uncount(block);
    __libc_free(block);
}
void *memalign(size_t alignment, size_t size)
{
    void *block = __libc_memalign(alignment, size);
    Count(block);
    return block;
}
void *aligned_alloc(size_t alignment, size_t size) { return memalign(alignment, size); }
int posix_memalign(void **out, size_t alignment, size_t size)
{
    void *block = memalign(alignment, size);
    if (block == nullptr)
        return ENOMEM;
    *out = block;
    return 0;
}
}
#endif

// ---- The platform's own time ------------------------------------------------
//
// Every platform operation, the system calls that the library must make for
// the spaces (stat, readlink) and the socket calls pass through a wrapper
// here that forwards to the real one. While timing is on (on this thread),
// the wrappers add up the time spent inside them, the outermost call only;
// otherwise they only forward.

namespace {
// What a timed call is.
enum CallKind { kPlatformCall, kSpaceCall, kSocketCall, kCallKinds };

struct PlatformClock {
    bool on = false;
    int depth = 0;
    long long ns[kCallKinds] = {};
    long long calls[kCallKinds] = {};
};
thread_local PlatformClock tPlatform;

long long NowNs()
{
    timespec now{};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return now.tv_sec * 1000000000LL + now.tv_nsec;
}

template <typename Function>
Function Next(const char *symbol)
{
    void *found = dlsym(RTLD_NEXT, symbol);
    if (found == nullptr) {
        std::fprintf(stderr, "benchmark: no %s after the program\n", symbol);
        std::abort();
    }
    return reinterpret_cast<Function>(found);
}

// Runs `call`, adding its time to the sum of its `kind` while timing is on.
template <typename Call>
auto Timed(CallKind kind, Call call)
{
    PlatformClock &clock = tPlatform;
    if (!clock.on || clock.depth > 0)
        return call();
    ++clock.depth;
    ++clock.calls[kind];
    const long long start = NowNs();
    auto result = call();
    clock.ns[kind] += NowNs() - start;
    --clock.depth;
    return result;
}

template <typename Call>
void TimedVoid(Call call)
{
    Timed(kPlatformCall, [&] {
        call();
        return 0;
    });
}
}  // namespace

#define KORVBENCH_FORWARD(result, name, params, args)                                   \
    extern "C" result name params                                                       \
    {                                                                                   \
        static const auto next = Next<result(*) params>(#name);                         \
        return Timed(kPlatformCall, [&] { return next args; });            \
    }
#define KORVBENCH_FORWARD_VOID(name, params, args)                                       \
    extern "C" void name params                                                         \
    {                                                                                   \
        static const auto next = Next<void(*) params>(#name);                           \
        TimedVoid([&] { next args; });                                                  \
    }

KORVBENCH_FORWARD(int, KLIBCIsQuillbox, (void), ())
KORVBENCH_FORWARD(unsigned int, KLIBSystemPhysMemSizeGet, (void), ())
KORVBENCH_FORWARD(int, KLIBCSzListFind, (const KLIBCSzList *list, const char *text), (list, text))
KORVBENCH_FORWARD(KLIBCSzHash *, KLIBCSzHashAlloc, (int size), (size))
KORVBENCH_FORWARD(int, KLIBCSzHashSetValue, (KLIBCSzHash * *hash, const char *key, const char *value),
                  (hash, key, value))
KORVBENCH_FORWARD(const char *, KLIBCSzHashGetValue, (const KLIBCSzHash *hash, const char *key),
                  (hash, key))
KORVBENCH_FORWARD_VOID(KLIBCSzHashFree, (KLIBCSzHash * hash), (hash))
KORVBENCH_FORWARD(int, KLIBCFileGetSectionValue,
                  (const char *path, const char *section, const char *key, char *buffer, int size),
                  (path, section, key, buffer, size))
KORVBENCH_FORWARD(unsigned int, KLIBCErrGet, (void), ())
KORVBENCH_FORWARD(const char *, KLIBCErrorGetFile, (void), ())
KORVBENCH_FORWARD(int, KLIBCErrorGetLine, (void), ())
KORVBENCH_FORWARD(int, DiskInfoEnum, (const DiskFilter *filter, DiskInfoList **head), (filter, head))
KORVBENCH_FORWARD_VOID(DiskInfoEnumFree, (DiskInfoList * head), (head))
KORVBENCH_FORWARD(int, SupportEBox, (void), ())
KORVBENCH_FORWARD(int, KORVEBoxInfoEnum, (EBoxInfo * *head), (head))
KORVBENCH_FORWARD_VOID(KORVEBoxInfoEnumFree, (EBoxInfo * head), (head))
KORVBENCH_FORWARD(int, KORVEBoxIsPoweron, (const EBoxInfo *unit), (unit))
KORVBENCH_FORWARD(int, KORVUSBDevEnum, (int kind, char **names, int size, int *needed),
                  (kind, names, size, needed))
KORVBENCH_FORWARD(int, KORVExtStgPartsVolInfoGet, (const char *name, ExtStgPartsVolInfo *info, int isUsb),
                  (name, info, isUsb))
KORVBENCH_FORWARD(int, KLIBNetGetInterfaceInfo, (KLIBNetInterfaceInfo * records, int capacity, int flags),
                  (records, capacity, flags))
KORVBENCH_FORWARD(int, KLIBNetVlanGet, (const char *name, KLIBNetVlanInfo *vlan), (name, vlan))
KORVBENCH_FORWARD(int, KLIBNetOVSIfIsMaster, (const char *name), (name))
KORVBENCH_FORWARD(int, KORVNetLinkAggrGet, (const char *name, KORVNetLinkAggrInfo *aggr), (name, aggr))
KORVBENCH_FORWARD(int, KORVPPPoeIntfGet, (char *name, int size), (name, size))
KORVBENCH_FORWARD(int, KORVSpaceInfoEnum, (int flags, SpaceInfo **list), (flags, list))
KORVBENCH_FORWARD_VOID(KORVSpaceInfoFree, (SpaceInfo * list), (list))
KORVBENCH_FORWARD(int, KORVFlashCacheConfigGet, (int flags, FlashCacheConfig **list), (flags, list))
KORVBENCH_FORWARD_VOID(KORVFlashCacheConfigFree, (FlashCacheConfig * list), (list))
KORVBENCH_FORWARD(int, KORVVSpaceLayerPathGet,
                  (int flags, const SpaceLayerRef *ref, char *buffer, int size),
                  (flags, ref, buffer, size))

int KORV::APIRunner::Exec(Json::Value &response, const std::string &api, int version,
                          const std::string &method, const Json::Value &params,
                          const std::string &user)
{
    using Function = int (*)(Json::Value &, const std::string &, int, const std::string &,
                             const Json::Value &, const std::string &);
    static const auto next = Next<Function>(
        "_ZN4KORV9APIRunner4ExecERN4Json5ValueERKNSt7__cxx1112basic_stringIcSt11char_"
        "traitsIcESaIcEEEiSB_RKS2_SB_");
    return Timed(kPlatformCall,
                 [&] { return next(response, api, version, method, params, user); });
}

bool KORV::WebAPIUtil::JsonArrayHasString(const Json::Value &array, const std::string &name)
{
    using Function = bool (*)(const Json::Value &, const std::string &);
    static const auto next = Next<Function>(
        "_ZN4KORV10WebAPIUtil18JsonArrayHasStringERKN4Json5ValueERKNSt7__cxx1112basic_"
        "stringIcSt11char_traitsIcESaIcEEE");
    return Timed(kPlatformCall, [&] { return next(array, name); });
}

extern "C" int stat(const char *__restrict path, struct stat *__restrict buffer) noexcept
{
    static const auto next = Next<int (*)(const char *, struct stat *)>("stat");
    return Timed(kSpaceCall, [&] { return next(path, buffer); });
}

extern "C" ssize_t readlink(const char *__restrict path, char *__restrict buffer, size_t size) noexcept
{
    static const auto next = Next<ssize_t (*)(const char *, char *, size_t)>("readlink");
    return Timed(kSpaceCall, [&] { return next(path, buffer, size); });
}

#define KORVBENCH_SOCKET_CALL(result, name, params, args)                              \
    extern "C" result name params noexcept                                              \
    {                                                                                   \
        static const auto next = Next<result(*) params>(#name);                         \
        return Timed(kSocketCall, [&] { return next args; });                           \
    }
KORVBENCH_SOCKET_CALL(int, socket, (int domain, int type, int protocol), (domain, type, protocol))

// The benchmark's collector listens on a private path (gPrivateSocketPath);
// connect() to the collector's fixed path goes there, so that a collector
// running on this host is left alone.
static std::string gPrivateSocketPath;

extern "C" int connect(int fd, const sockaddr *address, socklen_t length) noexcept
{
    static const auto next = Next<int (*)(int, const sockaddr *, socklen_t)>("connect");
    sockaddr_un redirected{};
    const auto *named = reinterpret_cast<const sockaddr_un *>(address);
    if (!gPrivateSocketPath.empty() && address != nullptr && address->sa_family == AF_UNIX &&
        std::strcmp(named->sun_path, korvproto::kCollectorSocketPath) == 0) {
        redirected.sun_family = AF_UNIX;
        std::strcpy(redirected.sun_path, gPrivateSocketPath.c_str());
        address = reinterpret_cast<const sockaddr *>(&redirected);
        length = sizeof redirected;
    }
    return Timed(kSocketCall, [&] { return next(fd, address, length); });
}
KORVBENCH_SOCKET_CALL(int, select,
                      (int count, fd_set *readable, fd_set *writable, fd_set *failed, timeval *wait),
                      (count, readable, writable, failed, wait))
KORVBENCH_SOCKET_CALL(ssize_t, read, (int fd, void *buffer, size_t size), (fd, buffer, size))
KORVBENCH_SOCKET_CALL(ssize_t, write, (int fd, const void *buffer, size_t size), (fd, buffer, size))
KORVBENCH_SOCKET_CALL(ssize_t, send, (int fd, const void *buffer, size_t size, int flags),
                      (fd, buffer, size, flags))
KORVBENCH_SOCKET_CALL(int, close, (int fd), (fd))

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
const int kSpaces = korvexample::SpaceDeviceCount(korvexample::LargeAppliance());  // its spaces' and caches' devices

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
    return korvproto::CompactJson(appliance.reply);
}

// Serves the framed reply to every connection, on its own thread. Everything
// the thread needs is allocated before it starts, so that it never allocates
// inside a measured window.
class Collector {
public:
    // It listens on a private path, where connect() takes the library.
    explicit Collector(const std::string &reply)
        : path_("/tmp/korvsnmp-bench-" + std::to_string(getpid()) + ".sock"), request_(kRequestBufferSize)
    {
        gPrivateSocketPath = path_;
        unlink(path_.c_str());
        listenFd_ = socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strcpy(address.sun_path, path_.c_str());
        if (bind(listenFd_, reinterpret_cast<sockaddr *>(&address), sizeof address) != 0 ||
            listen(listenFd_, 16) != 0) {
            std::perror("benchmark collector");
            std::exit(1);
        }
        frame_ = korvproto::EncodeFrame(reply);
        server_ = std::thread([this] { Serve(); });
        while (!serving_.load())
            std::this_thread::yield();
    }
    ~Collector()
    {
        stop_ = true;
        close(Connect());  // wakes the accept
        server_.join();
        close(listenFd_);
        unlink(path_.c_str());
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
    static constexpr size_t kRequestBufferSize = 65536;
    const std::string path_;

    // Reads one whole request frame: its length, then that many bytes.
    bool ReadRequest(int fd)
    {
        char prefix[korvproto::kFramePrefixBytes];
        if (read(fd, prefix, sizeof prefix) != static_cast<ssize_t>(sizeof prefix))
            return false;
        size_t missing = korvproto::DecodeFramePrefix(prefix);
        while (missing > 0) {
            ssize_t n = read(fd, request_.data(), std::min(missing, request_.size()));
            if (n <= 0)
                return false;
            missing -= static_cast<size_t>(n);
        }
        return true;
    }

    void Serve()
    {
        serving_ = true;
        while (!stop_) {
            int fd = accept(listenFd_, nullptr, nullptr);
            if (fd < 0)
                continue;
            if (!stop_ && ReadRequest(fd))
                for (size_t sent = 0; sent < frame_.size();) {
                    ssize_t n = write(fd, frame_.data() + sent, frame_.size() - sent);
                    if (n <= 0)
                        break;
                    sent += static_cast<size_t>(n);
                }
            close(fd);
        }
    }

    std::vector<char> request_;
    std::string frame_;
    int listenFd_;
    std::atomic<bool> serving_{false};
    std::atomic<bool> stop_{false};
    std::thread server_;
};

Json::Value Request()
{
    Json::Value request(Json::objectValue);
    request["resource"].append("all");
    return request;
}

// ---- The probes: one iteration each ------------------------------------------

struct Probes {
    const Json::Value request = Request();
    std::string requestFrame;
    std::vector<char> piece = std::vector<char>(65536);
    Json::Value parsedReply;

    explicit Probes(const std::string &reply) : requestFrame(korvproto::EncodeRequestFrame(request))
    {
        Json::Reader().parse(reply, parsedReply);
    }

    // The reply's bytes over the socket, parsed: what any client pays.
    bool Floor()
    {
        int fd = Collector::Connect();
        bool sent = write(fd, requestFrame.data(), requestFrame.size()) ==
                    static_cast<ssize_t>(requestFrame.size());
        std::string received;
        for (ssize_t n; (n = read(fd, piece.data(), piece.size())) > 0;)
            received.append(piece.data(), static_cast<size_t>(n));
        close(fd);
        Json::Value reply;
        bool parsed = received.size() > korvproto::kFramePrefixBytes &&
                      Json::Reader().parse(received.data() + korvproto::kFramePrefixBytes, received.data() + received.size(),
                                           reply, true);
        benchmark::DoNotOptimize(reply);
        return sent && parsed;
    }

    // Transmit + GetDataJson + SNMPParseReplyData, the reply copied or moved.
    // `peaks`, when given, gets the peak memory of each phase.
    bool Road(bool moving, struct PhasePeaks *peaks = nullptr);

    bool Assembly()
    {
        Json::Value result(Json::objectValue);
        bool assembled = SNMPParseReplyData(request, parsedReply, result);
        benchmark::DoNotOptimize(result);
        return assembled;
    }

    // `reply` is a fresh copy, made outside the measured time.
    bool MovingAssembly(Json::Value &reply)
    {
        Json::Value result(Json::objectValue);
        bool assembled = SNMPParseReplyData(request, std::move(reply), result);
        benchmark::DoNotOptimize(result);
        return assembled;
    }
};

// The peak memory of each phase of one road, above what was live before it.
struct PhasePeaks {
    enum Phase { kReceive, kParse, kAssemble, kRelease, kPhaseCount };
    static constexpr const char *kNames[kPhaseCount] = {"receive", "parse", "assemble", "release"};
    long long before = 0;
    long long peak[kPhaseCount] = {};

    PhasePeaks()
    {
        gLiveBytes = 0;
        gPeakBytes = 0;
        gCounting = true;
    }
    PhasePeaks(const PhasePeaks &) = default;
    ~PhasePeaks() { gCounting = false; }

    void End(Phase phase)
    {
        peak[phase] = gPeakBytes.load() - before;
        gPeakBytes = gLiveBytes.load();
    }
};

bool Probes::Road(bool moving, PhasePeaks *peaks)
{
    const auto end = [peaks](PhasePeaks::Phase phase) {
        if (peaks != nullptr)
            peaks->End(phase);
    };
    if (peaks != nullptr)
        gPeakBytes = gLiveBytes.load();
    bool assembled = false;
    {
        Transmitor transmitor("localhost");
        Json::Value reply, result(Json::objectValue);
        if (transmitor.Transmit(request) != 0)
            return false;
        end(PhasePeaks::kReceive);
        if (transmitor.GetDataJson(reply) != 0)
            return false;
        end(PhasePeaks::kParse);
        assembled = moving ? SNMPParseReplyData(request, std::move(reply), result)
                           : SNMPParseReplyData(request, reply, result);
        benchmark::DoNotOptimize(result);
        end(PhasePeaks::kAssemble);
    }
    end(PhasePeaks::kRelease);
    return assembled;
}

Probes *gProbes = nullptr;

// ---- Google Benchmark runs (when its flags are given) --------------------------

void BenchFloor(benchmark::State &state)
{
    for (auto _ : state)
        if (!gProbes->Floor())
            state.SkipWithError("the floor failed");
}

void BenchRoad(benchmark::State &state)
{
    for (auto _ : state)
        if (!gProbes->Road(false))
            state.SkipWithError("the whole road failed");
}

void BenchMovingRoad(benchmark::State &state)
{
    for (auto _ : state)
        if (!gProbes->Road(true))
            state.SkipWithError("the whole road failed");
}

void BenchAssembly(benchmark::State &state)
{
    for (auto _ : state)
        if (!gProbes->Assembly())
            state.SkipWithError("assembly failed");
}

void BenchMovingAssembly(benchmark::State &state)
{
    for (auto _ : state) {
        state.PauseTiming();
        Json::Value reply = gProbes->parsedReply;
        state.ResumeTiming();
        if (!gProbes->MovingAssembly(reply))
            state.SkipWithError("assembly failed");
    }
}

// A deep copy of the reply's sections: what taking them over into a result
// costs at the least, before any naming.
void BenchCopy(benchmark::State &state)
{
    for (auto _ : state) {
        Json::Value copy = gProbes->parsedReply["data"];
        benchmark::DoNotOptimize(copy);
    }
}

// Keeps each benchmark's time per iteration: the median over the repetitions
// when there are several, else the single run's mean.
class RatioReporter : public benchmark::ConsoleReporter {
public:
    void ReportRuns(const std::vector<Run> &runs) override
    {
        for (const Run &run : runs) {
            if (run.error_occurred)
                continue;
            const std::string name = run.run_name.str();
            if (run.run_type == Run::RT_Aggregate && run.aggregate_name == "median")
                medians[name] = run.GetAdjustedRealTime();
            else if (run.run_type == Run::RT_Iteration)
                singles[name] = run.GetAdjustedRealTime();
        }
        ConsoleReporter::ReportRuns(runs);
    }
    double Time(const std::string &name) const
    {
        auto median = medians.find(name);
        if (median != medians.end())
            return median->second;
        auto single = singles.find(name);
        return single != singles.end() ? single->second : 0;
    }
    bool HasMedians() const { return !medians.empty(); }

private:
    std::map<std::string, double> medians, singles;
};

void RunGoogleBenchmark(int argc, char **argv)
{
    benchmark::RegisterBenchmark("floor", BenchFloor)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("road", BenchRoad)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("moving road", BenchMovingRoad)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("assembly", BenchAssembly)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("moving assembly", BenchMovingAssembly)->Unit(benchmark::kMicrosecond);
    benchmark::RegisterBenchmark("copy", BenchCopy)->Unit(benchmark::kMicrosecond);
    benchmark::Initialize(&argc, argv);
    RatioReporter reporter;
    benchmark::RunSpecifiedBenchmarks(&reporter);
    const double floor = reporter.Time("floor");
    if (floor <= 0)
        return;
    std::printf("Google Benchmark ratios to the floor (%s):\n",
                reporter.HasMedians() ? "medians of the repetitions" : "means of one run");
    for (const char *name : {"road", "moving road", "assembly", "moving assembly", "copy"})
        if (reporter.Time(name) > 0)
            std::printf("  %-16s %.2f\n", name, reporter.Time(name) / floor);
}

// ---- The interleaved run: one iteration of each probe in turn ----------------

// User-space instructions of this thread, where the kernel lets us count them.
class InstructionCounter {
public:
    InstructionCounter()
    {
        perf_event_attr attr{};
        attr.type = PERF_TYPE_HARDWARE;
        attr.size = sizeof attr;
        attr.config = PERF_COUNT_HW_INSTRUCTIONS;
        attr.exclude_kernel = 1;
        attr.exclude_hv = 1;
        fd_ = static_cast<int>(syscall(SYS_perf_event_open, &attr, 0, -1, -1, 0));
    }
    ~InstructionCounter()
    {
        if (fd_ >= 0)
            close(fd_);
    }
    bool Available() const { return fd_ >= 0; }
    long long Read() const
    {
        long long count = 0;
        if (fd_ < 0 || read(fd_, &count, sizeof count) != static_cast<ssize_t>(sizeof count))
            return 0;
        return count;
    }

private:
    int fd_ = -1;
};

enum Probe { kFloor, kRoad, kMovingRoad, kAssembly, kMovingAssembly, kPlatformProbe, kProbeCount };
const char *const kProbeNames[kProbeCount] = {"floor",    "road",            "moving road",
                                              "assembly", "moving assembly", "platform"};

double Median(std::vector<double> values)
{
    if (values.empty())
        return 0;
    std::nth_element(values.begin(), values.begin() + values.size() / 2, values.end());
    return values[values.size() / 2];
}

// The cost of one timed platform call's bookkeeping, to take off the sums.
double TimingOverheadNs()
{
    constexpr int kSamples = 100000;
    const long long start = NowNs();
    for (int i = 0; i < kSamples; ++i)
        benchmark::DoNotOptimize(NowNs());
    return static_cast<double>(NowNs() - start) / kSamples;
}

// One iteration of `probe`; `reply` is the moving assembly's copy of the reply.
void RunProbe(Probes &probes, int probe, Json::Value &reply)
{
    bool ok = false;
    switch (probe) {
    case kFloor: ok = probes.Floor(); break;
    case kRoad: ok = probes.Road(false); break;
    case kMovingRoad: ok = probes.Road(true); break;
    case kAssembly: ok = probes.Assembly(); break;
    case kMovingAssembly: ok = probes.MovingAssembly(reply); break;
    case kPlatformProbe: ok = probes.Road(true); break;
    }
    if (!ok) {
        std::fprintf(stderr, "benchmark: the %s probe failed\n", kProbeNames[probe]);
        std::exit(1);
    }
}

void RunProbe(Probes &probes, int probe)
{
    Json::Value reply;
    if (probe == kMovingAssembly)
        reply = probes.parsedReply;
    RunProbe(probes, probe, reply);
}

struct Interleaved {
    double ns[kProbeCount] = {};            // medians
    double instructions[kProbeCount] = {};  // medians; 0 where not counted
    // Within a moving road: the platform's operations, stat and readlink,
    // and the socket calls; and the floor's socket calls (medians).
    double roadNs[kCallKinds] = {};
    double roadCalls[kCallKinds] = {};
    double floorSocketNs = 0;
};

// The timed calls' sums of one probe, less the clock readings' own cost.
void TakeSums(const PlatformClock &clock, double overhead, std::vector<double> (&ns)[kCallKinds],
              double (&calls)[kCallKinds])
{
    for (int kind = 0; kind < kCallKinds; ++kind) {
        ns[kind].push_back(clock.ns[kind] - clock.calls[kind] * overhead);
        calls[kind] = static_cast<double>(clock.calls[kind]);
    }
}

Interleaved RunInterleaved(Probes &probes, int rounds)
{
    constexpr int kWarmUpRounds = 5;
    InstructionCounter counter;
    std::vector<double> ns[kProbeCount], instructions[kProbeCount];
    std::vector<double> roadNs[kCallKinds], floorNs[kCallKinds];
    double floorCalls[kCallKinds] = {};
    const double overhead = TimingOverheadNs();
    Interleaved figures;
    for (int round = -kWarmUpRounds; round < rounds; ++round) {
        for (int probe = 0; probe < kProbeCount; ++probe) {
            Json::Value reply;
            if (probe == kMovingAssembly)
                reply = probes.parsedReply;
            PlatformClock &clock = tPlatform;
            if (probe == kPlatformProbe) {
                // The floor's socket calls, timed the same way as the road's.
                clock = PlatformClock{};
                clock.on = true;
                RunProbe(probes, kFloor, reply);
                clock.on = false;
                if (round >= 0)
                    TakeSums(clock, overhead, floorNs, floorCalls);
            }
            clock = PlatformClock{};
            clock.on = probe == kPlatformProbe;
            const long long startInstructions = counter.Read();
            const long long start = NowNs();
            RunProbe(probes, probe, reply);
            const long long elapsed = NowNs() - start;
            const long long spent = counter.Read() - startInstructions;
            clock.on = false;
            if (round < 0)
                continue;
            if (probe == kPlatformProbe) {
                TakeSums(clock, overhead, roadNs, figures.roadCalls);
            } else {
                ns[probe].push_back(static_cast<double>(elapsed));
                if (counter.Available())
                    instructions[probe].push_back(static_cast<double>(spent));
            }
        }
    }
    for (int probe = 0; probe < kProbeCount; ++probe) {
        figures.ns[probe] = Median(ns[probe]);
        figures.instructions[probe] = Median(instructions[probe]);
    }
    for (int kind = 0; kind < kCallKinds; ++kind)
        figures.roadNs[kind] = Median(roadNs[kind]);
    figures.floorSocketNs = Median(floorNs[kSocketCall]);
    // What the road spends beyond the floor's own work, because the library
    // must: the platform's operations, stat and readlink, and the socket
    // calls that the road makes beyond the floor's (1024-byte reads, waits).
    figures.ns[kPlatformProbe] = figures.roadNs[kPlatformCall] + figures.roadNs[kSpaceCall] +
                                 std::max(0.0, figures.roadNs[kSocketCall] - figures.floorSocketNs);
    return figures;
}

// Peak memory of one whole-road call above what was live before it, per phase.
PhasePeaks RoadPeaks(Probes &probes, bool moving)
{
    probes.Road(moving);  // first-call allocations of the libraries stay out
    PhasePeaks peaks;
    if (!probes.Road(moving, &peaks)) {
        std::fprintf(stderr, "benchmark: the whole road failed\n");
        std::exit(1);
    }
    return peaks;
}

std::string LoadAverage()
{
    double load = 0;
    if (getloadavg(&load, 1) != 1)
        return "unknown";
    char text[32];
    std::snprintf(text, sizeof text, "%.2f", load);
    return text;
}

struct Options {
    int rounds = 200;
    int onlyProbe = -1;       // --only: run this probe alone (for profilers)
    std::string replyPath;    // --write-reply: save the reply text there and stop
    bool googleBenchmark = false;  // Google Benchmark's flags were given
};

[[noreturn]] void Usage(const char *program, const char *argument)
{
    std::fprintf(stderr,
                 "usage: %s [--interleaved=<rounds>] [--only=<probe>] [--write-reply=<path>] "
                 "[--benchmark_<flag>...]\nbad argument: %s\n",
                 program, argument);
    std::exit(2);
}

// Takes this program's options out of the arguments, leaving Google
// Benchmark's flags.
Options TakeOptions(int &argc, char **argv)
{
    const std::string_view kRounds = "--interleaved=", kOnly = "--only=", kReply = "--write-reply=";
    Options options;
    int kept = 1;
    for (int i = 1; i < argc; ++i) {
        const std::string_view argument = argv[i];
        const auto value = [&](std::string_view option) { return argv[i] + option.size(); };
        if (argument.substr(0, kRounds.size()) == kRounds) {
            char *end = nullptr;
            long rounds = std::strtol(value(kRounds), &end, 10);
            if (*end != '\0' || rounds < 1 || rounds > 1000000)
                Usage(argv[0], argv[i]);
            options.rounds = static_cast<int>(rounds);
        } else if (argument.substr(0, kOnly.size()) == kOnly) {
            const auto named = std::find_if(std::begin(kProbeNames), std::end(kProbeNames),
                                            [&](const char *name) { return value(kOnly) == std::string_view(name); });
            if (named == std::end(kProbeNames))
                Usage(argv[0], argv[i]);
            options.onlyProbe = static_cast<int>(named - std::begin(kProbeNames));
        } else if (argument.substr(0, kReply.size()) == kReply && *value(kReply) != '\0') {
            options.replyPath = value(kReply);
        } else if (argument.substr(0, 12) == "--benchmark_") {
            options.googleBenchmark = true;
            argv[kept++] = argv[i];
        } else {
            Usage(argv[0], argv[i]);
        }
    }
    argc = kept;
    return options;
}

}  // namespace

int main(int argc, char **argv)
{
    const Options options = TakeOptions(argc, argv);
    const int rounds = options.rounds;

    SpaceNodes nodes;
    const std::string reply = DescribeAppliance(nodes);
    if (!options.replyPath.empty()) {
        std::ofstream(options.replyPath) << reply;
        korvstandin::Reset();
        return 0;
    }
    Collector collector(reply);
    Probes probes(reply);
    gProbes = &probes;
    std::printf("reply: %zu bytes; %zu spaces with block-device nodes\n", reply.size(),
                nodes.paths.size());
    {
        // Both forms of the assembly must agree on this appliance too.
        Json::Value copied(Json::objectValue), moved(Json::objectValue);
        Json::Value taken = probes.parsedReply;
        if (!SNMPParseReplyData(probes.request, probes.parsedReply, copied) ||
            !SNMPParseReplyData(probes.request, std::move(taken), moved) || !(copied == moved)) {
            std::fprintf(stderr, "benchmark: the moving assembly differs from the copying one\n");
            return 1;
        }
    }

    double movingPeak = 0;
    if (kCountsAllocations) {
        for (bool moving : {false, true}) {
            const PhasePeaks peaks = RoadPeaks(probes, moving);
            const long long peak = *std::max_element(peaks.peak, peaks.peak + PhasePeaks::kPhaseCount);
            std::printf("peak memory of one %s road (every malloc): %lld bytes, %.2f x the reply;",
                        moving ? "moving" : "copying", peak, static_cast<double>(peak) / reply.size());
            for (int phase = 0; phase < PhasePeaks::kPhaseCount; ++phase)
                std::printf(" %s %.2f", PhasePeaks::kNames[phase],
                            static_cast<double>(peaks.peak[phase]) / reply.size());
            std::printf("\n");
            if (moving)
                movingPeak = static_cast<double>(peak) / reply.size();
        }
    }

    if (options.googleBenchmark)
        RunGoogleBenchmark(argc, argv);

    if (options.onlyProbe >= 0) {
        for (int round = 0; round < rounds; ++round)
            RunProbe(probes, options.onlyProbe);
        std::printf("ran the %s probe %d times\n", kProbeNames[options.onlyProbe], rounds);
        korvstandin::Reset();
        return 0;
    }

    const Interleaved run = RunInterleaved(probes, rounds);
    const double floor = run.ns[kFloor];
    std::printf("interleaved run, %d rounds, medians per iteration:\n", rounds);
    std::printf("  %-16s %10s %8s %14s %8s\n", "probe", "us", "/floor", "instructions", "/floor");
    for (int probe = 0; probe < kProbeCount; ++probe) {
        std::printf("  %-16s %10.1f %8.3f", kProbeNames[probe], run.ns[probe] / 1000,
                    run.ns[probe] / floor);
        if (run.instructions[probe] > 0)
            std::printf(" %14.0f %8.3f", run.instructions[probe],
                        run.instructions[probe] / run.instructions[kFloor]);
        std::printf("\n");
    }
    std::printf("  platform: %.1f us in %.0f operations; stat and readlink %.1f us in %.0f calls;\n"
                "            socket calls %.1f us in %.0f calls (the floor's %.1f us)\n",
                run.roadNs[kPlatformCall] / 1000, run.roadCalls[kPlatformCall],
                run.roadNs[kSpaceCall] / 1000, run.roadCalls[kSpaceCall],
                run.roadNs[kSocketCall] / 1000, run.roadCalls[kSocketCall],
                run.floorSocketNs / 1000);

    const double ownShare = (run.ns[kMovingRoad] - floor - run.ns[kPlatformProbe]) / floor;
    std::printf("road/floor: %.3f\n", run.ns[kRoad] / floor);
    std::printf("moving road/floor: %.3f\n", run.ns[kMovingRoad] / floor);
    std::printf("own share/floor: %.3f\n", ownShare);
    if (kCountsAllocations)
        std::printf("moving peak/reply: %.2f\n", movingPeak);
    else
        std::printf("moving peak/reply: not counted (sanitizer build)\n");
    std::printf("load average: %s\n", LoadAverage().c_str());
    korvstandin::Reset();
    return 0;
}
