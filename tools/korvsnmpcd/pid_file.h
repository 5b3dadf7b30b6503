// A file that holds the daemon's process id, so that an operator or a
// script can stop that one daemon with `kill $(cat PATH)`.
#ifndef KORVSNMPCD_PID_FILE_H
#define KORVSNMPCD_PID_FILE_H

#include <string>

namespace korvsnmpcd {

class PidFile {
public:
    PidFile() = default;
    // Removes the file if it still holds this process's id.
    ~PidFile();
    PidFile(const PidFile &) = delete;
    PidFile &operator=(const PidFile &) = delete;

    // Writes this process's id and a line feed to `path`, replacing any file
    // there in one step; false (logged) when it cannot.
    bool Create(const std::string &path);

private:
    std::string path_;
    std::string content_;
};

}  // namespace korvsnmpcd

#endif
