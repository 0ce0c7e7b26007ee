// A fresh directory under the temporary folder (TMPDIR or /tmp; on Windows
// GetTempPath), removed with its content when the object goes. ScopedChdir
// makes it the working directory for a test.
#ifndef ALERTMOD_TESTS_SUPPORT_TEMP_DIR_H_
#define ALERTMOD_TESTS_SUPPORT_TEMP_DIR_H_

#include <string>

namespace testsupport {

class TempDir {
 public:
  TempDir();
  ~TempDir();
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;

  const std::string& path() const { return m_path; }
  // `name` joined to the directory.
  std::string File(const std::string& name) const { return m_path + "/" + name; }

 private:
  std::string m_path;
};

// Changes the working directory for the object's life.
class ScopedChdir {
 public:
  explicit ScopedChdir(const std::string& dir);
  ~ScopedChdir();
  ScopedChdir(const ScopedChdir&) = delete;
  ScopedChdir& operator=(const ScopedChdir&) = delete;

 private:
  std::string m_previous;
};

// Reads a whole file; empty when it cannot be read.
std::string ReadFile(const std::string& path);
// Writes a whole file; false on failure.
bool WriteFile(const std::string& path, const std::string& content);
bool FileExists(const std::string& path);

}  // namespace testsupport

#endif  // ALERTMOD_TESTS_SUPPORT_TEMP_DIR_H_
