#include "tests/manager_fixture.h"

#include <thread>

#include "tests/support/temp_dir.h"

namespace managertest {

std::string NotifyFile(const std::vector<ProfileSetting>& profiles, int32_t emailSizeLimitMB) {
  return "<Trellan>" + NotifyElement(profiles, emailSizeLimitMB) + "</Trellan>";
}

std::string NotifyElement(const std::vector<ProfileSetting>& profiles, int32_t emailSizeLimitMB) {
  std::string text = "<Notify ID=\"786432\" EmailSizeLimitMB=\"" +
                     std::to_string(emailSizeLimitMB) + "\"><Servers/><Profiles>";
  for (const ProfileSetting& p : profiles) {
    text += "<smtp ID=\"" + std::to_string(p.id) + "\" attach=\"" + (p.attach ? "1" : "0") +
            "\" description=\"" + p.description + "\" ThrottleSeconds=\"" +
            std::to_string(p.throttleSeconds) + "\" from=\"cam@example\" subject=\"" + p.subject +
            "\" MaxVideoSeconds=\"" + std::to_string(p.maxVideoSeconds) + "\" EventEdge=\"" +
            std::to_string(p.eventEdge) + "\"><to>ops@example</to><body>" + p.body +
            "</body></smtp>";
  }
  return text + "</Profiles></Notify>";
}

void ManagerHostTest::StartWith(const std::string& notifyFile) {
  ASSERT_TRUE(testsupport::WriteFile("notify.xml", notifyFile));
  refhost::ReferenceHost& host = CreateHost();
  std::string error;
  ASSERT_TRUE(host.LoadModule(&error)) << error;
  auto setRecorder =
      reinterpret_cast<testhooks::SetWorkItemRecorderFn>(host.Hook("SetWorkItemRecorder"));
  ASSERT_NE(setRecorder, nullptr);
  ASSERT_TRUE(setRecorder(&ManagerHostTest::Record, this));
  host.OpenModule();
  host.LendThreads();
}

void ManagerHostTest::Record(const testhooks::WorkItemRecord& record, void* context) {
  auto* test = static_cast<ManagerHostTest*>(context);
  {
    std::lock_guard<std::mutex> lock(test->m_mutex);
    if (record.marker) {
      ++test->m_markers;
    } else {
      test->m_items.push_back(record);
    }
  }
  test->m_signal.notify_all();
}

void ManagerHostTest::SendSystem(const refhost::SystemDescription& system) {
  host().SendHostDocument(refhost::BuildSystemDocument(system));
}

void ManagerHostTest::SendAlarm(const refhost::AlarmDocument& alarm) {
  host().WriteDocument(refhost::BuildAlarmDocument(alarm), kAlarmSender);
}

void ManagerHostTest::SendAlarm(int32_t profile, int32_t alarm, int32_t action) {
  refhost::AlarmDocument document;
  refhost::AlarmRequest request;
  request.profile = profile;
  request.alarm = alarm;
  request.action = action;
  document.requests.push_back(request);
  SendAlarm(document);
}

void ManagerHostTest::Tick() {
  hx::core::WriteParmsIn in{};
  in.source = hx::core::kModuleId;
  in.requestClass = hx::core::kWriteClassTick;
  hx::core::WriteParmsOut out{};
  host().Write(in, &out);
}

bool ManagerHostTest::PushFrame(uint32_t streamId, bool key, uint32_t size) {
  bool kept = false;
  PushFrameBuffer(streamId, key, size, &kept);
  return kept;
}

const void* ManagerHostTest::PushFrameBuffer(uint32_t streamId, bool key, uint32_t size,
                                             bool* kept) {
  constexpr uint32_t kHeaderBytes = 32;
  *kept = false;
  uint8_t* buffer = host().Frames().Allocate(size);
  if (buffer == nullptr) return nullptr;
  hx::core::WriteParmsIn in{};
  in.length = size;
  in.data = buffer;
  in.source = streamId;
  in.requestClass = hx::core::kWriteClassFrame;
  in.payloadOffset = size > kHeaderBytes ? kHeaderBytes : 0;
  in.frameType = key ? hx::core::kFrameTypeKey : 0;
  hx::core::WriteParmsOut out{};
  host().Write(in, &out);
  *kept = out.frameKept != 0;
  if (!*kept) host().Frames().Discard(buffer);
  return buffer;
}

size_t ManagerHostTest::ReleasesOf(const void* buffer) {
  size_t count = 0;
  for (const auto& request : host().Requests().OfClass(hx::core::kClassFrameRelease)) {
    count += request.dataPointer == reinterpret_cast<uintptr_t>(buffer) ? 1 : 0;
  }
  return count;
}

void ManagerHostTest::PushFrames(uint32_t streamId, int count, int keySpacing, uint32_t intervalMs,
                                 uint32_t size) {
  for (int i = 0; i < count; ++i) {
    clock().Advance(std::chrono::milliseconds(intervalMs));
    PushFrame(streamId, i % keySpacing == 0, size);
  }
}

testhooks::ManagerStateRecord ManagerHostTest::State() {
  testhooks::ManagerStateRecord state;
  auto get = reinterpret_cast<testhooks::GetManagerStateFn>(host().Hook("GetManagerState"));
  EXPECT_NE(get, nullptr);
  if (get != nullptr) host().GetDispatcher().Call([&] { return get(state); });
  return state;
}

bool ManagerHostTest::WaitForItems(size_t count, std::chrono::milliseconds timeout) {
  std::unique_lock<std::mutex> lock(m_mutex);
  return m_signal.wait_for(lock, timeout, [&] { return m_items.size() >= count; });
}

std::vector<testhooks::WorkItemRecord> ManagerHostTest::Items() {
  std::lock_guard<std::mutex> lock(m_mutex);
  return m_items;
}

size_t ManagerHostTest::ItemCountAfterQuiet() {
  // A marker queued on the dispatcher follows every item that the requests
  // sent so far queued; once the worker has shown it, it has shown them all.
  auto queueMarker = reinterpret_cast<testhooks::QueueMarkerFn>(host().Hook("QueueMarker"));
  EXPECT_NE(queueMarker, nullptr);
  if (queueMarker == nullptr) return Items().size();
  size_t markers = 0;
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    markers = m_markers;
  }
  EXPECT_TRUE(host().GetDispatcher().Call([&] { return queueMarker(); }));
  std::unique_lock<std::mutex> lock(m_mutex);
  EXPECT_TRUE(
      m_signal.wait_for(lock, std::chrono::seconds(20), [&] { return m_markers > markers; }));
  return m_items.size();
}

void ManagerHostTest::ExpectFramesReturned() {
  host().Stop();
  const refhost::FramePoolCounts counts = host().Frames().Counts();
  EXPECT_EQ(0u, counts.outstanding);
  EXPECT_EQ(0u, counts.releasedTwice);
  EXPECT_EQ(0u, counts.unknown);
  EXPECT_EQ(counts.allocated, counts.returned + counts.discarded);
}

}  // namespace managertest
