#include "output_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <vector>

#include "protocol/unique_fd.h"

namespace korvstat {
namespace {

constexpr mode_t kFileMode = 0644;
constexpr char kTemporarySuffix[] = ".XXXXXX";

std::string Failed(const std::string &what, const std::string &path)
{
    return std::string("cannot ") + what + " " + path + ": " + std::strerror(errno);
}

}  // namespace

bool ReplaceFile(const std::string &path, const std::string &text, std::string &error)
{
    std::vector<char> temporary(path.begin(), path.end());
    temporary.insert(temporary.end(), kTemporarySuffix, kTemporarySuffix + sizeof kTemporarySuffix);
    korvproto::UniqueFd file(mkstemp(temporary.data()));
    if (!file.Valid()) {
        error = Failed("create a file beside", path);
        return false;
    }
    const std::string written(temporary.data());
    size_t done = 0;
    bool ok = fchmod(file.Get(), kFileMode) == 0;
    while (ok && done < text.size()) {
        const ssize_t now = write(file.Get(), text.data() + done, text.size() - done);
        if (now < 0 && errno == EINTR)
            continue;
        ok = now > 0;
        if (ok)
            done += static_cast<size_t>(now);
    }
    ok = ok && fsync(file.Get()) == 0;
    if (ok)
        ok = close(file.Release()) == 0;
    if (!ok) {
        error = Failed("write", written);
        unlink(written.c_str());
        return false;
    }
    if (rename(written.c_str(), path.c_str()) != 0) {
        error = Failed("rename " + written + " to", path);
        unlink(written.c_str());
        return false;
    }
    return true;
}

}  // namespace korvstat
