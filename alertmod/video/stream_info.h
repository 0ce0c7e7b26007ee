// CStreamInfo turns the frames of one camera clip into one MP4 or QuickTime
// file: it describes the clip's single video stream to the stream muxer and
// feeds it the frames as packets, opening the file at the first key frame.
//
// One CStreamInfo serves one attachment on the notification worker: it is
// constructed, fed every frame in order, closed and destroyed.
#ifndef ALERTMOD_VIDEO_STREAM_INFO_H_
#define ALERTMOD_VIDEO_STREAM_INFO_H_

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "alertmod/platform/env.h"
#include "alertmod/video/av_libs.h"
#include "alertmod/video/ps_convert_stream.h"

namespace videomake {

// A key frame later than this after the previous frame is logged.
constexpr int64_t kKeyFrameGapLogMs = 1500;

// The muxer options every clip is written with: the movie header is
// reserved at the start of the file ("moov_size" 16352, more when the
// clip's extent needs it). Built once.
const std::vector<hx::PSConvertOption>& ClipMuxerOptions();

class CStreamInfo final : public hx::IPSConvertStreamInfo {
 public:
  // A clip of stream `streamId` (used in log lines) in packet codec `codec`
  // (a value below 128 gets 128 added), `width` x `height` pixels, playing
  // at `fps`, written to `path` (null: the temporary directory's path
  // itself), ending before the first key frame more than `maxSpanMs` after
  // the first frame. Logs through `callback` (may be null) and muxes through
  // `libs`; the temporary directory and the clock come from `env`. Both
  // must outlive this object.
  CStreamInfo(uint32_t streamId, uint8_t codec, uint32_t width, uint32_t height, uint32_t fps,
              const char* path, int64_t maxSpanMs, hx::core::HostCallbackFn callback,
              hx::platform::Env& env, hx::av_init& libs = hx::av_init::Instance());
  ~CStreamInfo() override;
  CStreamInfo(const CStreamInfo&) = delete;
  CStreamInfo& operator=(const CStreamInfo&) = delete;

  bool GetStreamHeader(uint32_t index, hx::PSStreamDescriptor* descriptor) const override;
  int64_t GetStartTime() const override { return m_startTime; }
  double GetFrameRate() const override { return static_cast<double>(m_fps); }
  bool GetStreamSize(uint32_t index, uint32_t* width, uint32_t* height) const override;
  bool GetStreamExtent(uint32_t index, hx::PSStreamExtent* extent) const override;

  // Tells the most that will be offered, before the first frame: the file's
  // movie header is then reserved large enough for it.
  void SetExtent(const hx::PSStreamExtent& extent) {
    m_extent = extent;
    m_extentKnown = true;
  }

  // Offers the frame of `size` bytes at `data` (the payload only), which
  // arrived at `timeMs`. Returns true while the caller should go on
  // offering frames: false when the codec libraries cannot be loaded,
  // `timeMs` is 0, a key frame lies beyond the clip's span, or the muxer
  // failed. Frames before the first key frame are skipped (false until a key
  // frame was seen). A file that cannot be opened is logged and retried at
  // the next key frame.
  bool WriteFrame(const uint8_t* data, uint32_t size, int64_t timeMs, uint8_t flag,
                  uint32_t frameType);

  // Finishes the open file (header if still due, trailer) and forgets it. A
  // file that cannot be finished is removed and logged.
  void Close();

  const std::string& Path() const { return m_path; }

 private:
  struct ActiveClip {
    int64_t FirstFrame = 0;
    int64_t LastFrame = 0;
    std::unique_ptr<hx::PSConvertAVCodecStream> muxer;
  };

  bool LibrariesReady();
  // Returns false when the key frame ends the clip.
  bool AcceptKeyFrame(int64_t timeMs);
  void OpenClip(int64_t timeMs);

  uint32_t m_streamId;
  uint32_t m_width;
  uint32_t m_height;
  uint8_t m_codec;
  int64_t m_startTime = 0;
  uint32_t m_fps;
  int64_t m_maxSpanMs;
  bool m_started = false;
  std::string m_path;
  hx::PSStreamExtent m_extent;
  bool m_extentKnown = false;
  std::unique_ptr<ActiveClip> m_activeClip;
  hx::core::HostCallbackFn m_callback;
  hx::platform::Env& m_env;
  hx::av_init& m_libs;
};

}  // namespace videomake

#endif  // ALERTMOD_VIDEO_STREAM_INFO_H_
