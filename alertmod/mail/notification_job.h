// The notification job turns one notification work item into delivered
// e-mail: templates, attachment files from the captured video, one or more
// message files split by the profile's size limit, delivery server by server,
// retry filing, the profile status report, and removal of the attachment
// files it made.
//
// Runs on the manager's worker thread only, one item at a time, and blocks it
// for the whole time.
#ifndef ALERTMOD_MAIL_NOTIFICATION_JOB_H_
#define ALERTMOD_MAIL_NOTIFICATION_JOB_H_

#include <cstdint>
#include <memory>
#include <string>

#include "alertmod/host_records.h"
#include "alertmod/mail/notify_file_stream.h"
#include "alertmod/mail/notify_helper.h"
#include "alertmod/mail/notify_work_item.h"

namespace hx {

class CVideoEmailStream;

// Writes the attachment file of one video source: the clip writer in the
// module, a substitute in tests.
class IAttachmentWriter {
 public:
  virtual ~IAttachmentWriter() = default;
  // Writes the clip of `source` (codec other than JPEG) to `path` as a
  // QuickTime or MP4 file. False when writing failed; true does not promise a
  // file (without the codec libraries nothing is written).
  virtual bool WriteVideo(const VideoSource& source, const std::string& path) = 0;
  // Writes the payload of the clip's first frame (a JPEG still) to `path`.
  virtual bool WriteJpeg(const CVideoEmailStream& stream, const std::string& path) = 0;
};

// The module's attachment writer, logging through `callback` and writing
// files through `env`, which must outlive it.
std::unique_ptr<IAttachmentWriter> MakeAttachmentWriter(core::HostCallbackFn callback,
                                                        platform::Env& env);

// Runs the whole job for `item`. Failures are logged and reported to the host
// as status 1; nothing is thrown for expected failures. A message file that
// could not be composed whole is removed. `maxRetryQueue` bounds the retry
// queue when a message has to wait.
void RunNotificationJob(NotifyWorkItem& item, NotifyHelper& helper, INotifyFileStream& stream,
                        int32_t maxRetryQueue, IAttachmentWriter& writer);

}  // namespace hx

#endif  // ALERTMOD_MAIL_NOTIFICATION_JOB_H_
