#include "pid_file.h"

#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <sstream>

#include "protocol/unit_log.h"

namespace korvsnmpcd {
namespace {

constexpr char kLogUnit[] = "pid_file";

}  // namespace

bool PidFile::Create(const std::string &path)
{
    const std::string partial = path + ".partial";
    const std::string content = std::to_string(getpid()) + "\n";
    std::ofstream out(partial, std::ios::trunc);
    out << content;
    out.close();
    if (!out || rename(partial.c_str(), path.c_str()) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot write the process id file [%s]: %m", path.c_str());
        unlink(partial.c_str());
        return false;
    }
    path_ = path;
    content_ = content;
    return true;
}

PidFile::~PidFile()
{
    if (path_.empty())
        return;
    std::ifstream in(path_);
    std::stringstream now;
    now << in.rdbuf();
    if (now.str() == content_)
        unlink(path_.c_str());
}

}  // namespace korvsnmpcd
