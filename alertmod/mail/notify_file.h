// Sequential read access to one attachment file while a message is composed.
//
// An INotifyFile belongs to the one composition that opened it, on the
// manager's worker thread; it is not shared.
#ifndef ALERTMOD_MAIL_NOTIFY_FILE_H_
#define ALERTMOD_MAIL_NOTIFY_FILE_H_

#include <cstddef>
#include <string>

#include "alertmod/platform/files.h"

namespace hx {

class INotifyFile {
 public:
  virtual ~INotifyFile() = default;
  // True while the file is open and no read error has occurred. The end of
  // the file is not an error.
  virtual bool IsGood() const = 0;
  // Reads up to `count` bytes into `buffer`. Returns the number read; 0 at the
  // end of the file or after an error.
  virtual size_t Read(void* buffer, size_t count) = 0;
};

// An attachment file opened for binary reading. A file that cannot be opened
// gives an object whose IsGood is false and whose reads return 0.
class CNotifyFileImpl final : public INotifyFile {
 public:
  explicit CNotifyFileImpl(const std::string& path);
  ~CNotifyFileImpl() override;
  CNotifyFileImpl(const CNotifyFileImpl&) = delete;
  CNotifyFileImpl& operator=(const CNotifyFileImpl&) = delete;

  bool IsGood() const override;
  size_t Read(void* buffer, size_t count) override;

 private:
  platform::File m_file;
  bool m_readFailed = false;
};

}  // namespace hx

#endif  // ALERTMOD_MAIL_NOTIFY_FILE_H_
