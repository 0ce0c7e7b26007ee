// The module's one Base64: the standard alphabet with "=" padding and no line
// breaks, and a lenient decoder that skips everything outside the alphabet.
// Pure functions; any thread.
#ifndef ALERTMOD_UTIL_BASE64_H_
#define ALERTMOD_UTIL_BASE64_H_

#include <cstddef>
#include <cstdint>
#include <string>

namespace hx {

// Characters needed to encode `length` bytes, padding included.
constexpr size_t Base64EncodedLength(size_t length) {
  return (length + 2) / 3 * 4;
}

// Encodes `length` bytes of `data` into `out`, which must have room for
// Base64EncodedLength(length) characters. Returns the number written.
size_t Base64EncodeTo(const uint8_t* data, size_t length, char* out);

// Standard Base64 of `bytes`, padded to a multiple of four characters.
std::string Base64Encode(const std::string& bytes);

// Decodes leniently: characters outside the alphabet other than "=" are
// skipped; "=" is a zero digit and padding; decoding stops after a padded
// group; an incomplete final group yields nothing.
std::string Base64Decode(const std::string& text);

}  // namespace hx

#endif  // ALERTMOD_UTIL_BASE64_H_
