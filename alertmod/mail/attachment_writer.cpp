#include "alertmod/mail/notification_job.h"
#include "alertmod/video/clip_writer.h"

namespace hx {
namespace {

// Writes attachments with the clip writer and the codec libraries it loads.
class ClipAttachmentWriter final : public IAttachmentWriter {
 public:
  ClipAttachmentWriter(core::HostCallbackFn callback, platform::Env& env)
      : m_callback(callback), m_env(env) {}

  bool WriteVideo(const VideoSource& source, const std::string& path) override {
    return WriteVideoAttachment(source.sourceKey, *source.stream, path, m_callback, m_env);
  }
  bool WriteJpeg(const CVideoEmailStream& stream, const std::string& path) override {
    return WriteJpegAttachment(stream, path, m_env);
  }

 private:
  core::HostCallbackFn m_callback;
  platform::Env& m_env;
};

}  // namespace

std::unique_ptr<IAttachmentWriter> MakeAttachmentWriter(core::HostCallbackFn callback,
                                                        platform::Env& env) {
  return std::make_unique<ClipAttachmentWriter>(callback, env);
}

}  // namespace hx
