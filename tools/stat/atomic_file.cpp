#include "atomic_file.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <vector>

#include "protocol/unique_fd.h"

namespace korvstat {
namespace {

constexpr mode_t kReadableByAll = 0644;

// The new file's name until it takes the place of the old one.
class TemporaryFile {
public:
    explicit TemporaryFile(const std::string &path)
    {
        const size_t slash = path.rfind('/');
        const std::string directory = slash == std::string::npos ? "" : path.substr(0, slash + 1);
        const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
        std::string pattern = directory + "." + name + ".XXXXXX";
        std::vector<char> buffer(pattern.begin(), pattern.end());
        buffer.push_back('\0');
        fd_ = korvproto::UniqueFd(mkstemp(buffer.data()));
        if (fd_.Valid())
            path_ = buffer.data();
    }
    ~TemporaryFile()
    {
        if (!path_.empty())
            unlink(path_.c_str());
    }
    TemporaryFile(const TemporaryFile &) = delete;
    TemporaryFile &operator=(const TemporaryFile &) = delete;

    int Fd() const { return fd_.Get(); }
    const std::string &Path() const { return path_; }
    void Kept() { path_.clear(); }

private:
    korvproto::UniqueFd fd_;
    std::string path_;
};

bool WriteAll(int fd, const std::string &content)
{
    for (size_t done = 0; done < content.size();) {
        const ssize_t written = write(fd, content.data() + done, content.size() - done);
        if (written < 0 && errno == EINTR)
            continue;
        if (written <= 0)
            return false;
        done += static_cast<size_t>(written);
    }
    return true;
}

}  // namespace

bool ReplaceFile(const std::string &path, const std::string &content, std::string &error)
{
    TemporaryFile file(path);
    if (file.Fd() < 0) {
        error = "cannot create a file beside " + path + ": " + std::strerror(errno);
        return false;
    }
    if (!WriteAll(file.Fd(), content) || fsync(file.Fd()) != 0 || fchmod(file.Fd(), kReadableByAll) != 0) {
        error = "cannot write " + file.Path() + ": " + std::strerror(errno);
        return false;
    }
    if (rename(file.Path().c_str(), path.c_str()) != 0) {
        error = "cannot rename " + file.Path() + " to " + path + ": " + std::strerror(errno);
        return false;
    }
    file.Kept();
    return true;
}

}  // namespace korvstat
