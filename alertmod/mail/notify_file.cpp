#include "alertmod/mail/notify_file.h"

namespace hx {

CNotifyFileImpl::CNotifyFileImpl(const std::string& path) {
  // A file that cannot be opened stays closed, which IsGood reports.
  platform::File::OpenForReading(path, &m_file);
}

CNotifyFileImpl::~CNotifyFileImpl() = default;

bool CNotifyFileImpl::IsGood() const {
  return m_file.is_open() && !m_readFailed;
}

size_t CNotifyFileImpl::Read(void* buffer, size_t count) {
  if (!IsGood() || count == 0) return 0;
  size_t read = 0;
  if (!m_file.Read(buffer, count, &read).ok()) m_readFailed = true;
  return read;
}

}  // namespace hx
