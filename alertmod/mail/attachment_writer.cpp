#include "alertmod/mail/notification_job.h"

namespace hx {
namespace {

// Stands in until the clip writer is wired: every attachment fails, so the
// message goes out with the failure line in its body.
class NoAttachmentWriter final : public IAttachmentWriter {
 public:
  bool WriteVideo(const VideoSource&, const std::string&) override { return false; }
  bool WriteJpeg(const CVideoEmailStream&, const std::string&) override { return false; }
};

}  // namespace

std::unique_ptr<IAttachmentWriter> MakeAttachmentWriter(core::HostCallbackFn) {
  return std::make_unique<NoAttachmentWriter>();
}

}  // namespace hx
