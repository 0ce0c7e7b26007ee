#include "alertmod/platform/utc_time.h"

#include <cstdlib>

namespace hx {
namespace platform {

bool UtcFields(int64_t seconds, std::tm* fields) {
  if (fields == nullptr) return false;
  const time_t value = static_cast<time_t>(seconds);
  std::tm broken{};
  if (gmtime_r(&value, &broken) == nullptr) return false;
  *fields = broken;
  return true;
}

int64_t UtcSeconds(const std::tm& fields) {
  // timegm normalises its argument; work on a copy so the caller's stays.
  std::tm copy = fields;
  return static_cast<int64_t>(timegm(&copy));
}

std::string FormatUtc(int64_t seconds, const char* format) {
  std::tm fields{};
  if (format == nullptr || !UtcFields(seconds, &fields)) return std::string();
  char text[128];
  const size_t length = strftime(text, sizeof(text), format, &fields);
  return std::string(text, length);
}

std::string TempDirectoryPath() {
  const char* fromEnvironment = std::getenv("TMPDIR");
  std::string path =
      (fromEnvironment != nullptr && *fromEnvironment != '\0') ? fromEnvironment : "/tmp/";
  if (path.back() != '/') path.push_back('/');
  return path;
}

}  // namespace platform
}  // namespace hx
