#include "alertmod/video/frame_data.h"

namespace hx {

FrameData::~FrameData() {
  // The buffer is the host's; it may reuse it only once the module says so,
  // and this destructor runs exactly once, when the last holder lets go.
  if (m_host == nullptr || m_data == nullptr) return;
  core::HostRequest request = core::MakeHostRequest(core::kModuleId, core::kClassFrameRelease, 0);
  request.data = const_cast<void*>(m_data);
  request.length = 0;
  m_host(&request, nullptr);
}

std::shared_ptr<FrameData> MakeFrameData(core::HostCallbackFn host, const void* data,
                                         uint32_t size) {
  // One allocation holds both the count and the record.
  return std::make_shared<FrameData>(host, data, size);
}

}  // namespace hx
