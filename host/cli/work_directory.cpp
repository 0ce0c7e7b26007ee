#include "host/cli/work_directory.h"

#include <errno.h>
#include <ftw.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

namespace refhost::cli {
namespace {

constexpr int kOpenDirectories = 16;

std::string CurrentDirectory() {
  char buffer[PATH_MAX];
  return getcwd(buffer, sizeof(buffer)) != nullptr ? std::string(buffer) : std::string();
}

int RemoveEntry(const char* path, const struct stat*, int, struct FTW*) {
  remove(path);
  return 0;
}

bool MakeDirectories(const std::string& path) {
  for (size_t slash = path.find('/', 1);; slash = path.find('/', slash + 1)) {
    const std::string prefix = path.substr(0, slash);
    if (mkdir(prefix.c_str(), 0755) != 0 && errno != EEXIST) return false;
    if (slash == std::string::npos) return true;
  }
}

}  // namespace

std::string AbsolutePath(const std::string& path) {
  if (path.empty() || path[0] == '/') return path;
  return CurrentDirectory() + "/" + path;
}

std::string DirectoryOf(const std::string& path) {
  const size_t slash = path.find_last_of('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

bool FileExists(const std::string& path) {
  struct stat info {};
  return stat(path.c_str(), &info) == 0 && S_ISREG(info.st_mode);
}

WorkDirectory::~WorkDirectory() {
  if (m_previous.empty()) return;
  if (chdir(m_previous.c_str()) != 0) return;
  if (m_temporary && !m_keep) {
    nftw(m_path.c_str(), RemoveEntry, kOpenDirectories, FTW_DEPTH | FTW_PHYS);
  }
}

bool WorkDirectory::Enter(const std::string& path, bool temporary, std::string* error) {
  m_previous = CurrentDirectory();
  std::string target = AbsolutePath(path);
  if (target.empty() && temporary) {
    const char* base = getenv("TMPDIR");
    std::string pattern =
        std::string(base != nullptr && *base != '\0' ? base : "/tmp") + "/alertmod-host-XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) {
      *error = "cannot make a temporary directory: " + std::string(strerror(errno));
      return false;
    }
    target = pattern;
    m_temporary = true;
  }
  if (target.empty()) target = m_previous;
  if (!MakeDirectories(target) || chdir(target.c_str()) != 0) {
    *error = "cannot use the working directory " + target + ": " + strerror(errno);
    return false;
  }
  m_path = target;
  return true;
}

}  // namespace refhost::cli
