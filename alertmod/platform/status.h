// The outcome of an operating-system call: success, or the system error
// number with a readable account of what failed ("cannot remove \"/x/y\":
// Permission denied"). Callers outside this folder ask the predicates below
// instead of comparing error numbers.
//
// A Status is a plain value; copies may be used from any thread.
#ifndef ALERTMOD_PLATFORM_STATUS_H_
#define ALERTMOD_PLATFORM_STATUS_H_

#include <string>

namespace hx {
namespace platform {

class Status {
 public:
  // Success.
  Status() = default;
  static Status OK() { return Status(); }

  // A failed system call: `action` says what was attempted, with its object
  // ("cannot remove \"/x/y\""); `error` is the call's errno value.
  static Status FromErrno(const std::string& action, int error);

  // A failure without a system error number, such as one a test simulates.
  static Status Failure(std::string message);

  bool ok() const { return !m_failed; }
  // The file or directory does not exist.
  bool IsNotFound() const;
  // The volume, or the caller's quota on it, is full.
  bool IsNoSpace() const;

  // The system error number; 0 on success or for a failure that has none.
  int code() const { return m_code; }
  // The system's own text for code() ("No such file or directory").
  std::string SystemText() const;
  // The whole account of the failure; empty on success.
  const std::string& message() const { return m_message; }

 private:
  Status(int code, std::string message);

  bool m_failed = false;
  int m_code = 0;
  std::string m_message;
};

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_STATUS_H_
