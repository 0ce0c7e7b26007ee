// Reads a fuzzer's input as a stream of values: bytes, little-endian words
// and byte strings, with zeros once the input is used up. Test-only.
#ifndef ALERTMOD_TESTS_SUPPORT_FUZZ_INPUT_H_
#define ALERTMOD_TESTS_SUPPORT_FUZZ_INPUT_H_

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>

namespace testsupport {

class FuzzInput {
 public:
  FuzzInput(const uint8_t* data, size_t size) : m_data(data), m_size(size) {}

  bool Empty() const { return m_at >= m_size; }
  size_t Remaining() const { return m_size - std::min(m_at, m_size); }
  uint8_t Byte() { return m_at < m_size ? m_data[m_at++] : 0; }
  uint32_t Word() {
    uint32_t value = 0;
    for (int i = 0; i < 4; ++i) value |= uint32_t{Byte()} << (8 * i);
    return value;
  }
  // Up to `count` bytes: fewer when the input ends first.
  std::string Bytes(size_t count) {
    count = std::min(count, Remaining());
    std::string bytes(reinterpret_cast<const char*>(m_data + m_at), count);
    m_at += count;
    return bytes;
  }

 private:
  const uint8_t* m_data;
  size_t m_size;
  size_t m_at = 0;
};

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_FUZZ_INPUT_H_
