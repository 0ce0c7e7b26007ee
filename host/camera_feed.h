// CameraFeed plays a video file as one camera stream of the recording server:
// it demuxes H.264, H.265, MPEG-4 Part 2 or motion JPEG with libavformat and
// hands each compressed frame to the module through Write class 1, in a
// buffer of its own from the FramePool with a small host header in front of
// the payload. Frames the module refuses are freed at once; kept ones wait
// for the module's release.
//
// A feed runs on a thread of its own (Start) or on the caller's (Run). Stop
// the feeds before stopping the host. Stats() may be read from any thread.
#ifndef ALERTMOD_HOST_CAMERA_FEED_H_
#define ALERTMOD_HOST_CAMERA_FEED_H_

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <thread>

#include "host/frame_pool.h"
#include "host/mutex.h"
#include "host/reference_host.h"
#include "host/thread_annotations.h"

namespace refhost {

// The host header in front of every frame's payload.
struct FrameHeader {
  uint32_t magic;         // kFrameHeaderMagic
  uint16_t headerBytes;   // sizeof(FrameHeader): the frame's payload offset
  uint16_t flags;         // kFrameFlagKey for a key frame
  uint32_t streamId;      // the stream the feed plays
  uint32_t payloadBytes;  // bytes after the header
  uint64_t sequence;      // 0, 1, 2, ... per feed
  int64_t timeMs;         // presentation time in the file, milliseconds
};
static_assert(sizeof(FrameHeader) == 32, "the host frame header is 32 bytes");

constexpr uint32_t kFrameHeaderMagic = 0x48464D41;  // "AMFH"
constexpr uint16_t kFrameFlagKey = 1;

struct FeedOptions {
  std::string path;
  uint32_t streamId = 0;
  // At the file's frame rate when true, else as fast as the module takes them.
  bool realTime = true;
  // How often the file is played; 0 repeats it until Stop().
  int loops = 1;
  // Called before each frame is written, with its header and payload.
  std::function<void(const FrameHeader& header, const uint8_t* payload)> observer;
};

// The stream as the host's catalogue would describe it.
struct FeedFormat {
  uint32_t width = 0;
  uint32_t height = 0;
  uint32_t codec = 0;  // host codec code: 0 JPEG, 4 MPEG-4, 5 H.264, 6 H.265
  double fps = 0;
};

struct FeedStats {
  uint64_t frames = 0;     // written to the module
  uint64_t keyFrames = 0;  // of which key frames
  uint64_t kept = 0;       // the module kept them
  uint64_t refused = 0;    // the module refused them; freed at once
  uint64_t failed = 0;     // could not be written (no buffer, host stopped)
  uint64_t payloadBytes = 0;
};

class CameraFeed {
 public:
  CameraFeed(ReferenceHost& host, FramePool& pool, FeedOptions options);
  ~CameraFeed();  // Stop()

  CameraFeed(const CameraFeed&) = delete;
  CameraFeed& operator=(const CameraFeed&) = delete;

  // Opens the file and finds its video stream. False, with `error` filled,
  // when the file cannot be read, has no video or a codec the host cannot
  // describe.
  bool Open(std::string* error);
  // Valid after a successful Open().
  const FeedFormat& Format() const { return m_format; }

  // Plays the file (Open() first when needed) on the calling thread until it
  // ends or Stop() is called. False, with `error`, when it cannot be read.
  bool Run(std::string* error);

  // Open(), then Run() on a thread of its own. False with `error` when the
  // file cannot be opened or the feed already runs.
  bool Start(std::string* error);
  // Waits for a started feed to end. Returns Run()'s result and error.
  bool Wait(std::string* error);
  // Ends the feed as soon as possible and waits for its thread.
  void Stop();

  FeedStats Stats() const;

 private:
  class Demuxer;

  bool PlayOnce(std::string* error);
  void Push(const uint8_t* payload, size_t size, bool key, int64_t timeMs);
  bool WriteFrame(uint8_t* buffer, uint32_t length, bool key);
  void Pace();

  ReferenceHost& m_host;
  FramePool& m_pool;
  const FeedOptions m_options;
  std::unique_ptr<Demuxer> m_demuxer;
  FeedFormat m_format;
  uint64_t m_sequence = 0;
  std::chrono::steady_clock::time_point m_start;

  Mutex m_mutex;
  ConditionVariable m_wake;
  bool m_stop GUARDED_BY(m_mutex) = false;
  std::thread m_thread;
  bool m_result GUARDED_BY(m_mutex) = true;
  std::string m_error GUARDED_BY(m_mutex);

  mutable Mutex m_statsMutex;
  FeedStats m_stats GUARDED_BY(m_statsMutex);
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_CAMERA_FEED_H_
