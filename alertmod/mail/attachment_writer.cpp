#include "alertmod/mail/notification_job.h"
#include "alertmod/video/clip_writer.h"

namespace hx {
namespace {

// Writes attachments with the clip writer and the codec libraries it loads.
class ClipAttachmentWriter final : public IAttachmentWriter {
 public:
  explicit ClipAttachmentWriter(core::HostCallbackFn callback) : m_callback(callback) {}

  bool WriteVideo(const VideoSource& source, const std::string& path) override {
    return WriteVideoAttachment(source.sourceKey, *source.stream, path, m_callback);
  }
  bool WriteJpeg(const CVideoEmailStream& stream, const std::string& path) override {
    return WriteJpegAttachment(stream, path);
  }

 private:
  core::HostCallbackFn m_callback;
};

}  // namespace

std::unique_ptr<IAttachmentWriter> MakeAttachmentWriter(core::HostCallbackFn callback) {
  return std::make_unique<ClipAttachmentWriter>(callback);
}

}  // namespace hx
