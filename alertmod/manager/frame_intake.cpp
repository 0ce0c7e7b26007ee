// The frame-intake gate (Write class 1): which of the host's frames the
// video buffer gets to keep.
#include "alertmod/manager/notify_manager.h"

#include "alertmod/diag/log.h"

namespace hx {

bool NotifyManager::OnFrame(uint32_t streamId, uint8_t frameType, uint32_t payloadOffset,
                            const void* data, uint32_t length) {
  // A size limit of 0 turns video off; the limit is clamped, so sizes of
  // 2048 MiB and more do not wrap to 0 here.
  if (m_config.EmailSizeLimitBytes() == 0) return false;
  const int32_t stream = static_cast<int32_t>(streamId);
  const uint32_t key = m_catalogue.StreamSourceKey(stream);
  if (key == 0 || !m_wanted.Wants(key)) return false;
  std::optional<StreamFormatRecord> record = m_catalogue.StreamFormat(stream);
  if (!record) return false;
  if (!m_videoBuffer.AddFrame(stream, frameType, payloadOffset, data, length,
                              ToStreamFormat(*record))) {
    return false;
  }
  // The buffer is the module's now: the host must hear "kept" whatever
  // becomes of the notifications.
  try {
    ReleaseReady();
  } catch (...) {
    LogToHost(core::kModuleId, m_callback, LogLevelError,
              "Ready notifications could not be queued; they are queued with the next frame");
  }
  return true;
}

}  // namespace hx
