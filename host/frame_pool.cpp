#include "host/frame_pool.h"

#include <cstdlib>
#include <new>

namespace refhost {
namespace {

// Beyond this many remembered addresses the oldest knowledge is dropped; a
// late second release is then counted as unknown, still a fault.
constexpr size_t kMaxRememberedFrees = 1u << 20;

}  // namespace

FramePool::~FramePool() {
  for (const auto& entry : m_lent) std::free(const_cast<void*>(entry.first));
}

uint8_t* FramePool::Allocate(size_t size) {
  if (size == 0) return nullptr;
  auto* buffer = static_cast<uint8_t*>(std::malloc(size));
  if (buffer == nullptr) return nullptr;
  MutexLock lock(m_mutex);
  try {
    m_lent.emplace(buffer, size);
  } catch (const std::bad_alloc&) {
    std::free(buffer);
    return nullptr;
  }
  m_freed.erase(buffer);
  ++m_counts.allocated;
  ++m_counts.outstanding;
  m_counts.outstandingBytes += size;
  if (m_counts.outstandingBytes > m_counts.peakOutstandingBytes) {
    m_counts.peakOutstandingBytes = m_counts.outstandingBytes;
  }
  return buffer;
}

void FramePool::Discard(const void* buffer) {
  TakeBack(buffer, ReturnKind::kDiscard);
}

void FramePool::Release(const void* buffer) {
  TakeBack(buffer, ReturnKind::kRelease);
}

int32_t FramePool::OnReleaseRequest(const hx::core::HostRequest& request) {
  Release(request.data);
  return 0;
}

void FramePool::TakeBack(const void* buffer, ReturnKind how) {
  MutexLock lock(m_mutex);
  auto found = m_lent.find(buffer);
  if (found == m_lent.end()) {
    if (m_freed.count(buffer) != 0) {
      ++m_counts.releasedTwice;
    } else {
      ++m_counts.unknown;
    }
    return;
  }
  m_counts.outstandingBytes -= found->second;
  --m_counts.outstanding;
  ++(how == ReturnKind::kRelease ? m_counts.returned : m_counts.discarded);
  m_lent.erase(found);
  if (m_freed.size() >= kMaxRememberedFrees) m_freed.clear();
  try {
    m_freed.insert(buffer);
  } catch (const std::bad_alloc&) {
    // Only the second-release diagnosis is lost.
  }
  std::free(const_cast<void*>(buffer));
}

FramePoolCounts FramePool::Counts() const {
  MutexLock lock(m_mutex);
  return m_counts;
}

std::string FramePool::FaultReport() const {
  const FramePoolCounts counts = Counts();
  if (counts.outstanding == 0 && counts.releasedTwice == 0 && counts.unknown == 0) return {};
  return "frame buffers: " + std::to_string(counts.outstanding) + " never returned (" +
         std::to_string(counts.outstandingBytes) + " bytes), " +
         std::to_string(counts.releasedTwice) + " released twice, " +
         std::to_string(counts.unknown) + " unknown released";
}

}  // namespace refhost
