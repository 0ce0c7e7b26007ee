// The fixture of the manager's tests through the reference host: the testing
// module with a recorder of the work items its worker receives, a frame
// pusher that lends the host's buffers to Write class 1, and short ways to
// send system documents, alarm documents and ticks.
#ifndef ALERTMOD_TESTS_MANAGER_FIXTURE_H_
#define ALERTMOD_TESTS_MANAGER_FIXTURE_H_

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include "host/system_description.h"
#include "tests/support/host_fixture.h"
#include "tests/support/module_hooks.h"

namespace managertest {

// The sender of alarm documents: some other module of the host.
constexpr uint32_t kAlarmSender = 0x10000;

// A profile of "notify.xml".
struct ProfileSetting {
  int32_t id = 1;
  std::string description = "Front door";
  bool attach = false;
  int32_t maxVideoSeconds = 10;
  int32_t eventEdge = 0;
  int32_t throttleSeconds = 0;
  std::string subject = "Alarm";
  std::string body = "Something happened";
};

// The "Notify" element of `profiles`, with no SMTP server and the given size
// limit; NotifyFile wraps it as "notify.xml".
std::string NotifyElement(const std::vector<ProfileSetting>& profiles,
                          int32_t emailSizeLimitMB = 10);
std::string NotifyFile(const std::vector<ProfileSetting>& profiles, int32_t emailSizeLimitMB = 10);

class ManagerHostTest : public testsupport::ModuleHostTest {
 protected:
  // Writes `notifyFile` as "notify.xml", then loads the module with the
  // recorder, opens it and lends the worker threads.
  void StartWith(const std::string& notifyFile);

  // Sends a full system document (IOCTL code 2).
  void SendSystem(const refhost::SystemDescription& system);
  // Sends an alarm document through Write.
  void SendAlarm(const refhost::AlarmDocument& alarm);
  // One request for profile `profile` on the camera of plug-in 0x10000,
  // device 1, input 0.
  void SendAlarm(int32_t profile, int32_t alarm, int32_t action = 0);
  // The host's answer to a watchdog tick.
  void Tick();

  // Lends a buffer of `size` bytes to Write class 1 as a frame of `streamId`.
  // A refused buffer goes back to the pool at once. Returns whether it was
  // kept.
  bool PushFrame(uint32_t streamId, bool key, uint32_t size = 1000);
  // The same, returning the buffer lent (kept or, already freed, refused).
  const void* PushFrameBuffer(uint32_t streamId, bool key, uint32_t size, bool* kept);
  // How many release requests the module sent for `buffer`.
  size_t ReleasesOf(const void* buffer);
  // Pushes `count` frames, the first a key frame and then one every
  // `keySpacing`, advancing the clock by `intervalMs` before each.
  void PushFrames(uint32_t streamId, int count, int keySpacing, uint32_t intervalMs,
                  uint32_t size = 1000);

  // The live manager's state, read on the dispatcher.
  testhooks::ManagerStateRecord State();

  // Waits until `count` items have reached the worker.
  bool WaitForItems(size_t count, std::chrono::milliseconds timeout = std::chrono::seconds(20));
  // The items the worker received so far.
  std::vector<testhooks::WorkItemRecord> Items();
  // Waits for the dispatcher and the worker to have handled everything sent
  // so far, then returns how many items have arrived.
  size_t ItemCountAfterQuiet();

  // Stops the host and checks that every frame buffer came back once.
  void ExpectFramesReturned();

 private:
  static void Record(const testhooks::WorkItemRecord& record, void* context);

  std::mutex m_mutex;
  std::condition_variable m_signal;
  std::vector<testhooks::WorkItemRecord> m_items;
  size_t m_markers = 0;  // markers the worker has shown
};

}  // namespace managertest

#endif  // ALERTMOD_TESTS_MANAGER_FIXTURE_H_
