// Replacing a file so that a reader sees either the old or the whole new
// content, never a part (node_exporter's textfile collector reads at any time).
#ifndef KORVSNMP_STAT_ATOMIC_FILE_H
#define KORVSNMP_STAT_ATOMIC_FILE_H

#include <string>

namespace korvstat {

// Writes `content` to a new file in the directory of `path` (".NAME.XXXXXX",
// which a "*.prom" pattern does not match), flushes it to the disk, makes it
// readable by all (0644) and renames it to `path`. On failure `path` is left
// as it was, the new file is removed, and `error` says what failed.
bool ReplaceFile(const std::string &path, const std::string &content, std::string &error);

}  // namespace korvstat

#endif
