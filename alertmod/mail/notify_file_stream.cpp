#include "alertmod/mail/notify_file_stream.h"

#include <cstring>

#include "alertmod/diag/log.h"
#include "alertmod/platform/file_system.h"

namespace hx {
namespace {

// Bytes gathered before they are written out; a message is mostly lines of
// under 80 bytes.
constexpr size_t kBufferBytes = 65536;
// Bytes taken at a time from a stream buffer being copied.
constexpr size_t kCopyChunkBytes = 4096;

}  // namespace

NotifyFileStreamImpl::NotifyFileStreamImpl(core::HostCallbackFn callback, platform::Env& env)
    : m_callback(callback), m_env(env) {}

NotifyFileStreamImpl::~NotifyFileStreamImpl() {
  if (m_file.is_open()) Close();
}

bool NotifyFileStreamImpl::Open(const std::string& path, std::ios_base::openmode mode) {
  if (m_file.is_open()) Close();
  m_buffer.clear();
  m_flushedBytes = 0;
  const bool append = (mode & std::ios_base::app) != 0;
  m_failed = !m_env.NewWritableFile(path, append, &m_file).ok();
  return !m_failed;
}

void NotifyFileStreamImpl::Close() {
  if (!m_file.is_open()) {
    m_failed = true;
    return;
  }
  Flush();
  if (!m_file.Close().ok()) m_failed = true;
}

bool NotifyFileStreamImpl::IsGood() const {
  return !m_failed;
}

bool NotifyFileStreamImpl::Failed() const {
  return m_failed;
}

void NotifyFileStreamImpl::Append(const char* data, size_t size) {
  m_buffer.append(data, size);
  if (m_buffer.size() >= kBufferBytes) Flush();
}

void NotifyFileStreamImpl::Flush() {
  if (m_buffer.empty()) return;
  size_t written = 0;
  if (!m_file.Write(m_buffer.data(), m_buffer.size(), &written).ok() || written < m_buffer.size()) {
    m_failed = true;
  }
  m_flushedBytes += written;
  m_buffer.clear();
}

INotifyFileStream& NotifyFileStreamImpl::WriteStream(std::streambuf* buffer) {
  if (m_failed || buffer == nullptr) return *this;
  char chunk[kCopyChunkBytes];
  std::streamsize got = 0;
  while (!m_failed && (got = buffer->sgetn(chunk, sizeof(chunk))) > 0) {
    Append(chunk, static_cast<size_t>(got));
  }
  return *this;
}

INotifyFileStream& NotifyFileStreamImpl::WriteUInt(uint32_t value) {
  if (!m_failed) WriteString(std::to_string(value));
  return *this;
}

INotifyFileStream& NotifyFileStreamImpl::WriteText(const char* text) {
  if (!m_failed && text != nullptr) Append(text, strlen(text));
  return *this;
}

INotifyFileStream& NotifyFileStreamImpl::WriteString(const std::string& text) {
  if (!m_failed) Append(text.data(), text.size());
  return *this;
}

uint64_t NotifyFileStreamImpl::Position() {
  if (!m_file.is_open() || m_failed) return 0;
  return m_flushedBytes + m_buffer.size();
}

uint64_t NotifyFileStreamImpl::FreeBytes(const std::string& directory) {
  uint64_t bytes = 0;
  platform::Status status = m_env.FreeBytes(directory, &bytes);
  if (!status.ok()) {
    LogToHost(core::kModuleId, m_callback, LogLevelInfo, "Exception while query volume space: %s",
              status.message().c_str());
    return kUnknownFreeBytes;
  }
  return bytes == UINT64_MAX ? kUnknownFreeBytes : bytes;
}

bool NotifyFileStreamImpl::CreateDirectory(const std::string& directory) {
  return platform::MakeDirectory(directory).ok();
}

bool NotifyFileStreamImpl::RemoveFile(const std::string& path) {
  return m_env.RemoveFile(path).ok();
}

}  // namespace hx
