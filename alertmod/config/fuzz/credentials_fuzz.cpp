// The host's answers to password protection requests: any result, any
// output length and any bytes written into the work buffer. Protecting and
// reading back a password must stay inside the buffer the module lent, and a
// password read back from a host that answered sensibly must be the one
// protected.
//
// Input: a password length byte and that many bytes of password, then the
// answers, 9 bytes each: the result (4 bytes), the output length (4 bytes)
// and a byte saying how many bytes of the remaining input the host writes
// into the buffer. When the answers run out, the host masks each byte (a
// reversible cipher) and answers 0.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string>

#include "alertmod/config/credentials.h"
#include "alertmod/host_records.h"

namespace {

constexpr uint8_t kMask = 0x5A;

struct Script {
  const uint8_t* data = nullptr;
  size_t size = 0;
  size_t at = 0;
  bool scripted = false;  // an answer came from the input

  uint32_t Word() {
    uint32_t value = 0;
    for (int i = 0; i < 4 && at < size; ++i) value |= uint32_t{data[at++]} << (8 * i);
    return value;
  }
};

Script g_script;

int32_t HostCallback(hx::core::HostRequest* request, void*) {
  if (request->requestClass != hx::core::kClassCrypto) return 0;
  Script& script = g_script;
  auto* buffer = static_cast<uint8_t*>(request->data);
  if (script.at + 9 > script.size) {
    if (request->extValue < 0 || static_cast<uint32_t>(request->extValue) > request->length) {
      return -1;
    }
    for (int32_t i = 0; i < request->extValue; ++i) buffer[i] ^= kMask;
    return 0;
  }
  script.scripted = true;
  const int32_t result = static_cast<int32_t>(script.Word());
  request->extValue = static_cast<int32_t>(script.Word());
  size_t written = script.data[script.at++];
  written = std::min({written, script.size - script.at, size_t{request->length}});
  memcpy(buffer, script.data + script.at, written);
  script.at += written;
  return result;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  const size_t passwordLength = std::min<size_t>(data[0], size - 1);
  const std::string password(reinterpret_cast<const char*>(data + 1), passwordLength);
  g_script = Script{data, size, 1 + passwordLength, false};
  const std::optional<std::string> protectedBytes =
      hx::ProtectPassword(password, hx::core::kModuleId, &HostCallback, {});
  if (!protectedBytes) return 0;
  const std::optional<std::string> clear =
      hx::UnprotectPassword(*protectedBytes, hx::core::kModuleId, &HostCallback, {});
  if (!g_script.scripted && clear != password) __builtin_trap();
  return 0;
}
