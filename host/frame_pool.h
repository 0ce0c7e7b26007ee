// The reference host's frame buffers. Each frame the host hands to the module
// lives in a buffer of its own that the host owns. A buffer the module keeps
// stays allocated until the module returns it with a release request (class
// 0x200, data = the buffer); a buffer the module refuses is freed by the host
// at once. The pool counts what goes wrong: buffers returned twice, returns
// of buffers it never lent, and buffers never returned.
//
// Thread-safe: feeds allocate on their own threads, and the module returns
// buffers from the dispatcher thread or from its worker.
#ifndef ALERTMOD_HOST_FRAME_POOL_H_
#define ALERTMOD_HOST_FRAME_POOL_H_

#include <cstddef>
#include <cstdint>
#include <string>
#include <unordered_map>
#include <unordered_set>

#include "alertmod/host_records.h"
#include "host/mutex.h"
#include "host/thread_annotations.h"

namespace refhost {

struct FramePoolCounts {
  uint64_t allocated = 0;      // buffers handed out by Allocate
  uint64_t outstanding = 0;    // lent and neither returned nor discarded
  uint64_t returned = 0;       // returned by the module's release request
  uint64_t discarded = 0;      // freed by the host because the module refused them
  uint64_t releasedTwice = 0;  // release requests for a buffer already freed
  uint64_t unknown = 0;        // release requests for a buffer never lent
  uint64_t outstandingBytes = 0;
  uint64_t peakOutstandingBytes = 0;
};

class FramePool {
 public:
  FramePool() = default;
  // Frees whatever is still outstanding.
  ~FramePool();

  FramePool(const FramePool&) = delete;
  FramePool& operator=(const FramePool&) = delete;

  // A new buffer of `size` bytes, or null when `size` is 0 or memory is short.
  uint8_t* Allocate(size_t size) EXCLUDES(m_mutex);

  // The module refused the frame in `buffer`: the host frees it at once.
  // Counted like a release when the buffer is not outstanding.
  void Discard(const void* buffer) EXCLUDES(m_mutex);

  // The module returns `buffer`. Frees it when outstanding; otherwise counts
  // a second release or an unknown buffer.
  void Release(const void* buffer) EXCLUDES(m_mutex);

  // The class 0x200 handler: Release(request.data). Returns 0.
  int32_t OnReleaseRequest(const hx::core::HostRequest& request);

  FramePoolCounts Counts() const EXCLUDES(m_mutex);

  // One line describing any fault (buffers outstanding, released twice,
  // unknown), or empty when there is none.
  std::string FaultReport() const;

 private:
  enum class ReturnKind { kRelease, kDiscard };
  void TakeBack(const void* buffer, ReturnKind how) EXCLUDES(m_mutex);

  mutable Mutex m_mutex;
  std::unordered_map<const void*, size_t> m_lent GUARDED_BY(m_mutex);  // buffer -> size
  // Freed buffers, to tell a second release from an unknown one. An address
  // leaves the set when the allocator hands it out again.
  std::unordered_set<const void*> m_freed GUARDED_BY(m_mutex);
  FramePoolCounts m_counts GUARDED_BY(m_mutex);
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_FRAME_POOL_H_
