// Alarm-to-delivery latency and throughput of plain messages: the reference
// host writes an alarm document to the testing module, whose worker composes
// the message and runs the real curl through the host's process service
// against a local aiosmtpd; a message counts as delivered when the module
// reports its profile's status 0 (curl has had the server's answer to the
// message by then). 200 alarms one after the other give the latency; 200 at
// once give the throughput.
//
// The baseline runs curl directly with the command line the module used and
// a message file it composed, 200 times one after the other against the same
// server: what delivery costs without the module. overhead_ms is the
// module's median latency minus the baseline's.
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "alertmod/host_records.h"
#include "host/reference_host.h"
#include "host/system_description.h"
#include "tests/support/smtp_server.h"

extern char** environ;

namespace {

using Clock = std::chrono::steady_clock;

constexpr int kMessages = 200;
constexpr int32_t kProfile = 1;
constexpr uint32_t kAlarmSender = 0x10000;
constexpr auto kDeliveryTimeout = std::chrono::seconds(60);

// The baseline's median latency, for the module's overhead; the baseline is
// registered first.
double g_baselineMedianMs = 0;

std::string NotifyFile(int port) {
  return "<Trellan><Notify ID=\"786432\"><Servers><smtp description=\"local\" "
         "address=\"127.0.0.1\" port=\"" +
         std::to_string(port) +
         "\" UseSSL=\"0\"/></Servers><Profiles><smtp ID=\"1\" attach=\"0\" description=\"Desk\" "
         "ThrottleSeconds=\"0\" from=\"nvr@example.com\" subject=\"{event type} on {source}\" "
         "MaxVideoSeconds=\"0\" EventEdge=\"2\"><to>ops@example.com</to>"
         "<body>Something happened at {time}.</body></smtp></Profiles></Notify></Trellan>";
}

struct Latencies {
  double medianMs = 0;
  double p99Ms = 0;
};

Latencies Summarize(std::vector<double> ms) {
  Latencies result;
  if (ms.empty()) return result;
  std::sort(ms.begin(), ms.end());
  result.medianMs = ms[ms.size() / 2];
  result.p99Ms = ms[std::min(ms.size() - 1, ms.size() * 99 / 100)];
  return result;
}

void Report(benchmark::State& state, const std::vector<double>& latenciesMs, double seconds) {
  const Latencies summary = Summarize(latenciesMs);
  state.counters["median_ms"] = summary.medianMs;
  state.counters["p99_ms"] = summary.p99Ms;
  state.counters["msgs_per_s"] = seconds > 0 ? latenciesMs.size() / seconds : 0;
}

// A working directory, the SMTP server and the host with the testing module,
// which reports each profile status to Delivered(). The host keeps its
// requests only when `recordRequests`.
class DeliverySession {
 public:
  explicit DeliverySession(const std::string& transferTool = "curl", bool recordRequests = false) {
    char pattern[] = "/tmp/alertmod-bench-XXXXXX";
    if (mkdtemp(pattern) == nullptr) return;
    m_dir = pattern;
    m_previous = std::filesystem::current_path();
    std::filesystem::current_path(m_dir);
    m_smtp = std::make_unique<testsupport::SmtpTestServer>();
    if (m_smtp->port() <= 0) return;
    std::ofstream(m_dir + "/notify.xml") << NotifyFile(m_smtp->port());
    refhost::HostOptions options;
    options.modulePath = ALERTMOD_TESTING_MODULE_PATH;
    options.echoLog = false;
    options.recordRequests = recordRequests;
    options.logThreshold = 50;
    options.transferTool = transferTool;
    m_host = std::make_unique<refhost::ReferenceHost>(options);
    m_host->SetHandler(hx::core::kClassProfileStatus, [this](hx::core::HostRequest& request) {
      const std::string text(static_cast<const char*>(request.data), request.length);
      std::lock_guard<std::mutex> lock(m_mutex);
      (text.find("Status=\"0\"") != std::string::npos ? m_delivered : m_failed)
          .push_back(Clock::now());
      m_signal.notify_all();
      return 0;
    });
    std::string error;
    m_ready = m_host->Start(&error);
  }
  ~DeliverySession() {
    if (m_host) m_host->Stop();
    m_host.reset();
    m_smtp.reset();
    if (!m_dir.empty()) {
      std::filesystem::current_path(m_previous);
      std::filesystem::remove_all(m_dir);
    }
  }

  bool Ready() const { return m_ready; }
  refhost::ReferenceHost& Host() { return *m_host; }
  const std::string& Dir() const { return m_dir; }
  int Port() const { return m_smtp->port(); }

  // Sends one alarm and returns the moment it was handed over.
  Clock::time_point SendAlarm() {
    refhost::AlarmDocument alarm;
    refhost::AlarmRequest request;
    request.profile = kProfile;
    request.message = "Motion detected";
    alarm.requests.push_back(request);
    const std::string text = refhost::BuildAlarmDocument(alarm);
    const Clock::time_point sent = Clock::now();
    m_host->WriteDocument(text, kAlarmSender);
    return sent;
  }

  // Waits until `count` deliveries were reported; false on a failed one or
  // after the time-out.
  bool WaitForDelivered(size_t count) {
    std::unique_lock<std::mutex> lock(m_mutex);
    return m_signal.wait_for(lock, kDeliveryTimeout, [&] {
      return m_delivered.size() >= count || !m_failed.empty();
    }) && m_failed.empty();
  }
  std::vector<Clock::time_point> Delivered() {
    std::lock_guard<std::mutex> lock(m_mutex);
    return m_delivered;
  }

 private:
  bool m_ready = false;
  std::string m_dir;
  std::filesystem::path m_previous;
  std::unique_ptr<testsupport::SmtpTestServer> m_smtp;
  std::unique_ptr<refhost::ReferenceHost> m_host;
  std::mutex m_mutex;
  std::condition_variable m_signal;
  std::vector<Clock::time_point> m_delivered;
  std::vector<Clock::time_point> m_failed;
};

double Ms(Clock::duration d) {
  return std::chrono::duration<double, std::milli>(d).count();
}

// The module's command line for one message, with a copy of the message
// file it composed: one alarm through a transfer tool that keeps the file.
bool CaptureDelivery(std::vector<std::string>* arguments, std::string* messageFile) {
  char pattern[] = "/tmp/alertmod-bench-tool-XXXXXX";
  if (mkdtemp(pattern) == nullptr) return false;
  const std::string toolDir = pattern;
  const std::string tool = toolDir + "/keep-then-curl";
  std::ofstream(tool) << "#!/bin/sh\nprev=\nfor a in \"$@\"; do\n"
                         "  if [ \"$prev\" = -T ]; then cp \"$a\" '" +
                             toolDir + "/message.eml'; fi\n  prev=$a\ndone\nexec curl \"$@\"\n";
  std::filesystem::permissions(tool, std::filesystem::perms::owner_all);
  DeliverySession session(tool, /*recordRequests=*/true);
  if (!session.Ready()) return false;
  session.SendAlarm();
  if (!session.WaitForDelivered(1)) return false;
  for (const auto& request : session.Host().Requests().OfClass(hx::core::kClassProcess)) {
    if (request.bytes.size() < 16 || request.bytes[8] != hx::core::kProcessStart) continue;
    std::string payload = request.bytes.substr(16);
    std::vector<std::string> args;
    size_t start = 0;
    for (size_t end; (end = payload.find('\0', start)) != std::string::npos; start = end + 1) {
      args.push_back(payload.substr(start, end - start));
    }
    args.push_back(payload.substr(start));
    if (std::find(args.begin(), args.end(), "-T") != args.end()) *arguments = args;
  }
  *messageFile = toolDir + "/message.eml";
  return !arguments->empty() && std::filesystem::exists(*messageFile);
}

// Runs curl with `arguments`, an empty standard input and its output
// discarded, as the host's pipes would take it; true on exit 0.
bool RunCurl(std::vector<std::string> arguments) {
  arguments[0] = "curl";
  std::vector<char*> argv;
  for (std::string& argument : arguments) argv.push_back(argument.data());
  argv.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 1, "/dev/null", O_WRONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 2, "/dev/null", O_WRONLY, 0);
  pid_t pid = -1;
  const int error = posix_spawnp(&pid, "curl", &actions, nullptr, argv.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  if (error != 0) return false;
  int status = 0;
  waitpid(pid, &status, 0);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

void BM_CurlDirectBaseline(benchmark::State& state) {
  std::vector<std::string> arguments;
  std::string messageFile;
  if (!CaptureDelivery(&arguments, &messageFile)) {
    state.SkipWithError("no message could be captured (curl, aiosmtpd?)");
    return;
  }
  for (auto _ : state) {
    testsupport::SmtpTestServer smtp;
    std::vector<std::string> run = arguments;
    *(std::find(run.begin(), run.end(), "-T") + 1) = messageFile;
    run.back() = "smtp://127.0.0.1:" + std::to_string(smtp.port());
    std::vector<double> latencies;
    const Clock::time_point begin = Clock::now();
    for (int i = 0; i < kMessages; ++i) {
      const Clock::time_point start = Clock::now();
      if (!RunCurl(run)) {
        state.SkipWithError("curl failed");
        return;
      }
      latencies.push_back(Ms(Clock::now() - start));
    }
    const double seconds = Ms(Clock::now() - begin) / 1000;
    state.SetIterationTime(seconds);
    Report(state, latencies, seconds);
    g_baselineMedianMs = Summarize(latencies).medianMs;
  }
  std::filesystem::remove_all(std::filesystem::path(messageFile).parent_path());
}
BENCHMARK(BM_CurlDirectBaseline)->Iterations(1)->UseManualTime()->Unit(benchmark::kMillisecond);

// One alarm at a time: each waits for the previous delivery.
void BM_AlarmToDelivery(benchmark::State& state) {
  for (auto _ : state) {
    DeliverySession session;
    if (!session.Ready()) {
      state.SkipWithError("the host did not start (aiosmtpd, the testing module?)");
      return;
    }
    std::vector<double> latencies;
    const Clock::time_point begin = Clock::now();
    for (int i = 0; i < kMessages; ++i) {
      const Clock::time_point sent = session.SendAlarm();
      if (!session.WaitForDelivered(i + 1)) {
        state.SkipWithError("a message was not delivered");
        return;
      }
      latencies.push_back(Ms(session.Delivered()[i] - sent));
    }
    const double seconds = Ms(Clock::now() - begin) / 1000;
    state.SetIterationTime(seconds);
    Report(state, latencies, seconds);
    state.counters["overhead_ms"] = Summarize(latencies).medianMs - g_baselineMedianMs;
  }
}
BENCHMARK(BM_AlarmToDelivery)->Iterations(1)->UseManualTime()->Unit(benchmark::kMillisecond);

// All alarms at once: the worker delivers them one after the other; latency
// includes the wait in the queue.
void BM_AlarmBurstThroughput(benchmark::State& state) {
  for (auto _ : state) {
    DeliverySession session;
    if (!session.Ready()) {
      state.SkipWithError("the host did not start (aiosmtpd, the testing module?)");
      return;
    }
    std::vector<Clock::time_point> sent;
    for (int i = 0; i < kMessages; ++i) sent.push_back(session.SendAlarm());
    if (!session.WaitForDelivered(kMessages)) {
      state.SkipWithError("not every message was delivered");
      return;
    }
    const std::vector<Clock::time_point> delivered = session.Delivered();
    std::vector<double> latencies;
    for (int i = 0; i < kMessages; ++i) latencies.push_back(Ms(delivered[i] - sent[i]));
    const double seconds = Ms(delivered.back() - sent.front()) / 1000;
    state.SetIterationTime(seconds);
    Report(state, latencies, seconds);
  }
}
BENCHMARK(BM_AlarmBurstThroughput)->Iterations(1)->UseManualTime()->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
