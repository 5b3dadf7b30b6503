// korvsnmp-stat --output: a file that readers (node_exporter's textfile
// collector) only ever see whole.
#ifndef KORVSNMP_STAT_OUTPUT_FILE_H
#define KORVSNMP_STAT_OUTPUT_FILE_H

#include <string>

namespace korvstat {

// Replaces `path` with `text` in one step: writes a temporary file beside it
// (same directory, mode 0644), flushes it to disk and renames it over `path`.
// False with `error` saying what failed; the temporary file is then removed
// and `path` is as it was.
bool ReplaceFile(const std::string &path, const std::string &text, std::string &error);

}  // namespace korvstat

#endif
