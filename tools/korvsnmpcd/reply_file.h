// Statistics replies kept in files: a recorded reply served in place of the
// host's (korvsnmpcd --replay), and the recording of one (--record).
#ifndef KORVSNMPCD_REPLY_FILE_H
#define KORVSNMPCD_REPLY_FILE_H

#include <sys/stat.h>

#include <string>

#include "statistics_source.h"

namespace korvsnmpcd {

// Serves the JSON object in a file as the statistics reply, compacted. The
// file is looked at on every request and read again when it changed (another
// file put in its place, another size or modification time), so that a test
// or a demonstration can move the counters while the daemon runs.
class ReplayFile : public StatisticsSource {
public:
    explicit ReplayFile(std::string path) : path_(std::move(path)) {}

    // Reads the file; false (logged) when it cannot be read or holds no JSON object.
    bool Load();

    void Tick() override {}
    // The file's reply. When the file changed and its new content cannot be
    // read or is no JSON object, the last good reply (logged once per change).
    const std::string &Reply() override;

private:
    std::string path_;
    struct stat read_ {};  // the file as it was when last looked at
    bool seen_ = false;     // whether the file was looked at yet
    bool present_ = false;  // whether it existed then
    std::string reply_;
};

// Writes `reply` (a reply body) and a line feed to `path`, replacing the
// file in one step; false (logged) when it cannot.
bool RecordReply(const std::string &path, const std::string &reply);

}  // namespace korvsnmpcd

#endif
