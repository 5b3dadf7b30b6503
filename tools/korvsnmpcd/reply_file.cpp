#include "reply_file.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <fstream>
#include <memory>
#include <sstream>

#include <json/json.h>

#include "protocol/unit_log.h"

namespace korvsnmpcd {
namespace {

constexpr char kLogUnit[] = "reply_file";

bool SameTime(const timespec &a, const timespec &b)
{
    return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

// The JSON object in `text`, compacted; false when `text` holds no object.
bool CompactObject(const std::string &text, std::string &compact)
{
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    builder["failIfExtra"] = true;
    std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    Json::Value value;
    std::string errors;
    try {
        if (!reader->parse(text.data(), text.data() + text.size(), &value, &errors) ||
            !value.isObject())
            return false;
    } catch (const Json::Exception &) {
        return false;  // nesting too deep for the reader
    }
    Json::StreamWriterBuilder writer;
    writer["indentation"] = "";
    compact = Json::writeString(writer, value);
    return true;
}

}  // namespace

bool ReplayFile::Load()
{
    struct stat now {};
    bool present = stat(path_.c_str(), &now) == 0;
    bool unchanged = seen_ && present == present_ &&
                     (!present || (now.st_dev == read_.st_dev && now.st_ino == read_.st_ino &&
                                   now.st_size == read_.st_size &&
                                   SameTime(now.st_mtim, read_.st_mtim)));
    if (unchanged)
        return !reply_.empty();
    seen_ = true;
    present_ = present;
    read_ = now;

    std::ifstream in(path_, std::ios::binary);
    std::stringstream text;
    text << in.rdbuf();
    if (!present || !in) {
        KORVSNMP_LOG(LOG_ERR, "Cannot read the reply to replay from [%s]", path_.c_str());
        return false;
    }
    std::string compact;
    if (!CompactObject(text.str(), compact)) {
        KORVSNMP_LOG(LOG_ERR, "[%s] holds no JSON object to replay", path_.c_str());
        return false;
    }
    reply_ = std::move(compact);
    return true;
}

const std::string &ReplayFile::Reply()
{
    Load();
    return reply_;
}

bool RecordReply(const std::string &path, const std::string &reply)
{
    const std::string partial = path + ".partial";
    {
        std::ofstream out(partial, std::ios::binary | std::ios::trunc);
        out << reply << '\n';
        out.close();
        if (!out) {
            KORVSNMP_LOG(LOG_ERR, "Cannot write the reply to record into [%s]", partial.c_str());
            unlink(partial.c_str());
            return false;
        }
    }
    if (rename(partial.c_str(), path.c_str()) != 0) {
        KORVSNMP_LOG(LOG_ERR, "Cannot put the recorded reply in place as [%s]: %m", path.c_str());
        unlink(partial.c_str());
        return false;
    }
    KORVSNMP_LOG(LOG_NOTICE, "Recorded the statistics reply in [%s]", path.c_str());
    return true;
}

}  // namespace korvsnmpcd
