#include "alertmod/manager/stream_links.h"

#include <optional>
#include <vector>

#include "alertmod/diag/log.h"
#include "alertmod/manager/event_source_key.h"
#include "alertmod/video/video_buffer.h"

namespace hx {
namespace {

constexpr int32_t kStillImageStandard = 0;
constexpr int32_t kNoNumber = -1;

bool IsStillImage(const StreamFormatRecord& record) {
  return record.Standard == kStillImageStandard;
}

// Width times height in signed 32-bit arithmetic, computed without overflow.
int32_t PictureArea(const StreamFormatRecord& record) {
  return static_cast<int32_t>(static_cast<uint32_t>(record.Width) *
                              static_cast<uint32_t>(record.Height));
}

// Whether `candidate` should replace `current` as a camera's still stream:
// a valid number beats none, then the smaller picture wins.
bool IsBetterStill(const StreamFormatRecord& candidate, const StreamFormatRecord& current) {
  if (candidate.Number == kNoNumber) return false;
  if (current.Number == kNoNumber) return true;
  return PictureArea(candidate) < PictureArea(current);
}

// The still-image stream that serves source `key`, whose own stream is
// compressed video; nullopt when the camera has none.
std::optional<StreamFormatRecord> ChooseStillStream(uint32_t key,
                                                    const HostSystemCatalogue& catalogue) {
  std::optional<StreamFormatRecord> link;
  const uint32_t base = key & kKeyWithoutContextMask;
  if (base != key) {
    std::optional<StreamFormatRecord> main = catalogue.StreamFormat(static_cast<int32_t>(base));
    if (main && IsStillImage(*main)) link = main;
  }
  for (int32_t streamId : catalogue.CameraStreams(base)) {
    std::optional<StreamFormatRecord> extra = catalogue.StreamFormat(streamId);
    if (!extra || !IsStillImage(*extra)) continue;
    if (!link || IsBetterStill(*extra, *link)) link = extra;
  }
  return link;
}

}  // namespace

bool WantedVideo::Wants(uint32_t key) const {
  if (m_sources.count(key) != 0) return m_links.count(key) == 0;
  return m_linkedStreams.count(key) != 0;
}

void WantedVideo::SetLinks(SourceLinkMap links) {
  m_links = std::move(links);
  m_linkedStreams.clear();
  for (const auto& link : m_links) m_linkedStreams.insert(static_cast<uint32_t>(link.second.ID));
}

void RelinkStreams(WantedVideo& wanted, const HostSystemCatalogue& catalogue, VideoBuffer& buffer) {
  SourceLinkMap links;
  for (uint32_t key : wanted.Sources()) {
    const int32_t streamId = static_cast<int32_t>(key);
    std::optional<StreamFormatRecord> own = catalogue.StreamFormat(streamId);
    if (!own) {
      buffer.RemoveStream(streamId);
      continue;
    }
    if (IsStillImage(*own)) continue;
    if (std::optional<StreamFormatRecord> still = ChooseStillStream(key, catalogue)) {
      links[key] = *still;
    }
  }
  wanted.SetLinks(std::move(links));
}

void ReconcileVideoBuffer(const WantedVideo& wanted, const HostSystemCatalogue& catalogue,
                          VideoBuffer& buffer) {
  std::vector<int32_t> streamIds;
  buffer.StreamIds(&streamIds);
  for (int32_t streamId : streamIds) {
    const bool known = catalogue.StreamFormat(streamId).has_value();
    if (!known || !wanted.Wants(static_cast<uint32_t>(streamId))) buffer.RemoveStream(streamId);
  }
}

int32_t MapSourceToStream(uint32_t key, const HostSystemCatalogue& catalogue,
                          const WantedVideo& wanted, core::HostCallbackFn callback) {
  uint32_t stream = key;
  if (std::optional<int32_t> found = catalogue.FirstVideoStreamOfKey(key)) {
    stream = static_cast<uint32_t>(*found);
  } else {
    LogToHost(core::kModuleId, callback, LogLevelWarning,
              "Unable to map video input to stream/ channel id to locate video frame");
  }
  auto link = wanted.Links().find(stream);
  return link != wanted.Links().end() ? link->second.ID : static_cast<int32_t>(stream);
}

StreamFormat ToStreamFormat(const StreamFormatRecord& record) {
  StreamFormat format;
  format.lead0 = static_cast<uint32_t>(record.ID);
  format.lead1 = static_cast<uint32_t>(record.Number);
  format.width = static_cast<uint32_t>(record.Width);
  format.height = static_cast<uint32_t>(record.Height);
  format.codec = static_cast<uint32_t>(record.Standard);
  return format;
}

}  // namespace hx
