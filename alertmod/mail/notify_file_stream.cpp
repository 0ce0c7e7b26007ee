#include "alertmod/mail/notify_file_stream.h"

#include "alertmod/diag/log.h"
#include "alertmod/platform/file_system.h"

namespace hx {

NotifyFileStreamImpl::NotifyFileStreamImpl(core::HostCallbackFn callback) : m_callback(callback) {}

NotifyFileStreamImpl::~NotifyFileStreamImpl() {
  if (m_stream.is_open()) m_stream.close();
}

bool NotifyFileStreamImpl::Open(const std::string& path, std::ios_base::openmode mode) {
  if (m_stream.is_open()) m_stream.close();
  m_stream.clear();
  m_stream.open(path, mode | std::ios_base::out);
  return m_stream.good();
}

void NotifyFileStreamImpl::Close() {
  m_stream.close();
}

bool NotifyFileStreamImpl::IsGood() const {
  return m_stream.good();
}

bool NotifyFileStreamImpl::Failed() const {
  return m_stream.fail();
}

INotifyFileStream& NotifyFileStreamImpl::WriteStream(std::streambuf* buffer) {
  // Inserting a null or empty buffer would set the fail state; copying
  // nothing is not a failure of this file.
  if (m_stream.good() && buffer != nullptr &&
      buffer->sgetc() != std::streambuf::traits_type::eof()) {
    m_stream << buffer;
  }
  return *this;
}

INotifyFileStream& NotifyFileStreamImpl::WriteUInt(uint32_t value) {
  if (m_stream.good()) m_stream << value;
  return *this;
}

INotifyFileStream& NotifyFileStreamImpl::WriteText(const char* text) {
  if (m_stream.good() && text != nullptr) m_stream << text;
  return *this;
}

INotifyFileStream& NotifyFileStreamImpl::WriteString(const std::string& text) {
  if (m_stream.good()) m_stream.write(text.data(), static_cast<std::streamsize>(text.size()));
  return *this;
}

uint64_t NotifyFileStreamImpl::Position() {
  if (!m_stream.is_open() || m_stream.fail()) return 0;
  std::streamoff position = m_stream.tellp();
  return position < 0 ? 0 : static_cast<uint64_t>(position);
}

uint64_t NotifyFileStreamImpl::FreeBytes(const std::string& directory) {
  uint64_t bytes = 0;
  platform::Status status = platform::QueryFreeBytes(directory, &bytes);
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
  return platform::DeleteFile(path).ok();
}

}  // namespace hx
