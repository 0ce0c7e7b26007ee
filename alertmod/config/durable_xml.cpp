#include "alertmod/config/durable_xml.h"

#include <condition_variable>
#include <mutex>
#include <set>

#include "alertmod/config/xml_document.h"
#include "alertmod/platform/env.h"
#include "alertmod/platform/files.h"

namespace hx {
namespace {

// The process-wide set of file names being loaded or saved, so that two
// threads never touch the same file at once. Names are exact byte strings;
// two spellings of one path are two names.
class FileNameGuard final {
 public:
  static FileNameGuard& Instance() {
    static FileNameGuard guard;
    return guard;
  }

  // Waits until no other holder has `name`, then holds it.
  void Acquire(const std::string& name) {
    std::unique_lock<std::mutex> lock(m_mutex);
    m_released.wait(lock, [&] { return m_names.count(name) == 0; });
    m_names.insert(name);
  }

  // Gives `name` up and wakes its waiters. Requires that the caller holds it.
  void Release(const std::string& name) {
    {
      std::lock_guard<std::mutex> lock(m_mutex);
      m_names.erase(name);
    }
    m_released.notify_all();
  }

 private:
  FileNameGuard() = default;

  std::mutex m_mutex;
  std::condition_variable m_released;
  std::set<std::string> m_names;
};

// Holds one name of the FileNameGuard for its scope.
class FileNameLock final {
 public:
  explicit FileNameLock(std::string name) : m_name(std::move(name)) {
    FileNameGuard::Instance().Acquire(m_name);
  }
  ~FileNameLock() { FileNameGuard::Instance().Release(m_name); }
  FileNameLock(const FileNameLock&) = delete;
  FileNameLock& operator=(const FileNameLock&) = delete;

 private:
  std::string m_name;
};

// Writes `text` into a freshly created side file and forces it to the
// device. Returns the error text, empty on success. Only the first failure is
// reported: a close error after a write error says nothing new.
std::string WriteSideFile(platform::Env& env, const std::string& sideName,
                          const std::string& text) {
  platform::File file;
  platform::Status status = env.NewExclusiveFile(sideName, &file);
  if (!status.ok()) return "create error " + std::to_string(status.code());
  std::string failure;
  size_t written = 0;
  status = file.Write(text.data(), text.size(), &written);
  // Data that never reached the device was not written.
  if (status.ok()) status = file.Sync();
  if (!status.ok()) failure = "write error " + std::to_string(status.code());
  status = file.Close();
  if (failure.empty() && !status.ok()) failure = "close error " + std::to_string(status.code());
  if (failure.empty() && written < text.size()) {
    failure =
        "only wrote " + std::to_string(written) + " of " + std::to_string(text.size()) + " bytes";
  }
  return failure;
}

// The XML library reads a whole file into memory at the size the system
// reports, so anything but a regular file of sensible size (a directory
// reports an enormous one) would exhaust memory instead of failing.
constexpr uint64_t kLargestXmlFileBytes = 64ull << 20;

// Line ends become LF, as the XML library's own file loader makes them.
std::string NormalizeLineEnds(const std::string& text) {
  std::string normalized;
  normalized.reserve(text.size());
  for (size_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\r') {
      normalized.push_back(text[i]);
    } else {
      normalized.push_back('\n');
      if (i + 1 < text.size() && text[i + 1] == '\n') ++i;
    }
  }
  return normalized;
}

bool LoadDocumentFile(TiXmlDocument& document, const std::string& name) {
  std::string text;
  if (!platform::IsRegularFileUpTo(name, kLargestXmlFileBytes)) return false;
  if (!platform::ReadWholeFile(name, &text).ok()) return false;
  return ParseXmlDocument(NormalizeLineEnds(text), document);
}

// A side file is adopted only when it holds a whole document: one cut short
// right after its declaration parses without error but has no root element,
// and adopting it would replace the configuration with nothing.
bool LoadCompleteSideFile(TiXmlDocument& document, const std::string& sideName) {
  return LoadDocumentFile(document, sideName) && document.RootElement() != nullptr;
}

}  // namespace

std::string PrintXmlIndented(const TiXmlDocument& document) {
  TiXmlPrinter printer;
  printer.SetIndent("    ");
  printer.SetLineBreak("\n");
  document.Accept(&printer);
  return printer.Str();
}

bool SaveXmlDurably(platform::Env& env, const TiXmlDocument& document, const std::string& fileName,
                    std::string* errorText) {
  const std::string text = PrintXmlIndented(document);
  const std::string sideName = fileName + kPendingSuffix;
  FileNameLock held(fileName);

  // A side file left by an interrupted save would make the exclusive create
  // fail; it is stale, since the name is ours now.
  env.RemoveFile(sideName);
  std::string failure = WriteSideFile(env, sideName, text);
  if (!failure.empty()) {
    env.RemoveFile(sideName);
    if (errorText != nullptr) *errorText = failure;
    return false;
  }
  platform::Status renamed = env.RenameFile(sideName, fileName);
  if (!renamed.ok()) {
    if (errorText != nullptr) {
      *errorText = "Failed to rename .xml.pending to .xml file " + std::to_string(renamed.code()) +
                   " - " + renamed.SystemText();
    }
    return false;
  }
  // The rename is done; a failed directory sync only weakens durability
  // against a power loss, and the file itself is complete either way.
  env.SyncParentDirectory(fileName);
  return true;
}

bool LoadXmlDurably(platform::Env& env, TiXmlDocument& document, const std::string& fileName) {
  const std::string sideName = fileName + kPendingSuffix;
  FileNameLock held(fileName);
  if (LoadCompleteSideFile(document, sideName)) {
    if (env.RenameFile(sideName, fileName).ok()) env.SyncParentDirectory(fileName);
    return true;
  }
  return LoadDocumentFile(document, fileName);
}

}  // namespace hx
