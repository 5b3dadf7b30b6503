// Texts in the platform's fixed-size fields. The platform may fill a field to
// its last byte without a NUL: a field's text is what comes before its first
// NUL, or the whole field. Every such field is read through FieldText.
#ifndef KORVSNMP_PLATFORM_TEXT_H
#define KORVSNMP_PLATFORM_TEXT_H

#include <cstddef>
#include <cstring>
#include <string>

namespace korvread {

// The text of the `size` bytes at `field`.
inline std::string FieldText(const char *field, size_t size)
{
    return std::string(field, strnlen(field, size));
}

// The text of a character array field of a platform record.
template <size_t N>
std::string FieldText(const char (&field)[N])
{
    return FieldText(field, N);
}

}  // namespace korvread

#endif
