#include "host/log_sink.h"

#include <sys/time.h>

#include <ctime>

namespace refhost {
namespace {

std::string TimeStamp() {
  timeval now{};
  gettimeofday(&now, nullptr);
  tm local{};
  localtime_r(&now.tv_sec, &local);
  char text[64];
  size_t n = strftime(text, sizeof(text), "%Y-%m-%d %H:%M:%S", &local);
  snprintf(text + n, sizeof(text) - n, ".%03ld", static_cast<long>(now.tv_usec / 1000));
  return text;
}

}  // namespace

LogSink::LogSink(int32_t threshold, const std::string& filePath, bool echo)
    : m_threshold(threshold), m_echo(echo) {
  if (!filePath.empty()) m_file = fopen(filePath.c_str(), "a");
}

LogSink::~LogSink() {
  if (m_file != nullptr) fclose(m_file);
}

std::string LogSink::LevelName(int32_t level) {
  switch (level) {
    case kLogInfo:
      return "INFO";
    case kLogWarning:
      return "WARN";
    case kLogError:
      return "ERROR";
    default:
      return std::to_string(level);
  }
}

void LogSink::Write(uint32_t source, int32_t level, const std::string& text) {
  std::lock_guard<std::mutex> lock(m_mutex);
  m_lines.push_back(LogLine{source, level, text});
  if (!m_echo) return;
  FILE* out = m_file != nullptr ? m_file : stderr;
  fprintf(out, "%s %-5s [0x%X] %s\n", TimeStamp().c_str(), LevelName(level).c_str(), source,
          text.c_str());
  fflush(out);
}

std::vector<LogLine> LogSink::Lines() const {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_lines;
}

std::vector<LogLine> LogSink::LinesFrom(size_t first) const {
  std::lock_guard<std::mutex> lock(m_mutex);
  if (first >= m_lines.size()) return {};
  return std::vector<LogLine>(m_lines.begin() + static_cast<std::ptrdiff_t>(first), m_lines.end());
}

bool LogSink::Contains(const std::string& fragment) const {
  std::lock_guard<std::mutex> lock(m_mutex);
  for (const LogLine& line : m_lines) {
    if (line.text.find(fragment) != std::string::npos) return true;
  }
  return false;
}

}  // namespace refhost
