// The reference host's live console: the module's log lines as they come,
// the host's own notes between them, and a progress line for the camera
// feeds. Time stamps are seconds since the console started.
//
// On a terminal the progress line sits at the bottom and is redrawn in
// place; elsewhere it is printed as an ordinary line every few seconds. A
// thread of the console follows the log; Note() and SetProgress() may be
// called from any thread.
#ifndef ALERTMOD_HOST_SCENARIO_CONSOLE_H_
#define ALERTMOD_HOST_SCENARIO_CONSOLE_H_

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <functional>
#include <mutex>
#include <string>
#include <thread>

#include "host/log_sink.h"

namespace refhost::scenario {

class Console {
 public:
  // Writes to `out`. With `quiet` nothing is written at all.
  Console(FILE* out, bool quiet);
  ~Console();  // Stop()

  Console(const Console&) = delete;
  Console& operator=(const Console&) = delete;

  // Starts following `log`. The log must outlive Stop().
  void Follow(const LogSink& log);
  // Prints the lines not yet shown and ends the following thread.
  void Stop();

  // A line of the host itself.
  void Note(const std::string& text);
  // What the progress line shows, asked for on the console's thread; an
  // empty function or text shows none.
  void SetProgress(std::function<std::string()> progress);

  double Elapsed() const;

 private:
  void Run();
  void PrintNewLines();
  void PrintLine(const char* level, const std::string& text);  // m_mutex held
  void ShowProgress(bool force);                               // m_mutex held
  void ClearProgress();                                        // m_mutex held

  FILE* m_out;
  const bool m_quiet;
  const bool m_terminal;
  const std::chrono::steady_clock::time_point m_start;
  const LogSink* m_log = nullptr;
  size_t m_shownLines = 0;

  std::mutex m_mutex;
  std::condition_variable m_wake;
  bool m_stop = false;
  bool m_progressShown = false;
  std::chrono::steady_clock::time_point m_lastProgress;
  std::function<std::string()> m_progress;
  std::thread m_thread;
};

}  // namespace refhost::scenario

#endif  // ALERTMOD_HOST_SCENARIO_CONSOLE_H_
