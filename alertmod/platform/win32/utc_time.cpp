#include "alertmod/platform/utc_time.h"

#include <windows.h>

#include <time.h>

namespace hx {
namespace platform {

bool UtcFields(int64_t seconds, std::tm* fields) {
  if (fields == nullptr) return false;
  const __time64_t value = static_cast<__time64_t>(seconds);
  std::tm broken{};
  if (_gmtime64_s(&broken, &value) != 0) return false;
  *fields = broken;
  return true;
}

int64_t UtcSeconds(const std::tm& fields) {
  // _mkgmtime64 normalises its argument; work on a copy so the caller's stays.
  std::tm copy = fields;
  return static_cast<int64_t>(_mkgmtime64(&copy));
}

std::string FormatUtc(int64_t seconds, const char* format) {
  std::tm fields{};
  if (format == nullptr || !UtcFields(seconds, &fields)) return std::string();
  char text[128];
  const size_t length = strftime(text, sizeof(text), format, &fields);
  return std::string(text, length);
}

std::string TempDirectoryPath() {
  // GetTempPathA answers TMP, TEMP, USERPROFILE or the Windows folder, in
  // that order, always ending in a backslash.
  char buffer[MAX_PATH + 1];
  const DWORD length = GetTempPathA(sizeof(buffer), buffer);
  if (length == 0 || length > sizeof(buffer)) return ".\\";
  return std::string(buffer, length);
}

}  // namespace platform
}  // namespace hx
