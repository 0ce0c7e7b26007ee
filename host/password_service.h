// The reference host's password service (request class 0x8000): AES-256-GCM
// under a 32-byte key kept in a host key file, created with mode 0600 on
// first use. Encryption turns the input at the start of the request's buffer
// into nonce (12 bytes), ciphertext and tag (16 bytes); decryption reverses
// it and refuses bytes made under another key or changed since.
//
// Answers: 0 with the output length at offset 0x30; a positive number when
// the buffer is too small (the size needed); a negative number on error.
// Handle() may be called from any thread.
#ifndef ALERTMOD_HOST_PASSWORD_SERVICE_H_
#define ALERTMOD_HOST_PASSWORD_SERVICE_H_

#include <array>
#include <cstdint>
#include <mutex>
#include <string>

#include "alertmod/host_records.h"

namespace refhost {

class PasswordService {
 public:
  // Answers to requests that cannot be served.
  static constexpr int32_t kBadRequest = -1;
  static constexpr int32_t kKeyUnavailable = -2;
  static constexpr int32_t kCipherFailure = -3;
  static constexpr int32_t kNotAuthentic = -4;

  static constexpr uint32_t kNonceBytes = 12;
  static constexpr uint32_t kTagBytes = 16;

  // `keyPath` is read or created at the first request, relative to the
  // working directory of that moment.
  explicit PasswordService(std::string keyPath);

  int32_t Handle(hx::core::HostRequest& request);

 private:
  bool EnsureKey();
  int32_t Encrypt(hx::core::HostRequest& request, uint32_t inputLength);
  int32_t Decrypt(hx::core::HostRequest& request, uint32_t inputLength);

  std::string m_keyPath;
  std::mutex m_mutex;
  bool m_haveKey = false;
  std::array<unsigned char, 32> m_key{};
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_PASSWORD_SERVICE_H_
