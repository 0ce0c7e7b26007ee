#include "alertmod/config/credentials.h"

#include <algorithm>
#include <vector>

namespace hx {
namespace {

constexpr char kMarker[] = "mzt58";
constexpr size_t kMarkerLength = sizeof(kMarker) - 1;
constexpr size_t kInitialBufferBytes = 512;
constexpr int kMaxAttempts = 2;
// No password needs more; a host asking for a larger buffer is answered as
// an error instead of with an allocation of its choosing.
constexpr int32_t kMaxBufferBytes = 1 << 20;

// The texts and request code of one direction.
struct CryptoDirection {
  uint32_t code;
  const char* errorText;
  const char* resizeText;
  const char* maxAttemptsText;
};

const CryptoDirection kEncrypt{core::kCodeEncrypt,
                               "encryption error: ", "Resizing encryption buffer: ",
                               "Encryption Failure, reached max attempts"};
const CryptoDirection kDecrypt{core::kCodeDecrypt,
                               "decyrption error: ", "Resizing decryption buffer: ",
                               "Decryption Failure, reached max attempts"};

void Report(const ErrorSink& sink, const std::string& text) {
  if (sink) sink(text);
}

int32_t SendCryptoRequest(const CryptoDirection& direction, uint32_t requester,
                          core::HostCallbackFn callback, std::vector<char>& buffer,
                          size_t inputLength, int32_t& outputLength) {
  core::HostRequest request = core::MakeHostRequest(requester, core::kClassCrypto, direction.code);
  request.length = static_cast<uint32_t>(buffer.size());
  request.data = buffer.data();
  request.extSize = core::kRequestExtSize;
  request.extVersion = core::kRequestExtVersion;
  request.extValue = static_cast<int32_t>(inputLength);
  int32_t result = callback(&request, nullptr);
  outputLength = request.extValue;
  return result;
}

// Runs the host's transformation of `input`, growing the buffer once when
// the host asks for more. The host's output length is trusted only within
// the buffer it was given.
std::optional<std::string> Transform(const CryptoDirection& direction, const std::string& input,
                                     uint32_t requester, core::HostCallbackFn callback,
                                     const ErrorSink& sink) {
  if (callback == nullptr) {
    Report(sink, direction.errorText + std::string("no host"));
    return std::nullopt;
  }
  if (input.size() > kMaxBufferBytes / 2) {
    Report(sink, direction.errorText + std::string("input of ") + std::to_string(input.size()) +
                     " bytes is too long");
    return std::nullopt;
  }
  size_t size = input.size() >= kInitialBufferBytes ? 2 * input.size() : kInitialBufferBytes;
  std::vector<char> buffer(size, 0);
  input.copy(buffer.data(), input.size());
  for (int attempt = 1;; ++attempt) {
    int32_t outputLength = 0;
    int32_t result =
        SendCryptoRequest(direction, requester, callback, buffer, input.size(), outputLength);
    if (result == 0) {
      if (outputLength < 0 || static_cast<size_t>(outputLength) > buffer.size()) {
        Report(sink, direction.errorText + std::string("output length ") +
                         std::to_string(outputLength) + " outside the buffer of " +
                         std::to_string(buffer.size()));
        return std::nullopt;
      }
      return std::string(buffer.data(), static_cast<size_t>(outputLength));
    }
    if (result < 0 || result > kMaxBufferBytes) {
      Report(sink, direction.errorText + std::to_string(result));
      return std::nullopt;
    }
    // Never below the input: the host reads that many bytes of the buffer.
    buffer.resize(std::max(static_cast<size_t>(result), input.size()), 0);
    Report(sink, direction.resizeText + std::to_string(result));
    if (attempt == kMaxAttempts) {
      Report(sink, direction.maxAttemptsText);
      return std::nullopt;
    }
  }
}

}  // namespace

std::optional<std::string> ProtectPassword(const std::string& password, uint32_t requester,
                                           core::HostCallbackFn callback, const ErrorSink& sink) {
  std::optional<std::string> output =
      Transform(kEncrypt, kMarker + password, requester, callback, sink);
  // Nothing could be decrypted from no bytes: the password would be lost.
  if (output && output->empty()) {
    Report(sink, kEncrypt.errorText + std::string("empty output"));
    return std::nullopt;
  }
  return output;
}

std::optional<std::string> UnprotectPassword(const std::string& protectedBytes, uint32_t requester,
                                             core::HostCallbackFn callback, const ErrorSink& sink) {
  std::optional<std::string> output =
      Transform(kDecrypt, protectedBytes, requester, callback, sink);
  if (!output) return std::nullopt;
  if (output->size() < kMarkerLength || output->compare(0, kMarkerLength, kMarker) != 0) {
    Report(sink, "decryption failure");
    return std::nullopt;
  }
  return output->substr(kMarkerLength);
}

}  // namespace hx
