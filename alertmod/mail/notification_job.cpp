#include "alertmod/mail/notification_job.h"

#include <cstdio>
#include <cstring>
#include <vector>

#include "alertmod/diag/log.h"
#include "alertmod/mail/mail_file.h"
#include "alertmod/mail/notify_file.h"
#include "alertmod/mail/smtp_delivery.h"
#include "alertmod/mail/templates.h"
#include "alertmod/video/video_email_stream.h"

namespace hx {
namespace {

constexpr uint32_t kCodecJpeg = 0;
constexpr uint32_t kCodecH265 = 6;

std::string Extension(uint32_t codec) {
  if (codec == kCodecJpeg) return ".jpg";
  return codec == kCodecH265 ? ".mp4" : ".mov";
}

// "s.mmm" for a span in milliseconds.
std::string Seconds(uint32_t ms) {
  char text[32];
  snprintf(text, sizeof(text), "%u.%03u", ms / 1000, ms % 1000);
  return text;
}

bool HasFirstPayload(const CVideoEmailStream& stream) {
  if (stream.Gops().empty() || stream.Gops().front().frames.empty()) return false;
  const VideoFrame& first = stream.Gops().front().frames.front();
  return first.data && first.data->Data() != nullptr && first.data->Size() > first.payloadOffset;
}

// The writers of the clip writer report success even when the codec
// libraries were missing and nothing was written, so the file decides: it
// must give at least one byte to the reader that composition uses.
bool FileWritten(const std::string& path) {
  CNotifyFileImpl file(path);
  char first = 0;
  return file.Read(&first, 1) == 1;
}

// The file name an attachment of source `name` gets: "default" for an empty
// name, and every control character and every character that a path cannot
// safely hold replaced by "_".
std::string AttachmentFileName(const std::string& name) {
  if (name.empty()) return "default";
  std::string file = name;
  for (char& c : file) {
    if (static_cast<unsigned char>(c) < 32 || strchr("/?<>\\:*|\"", c) != nullptr) c = '_';
  }
  return file;
}

std::string AttachmentLine(const std::string& path, const CVideoEmailStream& stream) {
  std::string line = "Attachment " + path;
  if (stream.Codec() != kCodecJpeg) {
    // A capture attached before any frame arrived starts after its trigger:
    // its preview is nothing, not a wrapped-around count.
    int32_t preview = static_cast<int32_t>(stream.TriggerMs() - stream.FirstFrameMs());
    uint32_t length = stream.LastFrameMs() - stream.FirstFrameMs();
    if (length == 0) length = 1;
    uint64_t fps = (stream.FrameCount() + 1) * 1000 / length;
    line += ", preview " + Seconds(preview > 0 ? static_cast<uint32_t>(preview) : 0);
    line += ", length " + Seconds(length);
    line += ", frames " + std::to_string(stream.FrameCount());
    line += ", Gop size " + std::to_string(stream.Gops().front().frames.size());
    line += ", fps " + std::to_string(fps);
  }
  return line + ", sizeKB " + std::to_string(stream.ByteCount() / 1024);
}

PreparedAttachment PrepareAttachment(const VideoSource& source, IAttachmentWriter& writer,
                                     core::HostCallbackFn callback) {
  const CVideoEmailStream& stream = *source.stream;
  std::string stem = AttachmentFileName(source.name);
  PreparedAttachment prepared;
  prepared.entry.file = DataDirectory() + "/" + stem + Extension(stream.Codec());
  bool written = false;
  if (HasFirstPayload(stream)) {
    written = stream.Codec() == kCodecJpeg ? writer.WriteJpeg(stream, prepared.entry.file)
                                           : writer.WriteVideo(source, prepared.entry.file);
    written = written && FileWritten(prepared.entry.file);
  }
  if (written) {
    prepared.entry.include = true;
    prepared.bytes = stream.ByteCount();
    LogToHost(core::kModuleId, callback, LogLevelInfo, "%s",
              AttachmentLine(prepared.entry.file, stream).c_str());
  } else {
    prepared.entry.description =
        "Failed to prepare video attachment for source: \"" + stem + "\", ";
    LogToHost(core::kModuleId, callback, LogLevelInfo, "%s", prepared.entry.description.c_str());
  }
  return prepared;
}

std::vector<PreparedAttachment> PrepareAttachments(const NotifyWorkItem& item,
                                                   IAttachmentWriter& writer,
                                                   core::HostCallbackFn callback) {
  std::vector<PreparedAttachment> prepared;
  if (!item.profile.attach) return prepared;
  for (const VideoSource& source : item.videoSources) {
    if (source.stream) prepared.push_back(PrepareAttachment(source, writer, callback));
  }
  return prepared;
}

// Composes and delivers one message; false unless it was sent.
bool SendMessage(NotifyWorkItem& item, const std::vector<MailAttachment>& attachments,
                 uint32_t part, uint32_t total, NotifyHelper& helper, INotifyFileStream& stream,
                 int32_t maxRetryQueue) {
  MailFile mail;
  RetryQueue& retries = helper.Retries();
  if (!ComposeMailFile(item, attachments, part, total, retries.Sequence(),
                       helper.GetEnv().WallSeconds(), stream, mail)) {
    // A message that could not be written whole (a full volume) is never
    // sent; its file would only take space until the next start.
    stream.RemoveFile(mail.path);
    LogToHost(core::kModuleId, helper.Callback(), LogLevelError,
              "Failed to prepare email notification file. (Profile Description: %s)",
              item.profile.description.c_str());
    return false;
  }
  mail.profileDescription = item.profile.description;
  mail.profileId = static_cast<uint32_t>(item.profile.id);
  DeliveryResult result = DeliverMailFile(mail, item.servers, helper);
  if (result == kDeliveryRetryable) {
    LogToHost(core::kModuleId, helper.Callback(), LogLevelError,
              "Failed to send notification using profile %s.  This message will be retried",
              item.profile.description.c_str());
    retries.Enqueue(helper, mail, item.servers, maxRetryQueue, stream);
    return false;
  }
  stream.RemoveFile(mail.path);
  if (retries.Empty()) retries.ResetSequence();
  return result == kDeliverySent;
}

}  // namespace

void RunNotificationJob(NotifyWorkItem& item, NotifyHelper& helper, INotifyFileStream& stream,
                        int32_t maxRetryQueue, IAttachmentWriter& writer) {
  if (item.profile.hasPlaceholders) {
    ExpandTemplates(item, helper.Callback(), helper.GetEnv().WebExchangeTimeout());
  }
  const std::string directory = DataDirectory();
  if (!stream.CreateDirectory(directory)) {
    LogToHost(core::kModuleId, helper.Callback(), LogLevelError,
              "Unable to create data directory: \"%s\"", directory.c_str());
    helper.ReportStatus(item.profile.id, 1);
    return;
  }
  std::vector<PreparedAttachment> prepared = PrepareAttachments(item, writer, helper.Callback());
  std::vector<std::vector<MailAttachment>> groups =
      SplitAttachments(prepared, item.profile.sizeLimit);
  uint32_t total = static_cast<uint32_t>(groups.size());
  bool allSent = true;
  for (uint32_t i = 0; i < total; ++i) {
    uint32_t part = total == 1 ? 0 : i + 1;
    allSent &= SendMessage(item, groups[i], part, total, helper, stream, maxRetryQueue);
  }
  helper.ReportStatus(item.profile.id, allSent ? 0 : 1);
  for (const PreparedAttachment& attachment : prepared) stream.RemoveFile(attachment.entry.file);
}

}  // namespace hx
