#include "alertmod/platform/status.h"

#include <cerrno>

#include "alertmod/platform/error_text.h"

namespace hx {
namespace platform {

Status::Status(int code, std::string message)
    : m_failed(true), m_code(code), m_message(std::move(message)) {}

Status Status::FromErrno(const std::string& action, int error) {
  return Status(error, action + ": " + ErrorText(error));
}

Status Status::Failure(std::string message) {
  return Status(0, std::move(message));
}

bool Status::IsNotFound() const {
  return m_code == ENOENT;
}

bool Status::IsNoSpace() const {
// A quota is reported as its own error only where the C runtime has one.
#ifdef EDQUOT
  if (m_code == EDQUOT) return true;
#endif
  return m_code == ENOSPC;
}

std::string Status::SystemText() const {
  return ErrorText(m_code);
}

}  // namespace platform
}  // namespace hx
