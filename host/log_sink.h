// The reference host's log: answers the module's threshold query and writes
// each line with time, level name and source to standard error or a file.
// It also keeps the lines so that tests and the summary can read them.
// Thread-safe.
#ifndef ALERTMOD_HOST_LOG_SINK_H_
#define ALERTMOD_HOST_LOG_SINK_H_

#include <atomic>
#include <cstdint>
#include <cstdio>
#include <mutex>
#include <string>
#include <vector>

namespace refhost {

// The levels of the module's log lines.
constexpr int32_t kLogInfo = 25;
constexpr int32_t kLogWarning = 50;
constexpr int32_t kLogError = 75;

struct LogLine {
  uint32_t source = 0;
  int32_t level = 0;
  std::string text;
};

class LogSink {
 public:
  // Writes to `filePath`, or to standard error when it is empty. With `echo`
  // false the lines are only kept.
  LogSink(int32_t threshold, const std::string& filePath, bool echo);
  ~LogSink();

  int32_t Threshold() const { return m_threshold.load(); }
  void SetThreshold(int32_t threshold) { m_threshold.store(threshold); }

  void Write(uint32_t source, int32_t level, const std::string& text);

  std::vector<LogLine> Lines() const;
  // The kept lines from the `first`-th on (counted from 0), for readers that
  // follow the log as it grows.
  std::vector<LogLine> LinesFrom(size_t first) const;
  // True when some kept line contains `fragment`.
  bool Contains(const std::string& fragment) const;

  // "INFO", "WARN", "ERROR", or the number for other levels.
  static std::string LevelName(int32_t level);

 private:
  std::atomic<int32_t> m_threshold;
  bool m_echo;
  FILE* m_file = nullptr;
  mutable std::mutex m_mutex;
  std::vector<LogLine> m_lines;
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_LOG_SINK_H_
