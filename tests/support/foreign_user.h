// Real processes of another user for the tests of who the collector and its
// clients believe: a child forked from the test program drops to uid and
// gid 65534 (nobody) before it does its work. Only root can do that; the
// tests skip elsewhere (see CanRunAsNobody).
#ifndef KORVTEST_FOREIGN_USER_H
#define KORVTEST_FOREIGN_USER_H

#include <sys/types.h>

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "protocol/unique_fd.h"

namespace korvtest {

constexpr uid_t kNobody = 65534;

// Whether this process may run children as kNobody (it runs as root).
bool CanRunAsNobody();

// A directory made as /tmp is (mode 1777: anyone may add, only the owner
// removes), removed with what it holds when the object goes.
class StickyDirectory {
public:
    StickyDirectory();
    ~StickyDirectory();
    StickyDirectory(const StickyDirectory &) = delete;
    StickyDirectory &operator=(const StickyDirectory &) = delete;

    const std::string &Path() const { return path_; }

private:
    std::string path_;
};

// `work` run in a child process as kNobody; what it returns comes back as
// Result(). The child is killed, by its pid, if it still runs when the
// object goes, and also when the test program dies.
class AsNobody {
public:
    explicit AsNobody(const std::function<std::string()> &work);
    ~AsNobody();
    AsNobody(const AsNobody &) = delete;
    AsNobody &operator=(const AsNobody &) = delete;

    // What `work` returned, once the child has exited with status 0;
    // nothing when it failed, or did not end within kProcessWait.
    std::optional<std::string> Result();

private:
    pid_t pid_ = -1;
    korvproto::UniqueFd output_;
};

// A listener of kNobody on the UNIX socket `path`, in a child process, posing
// as the collector: it sends `reply` to every connection at once, then counts
// the bytes that the client sends until it closes.
class NobodyListener {
public:
    NobodyListener(const std::string &path, const std::string &reply);
    ~NobodyListener();
    NobodyListener(const NobodyListener &) = delete;
    NobodyListener &operator=(const NobodyListener &) = delete;

    // Whether it listens, within kProcessWait.
    bool Listening();
    // The byte counts of the next `connections` connections to end, as
    // many as end within kProcessWait each.
    std::vector<size_t> Received(size_t connections);
    pid_t Pid() const { return pid_; }

private:
    pid_t pid_ = -1;
    korvproto::UniqueFd reports_;
};

}  // namespace korvtest

#endif
