#include "host/scenario/console.h"

#include <unistd.h>

#include <vector>

namespace refhost::scenario {
namespace {

using namespace std::chrono_literals;

constexpr auto kPollPeriod = 200ms;
// Away from a terminal a progress line every few seconds is enough.
constexpr auto kPlainProgressPeriod = 5s;
constexpr char kClearLine[] = "\r\033[K";

}  // namespace

Console::Console(FILE* out, bool quiet)
    : m_out(out),
      m_quiet(quiet),
      m_terminal(isatty(fileno(out)) != 0),
      m_start(std::chrono::steady_clock::now()),
      m_lastProgress(m_start) {}

Console::~Console() {
  Stop();
}

double Console::Elapsed() const {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - m_start).count();
}

void Console::Follow(const LogSink& log) {
  std::lock_guard<std::mutex> lock(m_mutex);
  if (m_thread.joinable()) return;
  m_log = &log;
  m_stop = false;
  m_thread = std::thread([this] { Run(); });
}

void Console::Stop() {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_stop = true;
  }
  m_wake.notify_all();
  if (m_thread.joinable()) m_thread.join();
  std::lock_guard<std::mutex> lock(m_mutex);
  PrintNewLines();
  ClearProgress();
  m_log = nullptr;
}

void Console::Note(const std::string& text) {
  std::lock_guard<std::mutex> lock(m_mutex);
  // The module's lines that came before the note are shown before it.
  PrintNewLines();
  PrintLine("HOST", text);
}

void Console::SetProgress(std::function<std::string()> progress) {
  std::lock_guard<std::mutex> lock(m_mutex);
  m_progress = std::move(progress);
  if (!m_progress) ClearProgress();
}

void Console::Run() {
  std::unique_lock<std::mutex> lock(m_mutex);
  while (!m_stop) {
    PrintNewLines();
    ShowProgress(false);
    m_wake.wait_for(lock, kPollPeriod, [this] { return m_stop; });
  }
}

void Console::PrintNewLines() {
  if (m_log == nullptr) return;
  const std::vector<LogLine> lines = m_log->LinesFrom(m_shownLines);
  m_shownLines += lines.size();
  for (const LogLine& line : lines) PrintLine(LogSink::LevelName(line.level).c_str(), line.text);
}

void Console::PrintLine(const char* level, const std::string& text) {
  if (m_quiet) return;
  ClearProgress();
  fprintf(m_out, "%8.3f %-5s %s\n", Elapsed(), level, text.c_str());
  fflush(m_out);
}

void Console::ShowProgress(bool force) {
  if (m_quiet || !m_progress) return;
  const auto now = std::chrono::steady_clock::now();
  if (!m_terminal && !force && now - m_lastProgress < kPlainProgressPeriod) return;
  const std::string text = m_progress();
  if (text.empty()) return;
  m_lastProgress = now;
  if (m_terminal) {
    fprintf(m_out, "%s%8.3f ....  %s", kClearLine, Elapsed(), text.c_str());
    m_progressShown = true;
  } else {
    fprintf(m_out, "%8.3f ....  %s\n", Elapsed(), text.c_str());
  }
  fflush(m_out);
}

void Console::ClearProgress() {
  if (!m_progressShown) return;
  fputs(kClearLine, m_out);
  m_progressShown = false;
}

}  // namespace refhost::scenario
