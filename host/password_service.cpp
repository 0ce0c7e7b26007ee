#include "host/password_service.h"

#include <fcntl.h>
#include <openssl/evp.h>
#include <openssl/rand.h>
#include <unistd.h>

#include <cstring>
#include <memory>
#include <vector>

namespace refhost {
namespace {

using CipherContext = std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)>;

CipherContext NewContext() {
  return CipherContext(EVP_CIPHER_CTX_new(), &EVP_CIPHER_CTX_free);
}

bool ReadKeyFile(const std::string& path, std::array<unsigned char, 32>& key) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return false;
  unsigned char extra = 0;
  ssize_t n = read(fd, key.data(), key.size());
  bool exact = n == static_cast<ssize_t>(key.size()) && read(fd, &extra, 1) == 0;
  close(fd);
  return exact;
}

// Creates the key file with a fresh key; false when it exists already (made
// by another process meanwhile) or cannot be written.
bool CreateKeyFile(const std::string& path, std::array<unsigned char, 32>& key) {
  if (RAND_bytes(key.data(), static_cast<int>(key.size())) != 1) return false;
  int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
  if (fd < 0) return false;
  bool written =
      write(fd, key.data(), key.size()) == static_cast<ssize_t>(key.size()) && fsync(fd) == 0;
  close(fd);
  if (!written) unlink(path.c_str());
  return written;
}

}  // namespace

PasswordService::PasswordService(std::string keyPath) : m_keyPath(std::move(keyPath)) {}

bool PasswordService::EnsureKey() {
  std::lock_guard<std::mutex> lock(m_mutex);
  if (!m_haveKey) {
    // The second read covers a key file that another process created
    // between our read and our exclusive create.
    m_haveKey = ReadKeyFile(m_keyPath, m_key) || CreateKeyFile(m_keyPath, m_key) ||
                ReadKeyFile(m_keyPath, m_key);
  }
  return m_haveKey;
}

int32_t PasswordService::Handle(hx::core::HostRequest& request) {
  if (request.extSize != hx::core::kRequestExtSize ||
      request.extVersion != hx::core::kRequestExtVersion || request.data == nullptr ||
      request.extValue < 0 || static_cast<uint32_t>(request.extValue) > request.length) {
    return kBadRequest;
  }
  if (request.code != hx::core::kCodeEncrypt && request.code != hx::core::kCodeDecrypt) {
    return kBadRequest;
  }
  if (!EnsureKey()) return kKeyUnavailable;
  uint32_t inputLength = static_cast<uint32_t>(request.extValue);
  return request.code == hx::core::kCodeEncrypt ? Encrypt(request, inputLength)
                                                : Decrypt(request, inputLength);
}

int32_t PasswordService::Encrypt(hx::core::HostRequest& request, uint32_t inputLength) {
  const uint64_t needed = uint64_t{inputLength} + kNonceBytes + kTagBytes;
  if (needed > request.length) return static_cast<int32_t>(needed);
  auto* buffer = static_cast<unsigned char*>(request.data);
  std::vector<unsigned char> input(buffer, buffer + inputLength);
  unsigned char* nonce = buffer;
  unsigned char* cipherText = buffer + kNonceBytes;
  if (RAND_bytes(nonce, kNonceBytes) != 1) return kCipherFailure;
  CipherContext context = NewContext();
  int length = 0;
  int finalLength = 0;
  bool ok =
      context &&
      EVP_EncryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, m_key.data(), nonce) &&
      EVP_EncryptUpdate(context.get(), cipherText, &length, input.data(),
                        static_cast<int>(inputLength)) &&
      EVP_EncryptFinal_ex(context.get(), cipherText + length, &finalLength) &&
      EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_GET_TAG, kTagBytes, cipherText + inputLength);
  if (!ok) return kCipherFailure;
  request.extValue = static_cast<int32_t>(needed);
  return 0;
}

int32_t PasswordService::Decrypt(hx::core::HostRequest& request, uint32_t inputLength) {
  if (inputLength < kNonceBytes + kTagBytes) return kNotAuthentic;
  auto* buffer = static_cast<unsigned char*>(request.data);
  std::vector<unsigned char> input(buffer, buffer + inputLength);
  const uint32_t plainLength = inputLength - kNonceBytes - kTagBytes;
  unsigned char* tag = input.data() + kNonceBytes + plainLength;
  CipherContext context = NewContext();
  int length = 0;
  int finalLength = 0;
  bool ok =
      context &&
      EVP_DecryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, m_key.data(), input.data()) &&
      EVP_DecryptUpdate(context.get(), buffer, &length, input.data() + kNonceBytes,
                        static_cast<int>(plainLength)) &&
      EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_SET_TAG, kTagBytes, tag);
  if (!ok) return kCipherFailure;
  if (EVP_DecryptFinal_ex(context.get(), buffer + length, &finalLength) <= 0) {
    // Nothing of a refused decryption stays in the caller's buffer.
    memset(buffer, 0, inputLength);
    return kNotAuthentic;
  }
  request.extValue = static_cast<int32_t>(plainLength);
  return 0;
}

}  // namespace refhost
