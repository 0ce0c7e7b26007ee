// Protection of SMTP passwords at rest. The host holds the key: a password,
// prefixed with a fixed marker, is encrypted and decrypted by the host's
// cryptographic service through the host callback (request class 0x8000).
// The module implements no cipher. Everything stays on the caller's stack;
// any thread.
#ifndef ALERTMOD_CONFIG_CREDENTIALS_H_
#define ALERTMOD_CONFIG_CREDENTIALS_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "alertmod/host_records.h"

namespace hx {

// Receives the text of each failure; every caller logs it at error level.
// May be empty, which drops the texts.
using ErrorSink = std::function<void(const std::string& text)>;

// The host's encryption of marker + `password` (an empty password is still
// protected), or nothing on failure. The host gets a 512-byte work buffer (or
// twice the input when that is 512 bytes or more) and may ask once more for
// a larger one: the sink then gets "Resizing encryption buffer: N", and
// after a second request "Encryption Failure, reached max attempts". A
// negative answer gives "encryption error: N". Requests of more than 1 MiB,
// output lengths outside the buffer and an empty output are refused as
// errors.
std::optional<std::string> ProtectPassword(const std::string& password, uint32_t requester,
                                           core::HostCallbackFn callback, const ErrorSink& sink);

// The password inside `protectedBytes` (the raw bytes, already Base64
// decoded), or nothing on failure, with the texts of ProtectPassword in their
// decryption form ("Resizing decryption buffer: N", "decyrption error: N",
// "Decryption Failure, reached max attempts"), and "decryption failure" for
// a result without the marker (another host's key, damaged text).
std::optional<std::string> UnprotectPassword(const std::string& protectedBytes, uint32_t requester,
                                             core::HostCallbackFn callback, const ErrorSink& sink);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_CREDENTIALS_H_
