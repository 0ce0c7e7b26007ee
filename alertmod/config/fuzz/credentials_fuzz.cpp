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
#include "tests/support/fuzz_input.h"

namespace {

constexpr uint8_t kMask = 0x5A;
constexpr size_t kAnswerBytes = 9;

// The answers left in the input, and whether any was used.
struct Script {
  testsupport::FuzzInput* answers = nullptr;
  bool scripted = false;
};

Script g_script;

int32_t HostCallback(hx::core::HostRequest* request, void*) {
  if (request->requestClass != hx::core::kClassCrypto) return 0;
  testsupport::FuzzInput& answers = *g_script.answers;
  auto* buffer = static_cast<uint8_t*>(request->data);
  if (answers.Remaining() < kAnswerBytes) {
    if (request->extValue < 0 || static_cast<uint32_t>(request->extValue) > request->length) {
      return -1;
    }
    for (int32_t i = 0; i < request->extValue; ++i) buffer[i] ^= kMask;
    return 0;
  }
  g_script.scripted = true;
  const int32_t result = static_cast<int32_t>(answers.Word());
  request->extValue = static_cast<int32_t>(answers.Word());
  const size_t written = answers.Byte();
  const std::string bytes = answers.Bytes(std::min(written, size_t{request->length}));
  memcpy(buffer, bytes.data(), bytes.size());
  return result;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
  if (size == 0) return 0;
  testsupport::FuzzInput input(data, size);
  const std::string password = input.Bytes(input.Byte());
  g_script = Script{&input, false};
  const std::optional<std::string> protectedBytes =
      hx::ProtectPassword(password, hx::core::kModuleId, &HostCallback, {});
  if (!protectedBytes) return 0;
  const std::optional<std::string> clear =
      hx::UnprotectPassword(*protectedBytes, hx::core::kModuleId, &HostCallback, {});
  if (!g_script.scripted && clear != password) __builtin_trap();
  return 0;
}
