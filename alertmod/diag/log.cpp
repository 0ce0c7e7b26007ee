#include "alertmod/diag/log.h"

#include <cstdarg>
#include <cstdio>

namespace hx {

int32_t LogToHost(uint32_t source, core::HostCallbackFn callback, int32_t level, const char* format,
                  ...) {
  if (callback == nullptr || format == nullptr) return 0;

  // The threshold is asked for every message so that the host may change its
  // log level at any moment.
  core::HostRequest query =
      core::MakeHostRequest(source, core::kClassLog, core::kCodeLogLevelQuery);
  int32_t threshold = callback(&query, nullptr);
  if (level < threshold) return 0;

  char text[kMaxLogTextLength + 1];
  va_list args;
  va_start(args, format);
  int needed = vsnprintf(text, sizeof(text), format, args);
  va_end(args);
  if (needed < 1) return 0;
  uint32_t length = needed > kMaxLogTextLength ? kMaxLogTextLength : static_cast<uint32_t>(needed);

  core::HostRequest write = core::MakeHostRequest(source, core::kClassLog, core::kCodeLogWrite);
  write.length = length;
  write.data = text;
  write.extSize = core::kRequestExtSize;
  write.extVersion = core::kRequestExtVersion;
  write.extValue = level;
  return callback(&write, nullptr);
}

LogImpl::LogImpl() : m_fileName("debugsrvlog.txt") {}

LogImpl::~LogImpl() {
  CloseStream();
}

std::ostream& LogImpl::Stream() {
  if (!m_file.is_open()) OpenStream();
  if (!m_stream.good()) {
    CloseStream();
    OpenStream();
  }
  return m_stream;
}

void LogImpl::SetFileName(const char* name) {
  m_fileName = name ? name : "";
  if (m_file.is_open()) CloseStream();
}

void LogImpl::OpenStream() {
  m_stream.clear();
  if (!platform::File::OpenForWriting(m_fileName, true, &m_file).ok()) {
    m_stream.setstate(std::ios::failbit);
  }
}

void LogImpl::CloseStream() {
  // A failed close may have lost lines, so it marks the stream failed.
  if (m_file.is_open() && !m_file.Close().ok()) m_stream.setstate(std::ios::failbit);
}

std::shared_ptr<ILgr> GetLgr() {
  // The first call happens while Load builds the manager, before the module
  // has any other thread; a function-local static is safe regardless.
  static std::shared_ptr<ILgr> logger = std::make_shared<LogImpl>();
  return logger;
}

}  // namespace hx
