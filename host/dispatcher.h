// One thread that runs tasks one at a time, in the order they were posted.
// The reference host makes every Write and IOCTL code 2 call through it, as
// the module requires. Post() and Call() may be used from any thread.
#ifndef ALERTMOD_HOST_DISPATCHER_H_
#define ALERTMOD_HOST_DISPATCHER_H_

#include <condition_variable>
#include <deque>
#include <functional>
#include <future>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <thread>

namespace refhost {

class Dispatcher {
 public:
  Dispatcher();
  ~Dispatcher();  // Stop()

  Dispatcher(const Dispatcher&) = delete;
  Dispatcher& operator=(const Dispatcher&) = delete;

  // Queues `task`. Returns false, dropping it, once Stop() has begun.
  bool Post(std::function<void()> task);

  // Runs `fn` on the dispatcher thread and returns its result. On the
  // dispatcher thread itself it runs inline.
  template <typename Fn>
  auto Call(Fn fn) -> decltype(fn()) {
    if (std::this_thread::get_id() == m_thread.get_id()) return fn();
    std::packaged_task<decltype(fn())()> task(std::move(fn));
    auto result = task.get_future();
    auto shared = std::make_shared<decltype(task)>(std::move(task));
    if (!Post([shared] { (*shared)(); })) throw std::runtime_error("dispatcher stopped");
    return result.get();
  }

  // Runs the tasks already queued, then ends the thread. Idempotent.
  void Stop();

 private:
  void Run();

  std::mutex m_mutex;
  std::condition_variable m_signal;
  std::deque<std::function<void()>> m_tasks;
  bool m_stopping = false;
  std::thread m_thread;
};

}  // namespace refhost

#endif  // ALERTMOD_HOST_DISPATCHER_H_
