#include "alertmod/util/base64.h"

#include <cstring>

namespace hx {
namespace {

constexpr char kAlphabet[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

int DigitValue(unsigned char c) {
  if (c >= 'A' && c <= 'Z') return c - 'A';
  if (c >= 'a' && c <= 'z') return c - 'a' + 26;
  if (c >= '0' && c <= '9') return c - '0' + 52;
  if (c == '+') return 62;
  if (c == '/') return 63;
  return -1;
}

// The two characters of every 12-bit value, so that three bytes take two
// lookups instead of four.
struct PairTable {
  char chars[4096][2];
};

const PairTable& ThePairTable() {
  static const PairTable table = [] {
    PairTable built{};
    for (int value = 0; value < 4096; ++value) {
      built.chars[value][0] = kAlphabet[value >> 6];
      built.chars[value][1] = kAlphabet[value & 0x3F];
    }
    return built;
  }();
  return table;
}

}  // namespace

size_t Base64EncodeTo(const uint8_t* data, size_t length, char* out) {
  const PairTable& pairs = ThePairTable();
  char* start = out;
  size_t i = 0;
  // Six bytes at a time through one big-endian load (which reads two bytes
  // more than it uses, hence the bound) and four pair lookups: this loop
  // carries the attachment encoding.
  for (; i + 8 <= length; i += 6) {
    uint64_t word;
    memcpy(&word, data + i, sizeof(word));
    word = __builtin_bswap64(word);
    memcpy(out, pairs.chars[(word >> 52) & 0xFFF], 2);
    memcpy(out + 2, pairs.chars[(word >> 40) & 0xFFF], 2);
    memcpy(out + 4, pairs.chars[(word >> 28) & 0xFFF], 2);
    memcpy(out + 6, pairs.chars[(word >> 16) & 0xFFF], 2);
    out += 8;
  }
  for (; i + 3 <= length; i += 3) {
    uint32_t group = (uint32_t{data[i]} << 16) | (uint32_t{data[i + 1]} << 8) | data[i + 2];
    memcpy(out, pairs.chars[group >> 12], 2);
    memcpy(out + 2, pairs.chars[group & 0xFFF], 2);
    out += 4;
  }
  size_t rest = length - i;
  if (rest > 0) {
    uint32_t group = uint32_t{data[i]} << 16;
    if (rest == 2) group |= uint32_t{data[i + 1]} << 8;
    out[0] = kAlphabet[(group >> 18) & 0x3F];
    out[1] = kAlphabet[(group >> 12) & 0x3F];
    out[2] = rest == 2 ? kAlphabet[(group >> 6) & 0x3F] : '=';
    out[3] = '=';
    out += 4;
  }
  return static_cast<size_t>(out - start);
}

std::string Base64Encode(const std::string& bytes) {
  std::string text(Base64EncodedLength(bytes.size()), '\0');
  Base64EncodeTo(reinterpret_cast<const uint8_t*>(bytes.data()), bytes.size(), &text[0]);
  return text;
}

std::string Base64Decode(const std::string& text) {
  std::string bytes;
  uint32_t group = 0;
  int digits = 0;
  int padding = 0;
  for (unsigned char c : text) {
    int value = DigitValue(c);
    if (value < 0 && c != '=') continue;
    if (c == '=') {
      value = 0;
      ++padding;
    } else {
      padding = 0;
    }
    group = (group << 6) | static_cast<uint32_t>(value);
    if (++digits < 4) continue;
    int produced = padding >= 2 ? 1 : padding == 1 ? 2 : 3;
    for (int k = 0; k < produced; ++k)
      bytes.push_back(static_cast<char>((group >> (16 - 8 * k)) & 0xFF));
    if (padding > 0) break;
    group = 0;
    digits = 0;
  }
  return bytes;
}

}  // namespace hx
