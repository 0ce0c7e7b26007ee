#include "alertmod/platform/file_streambuf.h"

namespace hx {
namespace platform {

std::streamsize FileStreamBuf::xsputn(const char* data, std::streamsize count) {
  if (count <= 0 || !m_file->is_open()) return 0;
  size_t written = 0;
  m_file->Write(data, static_cast<size_t>(count), &written);
  return static_cast<std::streamsize>(written);
}

FileStreamBuf::int_type FileStreamBuf::overflow(int_type character) {
  if (traits_type::eq_int_type(character, traits_type::eof()))
    return traits_type::not_eof(character);
  const char byte = traits_type::to_char_type(character);
  return xsputn(&byte, 1) == 1 ? character : traits_type::eof();
}

}  // namespace platform
}  // namespace hx
