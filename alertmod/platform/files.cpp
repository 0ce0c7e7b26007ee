#include "alertmod/platform/files.h"

#include <utility>

// The ownership of a File is the same on every system; opening, writing and
// closing are in the system's half (posix/files.cpp, win32/files.cpp).

namespace hx {
namespace platform {

File::~File() {
  if (is_open()) Close();
}

File::File(File&& other) noexcept
    : m_fd(std::exchange(other.m_fd, -1)), m_path(std::move(other.m_path)) {}

File& File::operator=(File&& other) noexcept {
  if (this != &other) {
    if (is_open()) Close();
    m_fd = std::exchange(other.m_fd, -1);
    m_path = std::move(other.m_path);
  }
  return *this;
}

}  // namespace platform
}  // namespace hx
