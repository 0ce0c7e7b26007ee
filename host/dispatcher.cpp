#include "host/dispatcher.h"

namespace refhost {

Dispatcher::Dispatcher() : m_thread([this] { Run(); }) {}

Dispatcher::~Dispatcher() {
  Stop();
}

bool Dispatcher::Post(std::function<void()> task) {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    if (m_stopping) return false;
    m_tasks.push_back(std::move(task));
  }
  m_signal.notify_one();
  return true;
}

void Dispatcher::Stop() {
  {
    std::lock_guard<std::mutex> lock(m_mutex);
    m_stopping = true;
  }
  m_signal.notify_one();
  if (m_thread.joinable() && std::this_thread::get_id() != m_thread.get_id()) m_thread.join();
}

void Dispatcher::Run() {
  std::unique_lock<std::mutex> lock(m_mutex);
  for (;;) {
    m_signal.wait(lock, [this] { return m_stopping || !m_tasks.empty(); });
    if (m_tasks.empty()) return;
    std::function<void()> task = std::move(m_tasks.front());
    m_tasks.pop_front();
    lock.unlock();
    task();
    lock.lock();
  }
}

}  // namespace refhost
