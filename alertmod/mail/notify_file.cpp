#include "alertmod/mail/notify_file.h"

namespace hx {

CNotifyFileImpl::CNotifyFileImpl(const std::string& path) : m_file(fopen(path.c_str(), "rb")) {}

CNotifyFileImpl::~CNotifyFileImpl() {
  if (m_file != nullptr) fclose(m_file);
}

bool CNotifyFileImpl::IsGood() const {
  return m_file != nullptr && ferror(m_file) == 0;
}

size_t CNotifyFileImpl::Read(void* buffer, size_t count) {
  if (!IsGood() || count == 0) return 0;
  return fread(buffer, 1, count, m_file);
}

}  // namespace hx
