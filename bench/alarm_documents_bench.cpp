// Alarm documents handled per second through Write: the reference host sends
// a realistic document with one request (server facts, time, message, a
// camera source) to the testing module, which knows a system of 64 cameras
// whose events all notify. "Notified" builds and queues a work item for each
// document (the worker drops it); "EdgeRejected" stops at the profile's event
// edge. The baseline parses the same text with TinyXML alone, the floor of
// any handling.
#include <benchmark/benchmark.h>
#include <tinyxml.h>

#include <string>

#include "bench/manager_session.h"
#include "host/system_description.h"

namespace {

constexpr int32_t kEncoders = 0x10000;
constexpr int kCameras = 64;
constexpr uint32_t kAlarmSender = 0x10000;

std::string NotifyFile() {
  return R"(<Trellan><Notify ID="786432"><Servers><smtp description="main" address="127.0.0.1" port="25"/></Servers><Profiles>)"
         R"(<smtp ID="1" attach="0" description="Cameras" ThrottleSeconds="0" from="nvr@example" )"
         R"(subject="{event type} on {source} at {system name}" MaxVideoSeconds="10" EventEdge="2">)"
         R"(<to>ops@example</to><body>{event type} {event state} on {source}, {date} {time}</body></smtp>)"
         R"(<smtp ID="2" attach="0" description="End only" ThrottleSeconds="0" from="nvr@example" )"
         R"(subject="s" MaxVideoSeconds="10" EventEdge="1"><to>ops@example</to></smtp>)"
         R"(</Profiles></Notify></Trellan>)";
}

refhost::SystemDescription Site() {
  refhost::SystemDescription site;
  site.pluginDescriptions[kEncoders] = "IP Cameras";
  for (int i = 0; i < kCameras; ++i) {
    const int32_t device = 1 + i / 4;
    const int32_t input = i % 4;
    site.cameras.push_back({"Camera " + std::to_string(i), kEncoders, device, input, {}});
    site.events.push_back(
        {100 + i, 5, refhost::EventSourceRef::Camera(kEncoders, device, input), {1, 2}});
  }
  return site;
}

std::string AlarmText(int32_t profile) {
  refhost::AlarmDocument alarm;
  alarm.serverSerial = "NVR-000123";
  alarm.serverDescription = "Main recording server";
  refhost::AlarmRequest request;
  request.profile = profile;
  request.action = 137;
  request.time = 1767225600;
  request.milliseconds = 250;
  request.message = "Motion detected";
  request.source = refhost::AlarmRequest::Source{kEncoders, 9, 2, 0, 1};
  alarm.requests = {request};
  return refhost::BuildAlarmDocument(alarm);
}

void RunAlarms(benchmark::State& state, int32_t profile) {
  benchsupport::ManagerSession session(NotifyFile());
  if (!session.Ready()) {
    state.SkipWithError("the testing module could not be started");
    return;
  }
  session.Host().SendHostDocument(refhost::BuildSystemDocument(Site()));
  const std::string text = AlarmText(profile);
  session.OnDispatcher([&] {
    for (auto _ : state) session.Host().WriteDocument(text, kAlarmSender);
  });
  state.SetItemsProcessed(state.iterations());
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(text.size()));
}

void BM_AlarmDocumentNotified(benchmark::State& state) {
  RunAlarms(state, 1);
}
BENCHMARK(BM_AlarmDocumentNotified)->MinTime(2.0)->UseRealTime();

void BM_AlarmDocumentEdgeRejected(benchmark::State& state) {
  RunAlarms(state, 2);
}
BENCHMARK(BM_AlarmDocumentEdgeRejected)->MinTime(2.0)->UseRealTime();

void BM_ParseOnlyBaseline(benchmark::State& state) {
  const std::string text = AlarmText(1);
  for (auto _ : state) {
    TiXmlDocument document;
    document.Parse(text.c_str());
    benchmark::DoNotOptimize(document.RootElement());
  }
  state.SetItemsProcessed(state.iterations());
  state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(text.size()));
}
BENCHMARK(BM_ParseOnlyBaseline)->MinTime(2.0);

}  // namespace

BENCHMARK_MAIN();
