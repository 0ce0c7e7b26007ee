#include "alertmod/video/video_email_stream.h"

#include <utility>

namespace hx {

CVideoEmailStream::CVideoEmailStream(const StreamFormat& format, uint64_t maxBytes,
                                     uint32_t triggerMs, uint32_t maxDurationMs,
                                     std::shared_ptr<INotifyReady> completion)
    : m_staging(format, maxBytes),
      m_clip(format, maxBytes),
      m_triggerMs(triggerMs),
      m_maxDurationMs(maxDurationMs),
      m_completion(std::move(completion)) {}

bool CVideoEmailStream::UsesShortRule() const {
  return m_clip.Format().codec == kCodecJpeg || m_clip.MaxBytes() == 0 || m_maxDurationMs == 0;
}

void CVideoEmailStream::TakeHistory(const GopBuffer& history, uint32_t preTriggerMs) {
  const std::deque<Gop>& gops = history.Gops();
  if (gops.empty() || gops.back().frames.empty()) return;
  // A history that skipped frames of its open GOP has a hole there; live
  // frames must not be appended behind it, in the clip either.
  m_clip.SetWaitForKey(history.WaitForKey());
  if (m_clip.Format().codec == kCodecJpeg) {
    m_clip.PushBack(gops.back());
    MarkDone();
    return;
  }
  if (UsesShortRule()) {
    if (gops.size() > 1) m_clip.PushBack(gops[gops.size() - 2]);
    m_clip.PushBack(gops.back());
    MarkDone();
    return;
  }
  m_clip.PushBack(gops.back());
  StagePreTrigger(history, preTriggerMs);
  if (m_clip.SpanMs() >= m_maxDurationMs) MarkDone();
}

void CVideoEmailStream::StagePreTrigger(const GopBuffer& history, uint32_t preTriggerMs) {
  const std::deque<Gop>& gops = history.Gops();
  // Newest to oldest, skipping the newest (already in the clip); staging is
  // filled at its front so that it stays oldest-first.
  for (size_t i = gops.size() - 1; i-- > 0;) {
    const Gop& gop = gops[i];
    if (gop.frames.empty()) break;
    const uint32_t age = m_triggerMs - gop.frames.back().arrivalMs;
    if (age > preTriggerMs) break;
    m_staging.PushFront(gop);
  }
}

bool CVideoEmailStream::OfferFrame(const VideoFrame& frame) {
  if (m_done) return false;
  return UsesShortRule() ? OfferToShortClip(frame) : OfferToTimedClip(frame);
}

bool CVideoEmailStream::OfferToShortClip(const VideoFrame& frame) {
  const bool kept = m_clip.Push(frame);
  // A dependent frame cannot begin a picture; finishing here would send the
  // notification without one although the next key frame is near.
  if (!kept && !frame.IsKey() && m_clip.Empty()) return false;
  if (m_clip.Gops().size() > 2) m_clip.DropFront();
  MarkDone();
  return kept;
}

bool CVideoEmailStream::OfferToTimedClip(const VideoFrame& frame) {
  if (m_clip.Bytes() + frame.Size() > m_clip.MaxBytes()) {
    MarkDone();
    return false;
  }
  if (!m_clip.Empty()) {
    const uint32_t span = frame.arrivalMs - m_clip.FirstArrivalMs();
    if (span > m_maxDurationMs) {
      MarkDone();
      return false;
    }
  }
  if (!m_clip.Push(frame)) return false;
  BalancePreTrigger(frame.arrivalMs);
  if (m_clip.SpanMs() >= m_maxDurationMs || m_clip.Bytes() >= m_clip.MaxBytes()) MarkDone();
  return true;
}

void CVideoEmailStream::BalancePreTrigger(uint32_t arrivalMs) {
  if (m_staging.Empty()) return;
  // An older GOP joins only once as much time has passed since the trigger
  // as lies between that GOP's end and the trigger, so the clip grows about
  // evenly on both sides of the event.
  const uint32_t gap = m_triggerMs - m_staging.LastArrivalMs();
  const uint32_t sinceTrigger = arrivalMs - m_triggerMs;
  if (sinceTrigger < gap) return;
  if (!MoveNewestStagedGop()) m_staging.Clear();
}

bool CVideoEmailStream::MoveNewestStagedGop() {
  if (m_staging.Empty()) return false;
  const Gop& gop = m_staging.Gops().back();
  const uint32_t span = m_clip.LastArrivalMs() - gop.frames.front().arrivalMs;
  if (span > m_maxDurationMs) return false;
  if (m_clip.Bytes() + gop.bytes > m_clip.MaxBytes()) return false;
  m_clip.PushFront(m_staging.PopBack());
  return true;
}

void CVideoEmailStream::Finish() {
  if (m_done) return;
  while (MoveNewestStagedGop()) {
  }
  MarkDone();
}

void CVideoEmailStream::MarkDone() {
  m_done = true;
  // Staged video can no longer join the clip; its frames go back early.
  m_staging.Clear();
  // Released before the call so that the notifier runs at most once, even
  // if it reaches this stream again.
  std::shared_ptr<INotifyReady> completion = std::move(m_completion);
  if (completion) completion->OnReady();
}

}  // namespace hx
