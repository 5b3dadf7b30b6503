// Host description files: a JSON text that describes a host for the
// stand-in (docs/host-description.md gives the schema). A process whose
// environment names such a file in KORVPLATFORM_HOST gets every platform
// answer from it; the stand-in reads it at the process's first platform call.
#ifndef KORV_STANDIN_HOST_FILE_H
#define KORV_STANDIN_HOST_FILE_H

#include <string>

#include "korv_standin.h"

namespace korvstandin {

inline constexpr char kHostFileVariable[] = "KORVPLATFORM_HOST";

// Largest host file read, in bytes.
inline constexpr size_t kHostFileMaxBytes = 16 * 1024 * 1024;

// Reads the description at `path` into `host` (replaced whole). False when
// the file cannot be read or breaks the schema, with `error` naming the
// member and what is wrong ("interfaces[3].name: longer than 15
// characters"); `host` is then unspecified. Throws only std::bad_alloc.
bool ReadHostFile(const std::string &path, HostDescription &host, std::string &error);

// Parses a description from `text`; as ReadHostFile.
bool ParseHostDescription(const std::string &text, HostDescription &host, std::string &error);

// The description as a host file's text. What the schema cannot say (the
// malformed answers and per-item failures of test descriptions, files other
// than the strings file) is left out.
std::string HostFileText(const HostDescription &host);

}  // namespace korvstandin

#endif
