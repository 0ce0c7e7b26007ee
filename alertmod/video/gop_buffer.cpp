#include "alertmod/video/gop_buffer.h"

#include <utility>

namespace hx {

bool GopBuffer::Push(const VideoFrame& frame) {
  if (!frame.data) return false;
  const bool key = frame.IsKey();
  if (key) {
    m_waitForKey = false;
  } else if (m_waitForKey) {
    return false;
  }
  if (m_format.codec == kCodecJpeg) TrimStills();
  const uint64_t size = frame.Size();
  if (!MakeRoom(size, key)) return false;
  if (key) {
    OpenGop(frame);
  } else {
    if (m_gops.empty()) return false;
    Gop& newest = m_gops.back();
    newest.frames.push_back(frame);
    newest.bytes += size;
  }
  m_bytes += size;
  ++m_frames;
  return true;
}

void GopBuffer::TrimStills() {
  // Room for the still that may follow: never more than the cap after a push.
  while (m_gops.size() >= kMaxJpegStills) DropFront();
}

bool GopBuffer::MakeRoom(uint64_t size, bool key) {
  while (m_bytes + size > m_maxBytes) {
    if (m_gops.empty()) return false;
    if (m_gops.size() == 1 && !key) {
      // The open GOP cannot lose its head without breaking the frames that
      // follow, so nothing more joins it.
      m_waitForKey = true;
      return false;
    }
    DropFront();
  }
  return true;
}

void GopBuffer::OpenGop(const VideoFrame& frame) {
  Gop gop;
  // GOPs of a stream tend to be alike in length; one allocation per GOP.
  gop.frames.reserve(m_gops.empty() ? 1 : m_gops.back().frames.size());
  gop.frames.push_back(frame);
  gop.bytes = frame.Size();
  m_gops.push_back(std::move(gop));
}

void GopBuffer::Clear() {
  m_gops.clear();
  m_bytes = 0;
  m_frames = 0;
}

void GopBuffer::DropFront() {
  if (m_gops.empty()) return;
  m_bytes -= m_gops.front().bytes;
  m_frames -= m_gops.front().frames.size();
  m_gops.pop_front();
}

void GopBuffer::PushFront(Gop gop) {
  Insert(std::move(gop), true);
}

void GopBuffer::PushBack(Gop gop) {
  Insert(std::move(gop), false);
}

void GopBuffer::Insert(Gop gop, bool atFront) {
  const uint64_t bytes = gop.bytes;
  const uint64_t frames = gop.frames.size();
  // Counted only once the GOP is in, so that a failed insert changes nothing.
  if (atFront) {
    m_gops.push_front(std::move(gop));
  } else {
    m_gops.push_back(std::move(gop));
  }
  m_bytes += bytes;
  m_frames += frames;
}

Gop GopBuffer::PopBack() {
  Gop gop = std::move(m_gops.back());
  m_gops.pop_back();
  m_bytes -= gop.bytes;
  m_frames -= gop.frames.size();
  return gop;
}

uint32_t GopBuffer::FirstArrivalMs() const {
  if (m_gops.empty() || m_gops.front().frames.empty()) return 0;
  return m_gops.front().frames.front().arrivalMs;
}

uint32_t GopBuffer::LastArrivalMs() const {
  if (m_gops.empty() || m_gops.back().frames.empty()) return 0;
  return m_gops.back().frames.back().arrivalMs;
}

}  // namespace hx
