// FileStreamBuf: a std::streambuf that writes straight through to a File, so
// that code offering a std::ostream (the text log) still writes through the
// platform's files.
//
// Unbuffered: every write reaches the file at once, and a failed write shows
// on the stream at once. Like the File it writes to, it belongs to one thread
// at a time; the File must outlive it.
#ifndef ALERTMOD_PLATFORM_FILE_STREAMBUF_H_
#define ALERTMOD_PLATFORM_FILE_STREAMBUF_H_

#include <streambuf>

#include "alertmod/platform/files.h"

namespace hx {
namespace platform {

class FileStreamBuf final : public std::streambuf {
 public:
  explicit FileStreamBuf(File* file) : m_file(file) {}

 protected:
  // Writes `count` bytes; returns how many reached the file (fewer when the
  // file is closed or a write fails, which the stream reports as bad).
  std::streamsize xsputn(const char* data, std::streamsize count) override;
  // Writes one character; eof when it could not be written.
  int_type overflow(int_type character) override;

 private:
  File* const m_file;
};

}  // namespace platform
}  // namespace hx

#endif  // ALERTMOD_PLATFORM_FILE_STREAMBUF_H_
