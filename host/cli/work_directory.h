// The host's working directory for one command: the module keeps notify.xml
// and its data folder there, and the host its password key. WorkDirectory
// enters a given directory (made when missing) or a new temporary one, and
// on destruction returns to where the program was, removing a temporary
// directory unless told to keep it.
//
// One per process at a time; the working directory is process-wide.
#ifndef ALERTMOD_HOST_CLI_WORK_DIRECTORY_H_
#define ALERTMOD_HOST_CLI_WORK_DIRECTORY_H_

#include <string>

namespace refhost::cli {

// `path` made absolute against the current directory; empty stays empty.
std::string AbsolutePath(const std::string& path);

// The folder of `path` ("." for a bare name).
std::string DirectoryOf(const std::string& path);

bool FileExists(const std::string& path);

class WorkDirectory {
 public:
  WorkDirectory() = default;
  ~WorkDirectory();
  WorkDirectory(const WorkDirectory&) = delete;
  WorkDirectory& operator=(const WorkDirectory&) = delete;

  // Enters `path`, creating it when missing; an empty `path` enters the
  // current directory, or a new temporary directory when `temporary`.
  // False with `error` when the directory cannot be made or entered.
  bool Enter(const std::string& path, bool temporary, std::string* error);

  // A temporary directory stays after the program.
  void Keep() { m_keep = true; }

  const std::string& path() const { return m_path; }
  bool temporary() const { return m_temporary; }

 private:
  std::string m_previous;
  std::string m_path;
  bool m_temporary = false;
  bool m_keep = false;
};

}  // namespace refhost::cli

#endif  // ALERTMOD_HOST_CLI_WORK_DIRECTORY_H_
