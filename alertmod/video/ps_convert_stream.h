// The stream muxer: writes packets of the recording system's packet format
// into an MP4 or QuickTime file (the container is chosen by the file name's
// extension) through the codec libraries, passing the compressed frames
// through unchanged apart from their framing.
//
// IPSConvertStreamInfo describes the streams to write; IPSConvertStream is
// the muxer; PSConvertAVCodecStream implements it on FFmpeg. A stream the
// container cannot store fails Open: this muxer does not re-encode.
//
// H.264 and H.265 frames are held a group of pictures at a time (from one key
// frame to the next): the codec libraries' parser gives each frame's picture
// order, from which the frames get their presentation times in display
// order, so that streams with B-frames play as they were shot.
//
// One muxer is used by one thread at a time (the notification worker). The
// payload bytes handed to WritePacket are only read, never changed.
#ifndef ALERTMOD_VIDEO_PS_CONVERT_STREAM_H_
#define ALERTMOD_VIDEO_PS_CONVERT_STREAM_H_

#include <array>
#include <climits>
#include <cstdint>
#include <string>
#include <vector>

#include "alertmod/platform/env.h"
#include "alertmod/video/av_libs.h"
#include "alertmod/video/nal_units.h"
#include "alertmod/video/ps_packet.h"

namespace hx {

// Highest number of streams one muxer writes.
constexpr uint32_t kMaxConvertStreams = 48;

// Open's result on failure, and the header failure of Close and WriteHeader.
constexpr int kConvertOpenFailed = -1;
constexpr int kConvertHeaderFailed = -2;

// The most a caller will write of one stream.
struct PSStreamExtent {
  uint64_t frames = 0;
  uint64_t keyFrames = 0;
  uint64_t bytes = 0;  // payload bytes of all frames
};

// Describes the streams of a packet file to the muxer.
class IPSConvertStreamInfo {
 public:
  virtual ~IPSConvertStreamInfo() = default;
  // Fills `descriptor` for stream `index` and returns true, or returns false
  // when there is no such stream (streams are numbered from 0 without gaps).
  virtual bool GetStreamHeader(uint32_t index, PSStreamDescriptor* descriptor) const = 0;
  // Milliseconds since 1970 of the recording's start; 0 when none.
  virtual int64_t GetStartTime() const = 0;
  // Frames per second of the video.
  virtual double GetFrameRate() const = 0;
  // The exact picture size of stream `index`, when known; the descriptor
  // carries it only in 16-pixel units. Returns false when not known.
  virtual bool GetStreamSize(uint32_t index, uint32_t* width, uint32_t* height) const {
    (void)index;
    (void)width;
    (void)height;
    return false;
  }
  // What will be written of stream `index` at most, when known: a movie
  // header reserved through the "moov_size" option then grows to hold it.
  // Returns false when not known.
  virtual bool GetStreamExtent(uint32_t index, PSStreamExtent* extent) const {
    (void)index;
    (void)extent;
    return false;
  }
};

// One option for the container when it writes its header.
struct PSConvertOption {
  std::string name;
  std::string value;
  int flags = 0;
};

class IPSConvertStream {
 public:
  virtual ~IPSConvertStream() = default;
  // Creates `fileName` with the streams `info` describes. Returns 0, or
  // kConvertOpenFailed (nothing written, no file left) when the name gives
  // no container, the container cannot store a stream, or the file cannot
  // be created.
  virtual int Open(const PSFileHeader& header, const IPSConvertStreamInfo& info,
                   const std::string& fileName) = 0;
  // Writes one packet. The container header is written once every stream's
  // configuration is known and every H.264 and H.265 stream has shown its
  // first group of pictures whole; packets before that are held back
  // (copied). Returns a negative value on failure, also one of writing the
  // group of pictures that a key frame closes; packets of unknown streams
  // are ignored (0).
  virtual int WritePacket(const _PSFILE_PACKET& packet) = 0;
  // Writes the header if still due and the frames still held, finishes and
  // closes the file. Returns
  // the trailer's result, kConvertHeaderFailed when the header could not be
  // written, and 0 when nothing is open. A file that could not be finished
  // is removed, so a broken file is never left behind.
  virtual int Close() = 0;
  // Writes the container header now if not yet done, then the held-back
  // packets. Returns 0 (also when already written) or kConvertHeaderFailed,
  // also on every later call once the header was refused.
  virtual int WriteHeader() = 0;
  // True when the name gives a container format.
  virtual bool CanWrite(const std::string& fileName) = 0;
  // Replaces the options applied when the header is written. A "moov_size"
  // too small for the extent that the stream description gives is raised
  // to fit it.
  virtual void SetOptions(const std::vector<PSConvertOption>& options) = 0;
  // Frames per second of stream `index`: -1 when it has no frame rate, 0
  // when there is no such stream.
  virtual double FrameRate(uint32_t index) = 0;
  // Length of one frame of stream `index` in milliseconds; 0 when unknown.
  virtual int64_t FrameDuration(uint32_t index) = 0;
};

class PSConvertAVCodecStream final : public IPSConvertStream {
 public:
  // Uses `libs`, which must stay alive; every call fails cleanly when they
  // are not all loaded. The file's creation time is read from `env`.
  explicit PSConvertAVCodecStream(platform::Env& env, av_init& libs = av_init::Instance());
  ~PSConvertAVCodecStream() override;
  PSConvertAVCodecStream(const PSConvertAVCodecStream&) = delete;
  PSConvertAVCodecStream& operator=(const PSConvertAVCodecStream&) = delete;

  int Open(const PSFileHeader& header, const IPSConvertStreamInfo& info,
           const std::string& fileName) override;
  int WritePacket(const _PSFILE_PACKET& packet) override;
  int Close() override;
  int WriteHeader() override;
  bool CanWrite(const std::string& fileName) override;
  void SetOptions(const std::vector<PSConvertOption>& options) override;
  double FrameRate(uint32_t index) override;
  int64_t FrameDuration(uint32_t index) override;

 private:
  // The parser could not tell a frame's place in display order.
  static constexpr int kNoPictureOrder = INT_MIN;
  // One frame of the group of pictures being held, in its stored framing.
  struct GopFrame {
    std::vector<uint8_t> data;
    bool key = false;
    int order = 0;  // picture order, or kNoPictureOrder
  };
  struct StreamSlot {
    AVStream* stream = nullptr;
    uint8_t codec = kPSCodecNone;
    AVRational frameRate{0, 1};
    ParameterSets parameterSets;
    bool configured = false;   // the container has what it needs
    int64_t frameCounter = 0;  // frames written, in decoding order
    PSStreamExtent extent;
    bool extentKnown = false;
    // Picture order (H.264, H.265 only).
    AVCodecParserContext* parser = nullptr;
    AVCodecContext* parserCodec = nullptr;
    std::vector<GopFrame> gop;
    int64_t reorderDepth = 0;  // frames by which presentation trails decoding
    // Before the header: what the first group of pictures showed.
    uint32_t keyFramesSeen = 0;
    int highestOrder = 0;
    bool reorders = false;
  };
  struct HeldPacket {
    _PSFILE_PACKET packet;
    std::vector<uint8_t> payload;
    int order = 0;
  };

  bool Usable() const;
  bool CheckPrimaryCodec(const PSFileHeader& header);
  bool CreateOutput(const std::string& fileName);
  void SetCreationTime();
  bool CreateStreams(const IPSConvertStreamInfo& info);
  bool CreateStream(const IPSConvertStreamInfo& info, uint32_t index,
                    const PSStreamDescriptor& descriptor);
  void ApplyStartTime(const IPSConvertStreamInfo& info);
  void CreateParser(StreamSlot* slot, AVCodecID id);
  int PictureOrder(StreamSlot* slot, const _PSFILE_PACKET& packet);
  void NoteFirstGop(StreamSlot* slot, const _PSFILE_PACKET& packet, int order);
  bool ReadyForHeader() const;
  std::string MovieHeaderSize(const std::string& requested) const;
  void CollectConfiguration(StreamSlot* slot, const _PSFILE_PACKET& packet);
  bool SetExtradata(StreamSlot* slot, const uint8_t* data, size_t size);
  bool AllConfigured() const;
  void HoldBack(const _PSFILE_PACKET& packet, int order);
  int WriteHeldBack();
  // Writes a packet after the header: other codecs at once, H.264 and H.265
  // into the held group of pictures, which a key frame first writes out.
  int WriteToContainer(StreamSlot* slot, const _PSFILE_PACKET& packet, int order);
  int WriteGop(StreamSlot* slot);
  // Writes the packet's payload as the next frame in decoding order, shown
  // as frame `presentation`.
  int Mux(StreamSlot* slot, bool key, int64_t presentation);
  // 1 when the packet holds the payload, 0 when there is none, else an error.
  int FillPayload(const uint8_t* data, size_t size);
  void ReleaseParsers();
  void Release(bool removeFile);

  platform::Env& m_env;
  av_init& m_libs;
  AVFormatContext* m_context = nullptr;
  AVDictionary* m_formatOptions = nullptr;
  AVPacket* m_avPacket = nullptr;
  std::vector<PSConvertOption> m_options;
  std::string m_fileName;
  bool m_isAvi = false;
  bool m_headerWritten = false;
  bool m_headerFailed = false;  // the container refused its header; never retried
  std::array<StreamSlot, kMaxConvertStreams> m_slots;
  std::vector<HeldPacket> m_heldBack;
  std::vector<NalUnit> m_units;        // reused between packets
  std::vector<uint8_t> m_parserInput;  // reused between packets
};

}  // namespace hx

#endif  // ALERTMOD_VIDEO_PS_CONVERT_STREAM_H_
