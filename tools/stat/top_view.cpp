#include "top_view.h"

#include <curses.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/signalfd.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <clocale>
#include <iostream>
#include <memory>
#include <thread>

#include <json/reader.h>

#include "protocol/collector_protocol.h"
#include "protocol/unique_fd.h"
#include "top_layout.h"

namespace korvstat {
namespace {

using korvproto::UniqueFd;
using top::Command;

constexpr char kResultMember[] = "result";
constexpr char kErrorMember[] = "error";
constexpr size_t kReadChunk = 65536;

// The sampler's side: a frame of compact JSON per sample, {"result": ...}
// or {"error": "..."}, until the pipe closes. Never returns.
[[noreturn]] void ServeSamples(int out, pid_t viewer, std::chrono::milliseconds interval, const Sampler &sample)
{
    prctl(PR_SET_PDEATHSIG, SIGTERM);
    if (getppid() != viewer)
        _exit(0);
    // The library's messages would land on the screen; the view shows the error instead.
    const int null = open("/dev/null", O_WRONLY | O_CLOEXEC);
    if (null >= 0)
        dup2(null, STDERR_FILENO);
    signal(SIGPIPE, SIG_DFL);
    for (;;) {
        Json::Value result, message(Json::objectValue);
        std::string error;
        if (sample(result, error))
            message[kResultMember] = std::move(result);
        else
            message[kErrorMember] = error;
        const std::string frame = korvproto::EncodeFrame(korvproto::CompactJson(message));
        for (size_t sent = 0; sent < frame.size();) {
            const ssize_t n = write(out, frame.data() + sent, frame.size() - sent);
            if (n < 0 && errno == EINTR)
                continue;
            if (n <= 0)
                _exit(0);
            sent += static_cast<size_t>(n);
        }
        std::this_thread::sleep_for(interval);  // the sampler's own pace; SIGTERM ends it
    }
}

// The sampler child, stopped by its process id when the view goes.
class SamplerProcess {
public:
    SamplerProcess(std::chrono::milliseconds interval, const Sampler &sample)
    {
        int ends[2];
        if (pipe2(ends, O_CLOEXEC) != 0)
            return;
        UniqueFd readEnd(ends[0]), writeEnd(ends[1]);
        const pid_t viewer = getpid();
        pid_ = fork();
        if (pid_ == 0) {
            readEnd.Reset();
            ServeSamples(writeEnd.Get(), viewer, interval, sample);
        }
        if (pid_ > 0) {
            fcntl(readEnd.Get(), F_SETFL, O_NONBLOCK);
            samples_ = std::move(readEnd);
        }
    }
    ~SamplerProcess()
    {
        if (pid_ > 0 && kill(pid_, SIGTERM) == 0)
            waitpid(pid_, nullptr, 0);
    }
    SamplerProcess(const SamplerProcess &) = delete;
    SamplerProcess &operator=(const SamplerProcess &) = delete;

    bool Running() const { return pid_ > 0 && samples_.Valid(); }
    int Samples() const { return samples_.Get(); }

private:
    pid_t pid_ = -1;
    UniqueFd samples_;
};

// SIGINT and SIGTERM as a descriptor to poll, blocked while it lives.
class StopSignals {
public:
    StopSignals()
    {
        sigset_t stops;
        sigemptyset(&stops);
        sigaddset(&stops, SIGINT);
        sigaddset(&stops, SIGTERM);
        sigprocmask(SIG_BLOCK, &stops, &previous_);
        fd_ = UniqueFd(signalfd(-1, &stops, SFD_CLOEXEC | SFD_NONBLOCK));
    }
    ~StopSignals() { sigprocmask(SIG_SETMASK, &previous_, nullptr); }
    StopSignals(const StopSignals &) = delete;
    StopSignals &operator=(const StopSignals &) = delete;
    int Get() const { return fd_.Get(); }

private:
    sigset_t previous_;
    UniqueFd fd_;
};

// The terminal in curses mode while it lives.
class Curses {
public:
    Curses()
    {
        std::setlocale(LC_ALL, "");  // UTF-8 names
        initscr();
        cbreak();
        noecho();
        nonl();
        keypad(stdscr, TRUE);
        nodelay(stdscr, TRUE);
        curs_set(0);
    }
    ~Curses() { endwin(); }
    Curses(const Curses &) = delete;
    Curses &operator=(const Curses &) = delete;
};

// Gathers the sampler's frames; keeps the newest whole one.
class SampleReader {
public:
    // Reads what the pipe holds; false when the sampler is gone.
    bool Read(int fd)
    {
        char chunk[kReadChunk];
        for (;;) {
            const ssize_t n = read(fd, chunk, sizeof chunk);
            if (n > 0) {
                pending_.append(chunk, static_cast<size_t>(n));
                continue;
            }
            if (n < 0 && errno == EINTR)
                continue;
            Take();
            return n < 0 && errno == EAGAIN;
        }
    }
    const Json::Value &Result() const { return result_; }
    const std::string &Status() const { return status_; }

private:
    void Take()
    {
        const size_t prefix = korvproto::kFramePrefixBytes;
        while (pending_.size() >= prefix) {
            const size_t length = korvproto::DecodeFramePrefix(pending_.data());
            if (pending_.size() - prefix < length)
                return;
            const std::string body = pending_.substr(prefix, length);
            pending_.erase(0, prefix + length);
            Json::Value message;
            std::string errors;
            const std::unique_ptr<Json::CharReader> reader(Json::CharReaderBuilder().newCharReader());
            if (!reader->parse(body.data(), body.data() + body.size(), &message, &errors) ||
                !message.isObject()) {
                status_ = "a sample could not be read";
            } else if (message.isMember(kResultMember)) {
                result_ = std::move(message[kResultMember]);
                status_.clear();
            } else {
                status_ = message[kErrorMember].asString() + " (the last sample stays)";
            }
        }
    }

    std::string pending_;
    Json::Value result_;
    std::string status_ = "waiting for the first sample";
};

bool ToCommand(int key, Command &command)
{
    switch (key) {
    case 'q': case 'Q': command = Command::Quit; return true;
    case '\t': command = Command::NextView; return true;
    case KEY_BTAB: command = Command::PreviousView; return true;
    case '1': case 'd': command = Command::ShowDisks; return true;
    case '2': case 'i': command = Command::ShowInterfaces; return true;
    case '3': case 'v': command = Command::ShowVolumes; return true;
    case '4': case 'l': command = Command::ShowLuns; return true;
    case '<': case KEY_LEFT: command = Command::SortLeft; return true;
    case '>': case KEY_RIGHT: command = Command::SortRight; return true;
    case 'b': command = Command::SortBusiest; return true;
    case KEY_UP: case 'k': command = Command::LineUp; return true;
    case KEY_DOWN: case 'j': command = Command::LineDown; return true;
    case KEY_PPAGE: command = Command::PageUp; return true;
    case KEY_NPAGE: case ' ': command = Command::PageDown; return true;
    case KEY_HOME: case 'g': command = Command::Top; return true;
    default: return false;
    }
}

void Draw(const std::vector<std::string> &lines)
{
    erase();
    for (size_t i = 0; i < lines.size(); ++i)
        mvaddstr(static_cast<int>(i), 0, lines[i].c_str());
    if (lines.size() > top::kTitleLine)
        mvchgat(static_cast<int>(top::kTitleLine), 0, -1, A_REVERSE, 0, nullptr);
    refresh();
}

size_t PageRows()
{
    return LINES > static_cast<int>(top::kTitleLine) + 1 ? static_cast<size_t>(LINES) - top::kTitleLine - 1 : 0;
}

}  // namespace

int RunTop(std::chrono::milliseconds interval, const Sampler &sample)
{
    if (isatty(STDIN_FILENO) != 1 || isatty(STDOUT_FILENO) != 1) {
        std::cerr << "korvsnmp-stat: --top needs a terminal\n";
        return 1;
    }
    SamplerProcess sampler(interval, sample);
    if (!sampler.Running()) {
        std::cerr << "korvsnmp-stat: the sampler could not be started\n";
        return 1;
    }
    const StopSignals stops;
    const Curses curses;
    SampleReader reader;
    top::State state;
    bool samplerGone = false;
    for (;;) {
        const std::string status = samplerGone ? "the sampler stopped" : reader.Status();
        Draw(top::Screen(reader.Result(), state, status, static_cast<size_t>(COLS), static_cast<size_t>(LINES)));
        pollfd ready[] = {{STDIN_FILENO, POLLIN, 0}, {stops.Get(), POLLIN, 0},
                          {samplerGone ? -1 : sampler.Samples(), POLLIN, 0}};
        // A resize interrupts the wait (SIGWINCH); getch() then gives KEY_RESIZE.
        if (poll(ready, std::size(ready), -1) < 0 && errno != EINTR)
            return 1;
        if (ready[1].revents != 0)
            return 0;
        if (ready[2].revents != 0 && !reader.Read(sampler.Samples()))
            samplerGone = true;
        for (int key; (key = getch()) != ERR;) {
            Command command;
            if (ToCommand(key, command) && !top::Apply(command, PageRows(), state))
                return 0;
        }
    }
}

}  // namespace korvstat
