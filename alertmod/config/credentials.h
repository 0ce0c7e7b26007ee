// Protection of SMTP passwords at rest. The host holds the key: a password,
// prefixed with a fixed marker, is encrypted and decrypted by the host's
// cryptographic service through the host callback. Everything stays on the
// caller's stack; any thread.
#ifndef ALERTMOD_CONFIG_CREDENTIALS_H_
#define ALERTMOD_CONFIG_CREDENTIALS_H_

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "alertmod/host_records.h"

namespace hx {

// Receives the text of each failure; every caller logs it at error level.
using ErrorSink = std::function<void(const std::string& text)>;

// The host's encryption of marker + `password`, or nothing on failure (the
// reasons went to `sink`).
std::optional<std::string> ProtectPassword(const std::string& password, uint32_t requester,
                                           core::HostCallbackFn callback, const ErrorSink& sink);

// The password inside `protectedBytes`, or nothing on failure, including a
// result without the marker (another host's key, damaged text).
std::optional<std::string> UnprotectPassword(const std::string& protectedBytes,
                                             uint32_t requester, core::HostCallbackFn callback,
                                             const ErrorSink& sink);

}  // namespace hx

#endif  // ALERTMOD_CONFIG_CREDENTIALS_H_
