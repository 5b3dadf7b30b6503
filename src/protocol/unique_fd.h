// Owns one file descriptor and closes it, once, when it goes.
#ifndef KORVPROTO_UNIQUE_FD_H
#define KORVPROTO_UNIQUE_FD_H

#include <unistd.h>

#include <utility>

namespace korvproto {

class UniqueFd {
public:
    UniqueFd() = default;
    explicit UniqueFd(int fd) : fd_(fd) {}
    ~UniqueFd() { Reset(); }
    UniqueFd(UniqueFd &&other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
    UniqueFd &operator=(UniqueFd &&other) noexcept
    {
        if (this != &other) {
            Reset();
            fd_ = std::exchange(other.fd_, -1);
        }
        return *this;
    }
    UniqueFd(const UniqueFd &) = delete;
    UniqueFd &operator=(const UniqueFd &) = delete;

    int Get() const { return fd_; }
    bool Valid() const { return fd_ >= 0; }
    // Hands the descriptor over without closing it; the holder is empty after.
    int Release() { return std::exchange(fd_, -1); }
    // Closes the descriptor held, if any; the holder is empty after.
    void Reset()
    {
        if (fd_ >= 0)
            close(fd_);
        fd_ = -1;
    }

private:
    int fd_ = -1;
};

}  // namespace korvproto

#endif
