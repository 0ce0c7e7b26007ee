// Conversions between seconds since 1970 and UTC calendar fields, the text
// form of a UTC time, and the directory for temporary files.
//
// Pure functions of their arguments (TempDirectoryPath reads the
// environment); any thread.
#ifndef ALERTMOD_PLATFORM_UTC_TIME_H_
#define ALERTMOD_PLATFORM_UTC_TIME_H_

#include <cstdint>
#include <ctime>
#include <string>

namespace hx {
namespace platform {

// Breaks `seconds` since 1970-01-01 UTC into calendar fields (tm conventions:
// years since 1900, months 0-11). Returns false, leaving `fields` unchanged,
// when the time cannot be represented.
bool UtcFields(int64_t seconds, std::tm* fields);

// The inverse of UtcFields: seconds since 1970 of the UTC calendar time in
// `fields` (tm conventions; out-of-range fields are carried over).
int64_t UtcSeconds(const std::tm& fields);

// `seconds` since 1970 as UTC text in the strftime `format`; empty when the
// time cannot be represented or the text exceeds 127 characters.
std::string FormatUtc(int64_t seconds, const char* format);

// The directory for temporary files, ending in a slash: $TMPDIR when set and
// not empty, otherwise "/tmp/".
std::string TempDirectoryPath();

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_UTC_TIME_H_
