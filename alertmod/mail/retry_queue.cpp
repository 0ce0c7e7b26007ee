#include "alertmod/mail/retry_queue.h"

#include <cinttypes>

#include "alertmod/diag/log.h"

namespace hx {
namespace {

// Tick readings wrap every 2^32 ms; reading their difference as signed keeps
// "before" right across the wrap.
bool Before(uint32_t a, uint32_t b) {
  return static_cast<int32_t>(a - b) < 0;
}

}  // namespace

uint64_t RetryQueue::Now() {
  uint32_t tick = m_env.TickMs();
  if (m_clockStarted) m_widenedMs += static_cast<uint32_t>(tick - m_lastTick);
  m_clockStarted = true;
  m_lastTick = tick;
  return m_widenedMs;
}

void RetryQueue::Remove(std::deque<Entry>::iterator entry, INotifyFileStream& stream) {
  stream.RemoveFile(entry->mail.path);
  m_queue.erase(entry);
}

void RetryQueue::DropOldestForLimit(RetryDelivery& delivery, int32_t maxRetryQueue,
                                    INotifyFileStream& stream) {
  if (m_queue.empty() || static_cast<int64_t>(m_queue.size()) < maxRetryQueue) return;
  LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
            "Maximum failed message queue limit of %d is exceeded.", maxRetryQueue);
  LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
            "Message for profile %s will be discarded",
            m_queue.front().mail.profileDescription.c_str());
  Remove(m_queue.begin(), stream);
}

bool RetryQueue::MakeRoom(RetryDelivery& delivery, INotifyFileStream& stream) {
  const std::string directory = DataDirectory();
  uint64_t freeBytes = stream.FreeBytes(directory);
  if (freeBytes >= kFreeSpaceFloorBytes) return true;
  LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
            "Available bytes %" PRIu64
            " are less than threshold of %u. Attempting to purge failed notifications",
            freeBytes, static_cast<unsigned>(kFreeSpaceFloorBytes));
  auto entry = m_queue.begin();
  while (entry != m_queue.end() && freeBytes < kFreeSpaceFloorBytes) {
    if (entry->mail.size <= kSmallestPurgedMessageBytes) {
      ++entry;
      continue;
    }
    LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
              "Minimum free space threshold exceeded. Message for profile %s (%s) will be "
              "discarded",
              entry->mail.profileDescription.c_str(), entry->mail.path.c_str());
    if (stream.RemoveFile(entry->mail.path)) freeBytes += entry->mail.size;
    entry = m_queue.erase(entry);
  }
  if (freeBytes < kFreeSpaceFloorBytes) return false;
  return stream.FreeBytes(directory) >= kFreeSpaceFloorBytes;
}

void RetryQueue::Enqueue(RetryDelivery& delivery, const MailFile& mail,
                         const std::vector<SmtpServer>& servers, int32_t maxRetryQueue,
                         INotifyFileStream& stream) {
  DropOldestForLimit(delivery, maxRetryQueue, stream);
  if (!MakeRoom(delivery, stream)) {
    LogToHost(core::kModuleId, delivery.Callback(), LogLevelWarning,
              "Unable to free up space by removing items from notification retry queue. Message "
              "(%s) for profile %s will be discarded",
              mail.path.c_str(), mail.profileDescription.c_str());
    stream.RemoveFile(mail.path);
    return;
  }
  uint64_t now = Now();
  m_backoff = kFirstBackoffMs;
  if (m_queue.empty()) m_nextRetry = m_lastTick + kFirstBackoffMs;
  Entry entry{mail, now};
  entry.mail.firstFailure = m_lastTick;
  entry.mail.lastAttempt = m_lastTick;
  entry.mail.servers = servers;
  m_queue.push_back(std::move(entry));
  ++m_sequence;
}

void RetryQueue::RetryPass(RetryDelivery& delivery, INotifyFileStream& stream,
                           int32_t maxRetrySeconds) {
  if (m_queue.empty()) return;
  uint64_t now = Now();
  uint32_t tick = m_lastTick;
  if (Before(tick, m_nextRetry)) return;
  auto entry = m_queue.begin();
  while (entry != m_queue.end() && !Before(entry->mail.lastAttempt, m_nextRetry)) ++entry;
  if (entry == m_queue.end()) {
    // Every message was tried in this cycle: wait twice as long for the next.
    m_backoff = m_backoff >= kLongestBackoffMs / 2 ? kLongestBackoffMs : m_backoff * 2;
    m_nextRetry = tick + m_backoff;
    return;
  }
  entry->mail.lastAttempt = tick;
  LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
            "Retrying failed notification for file %s", entry->mail.path.c_str());
  DeliveryResult result = delivery.Deliver(entry->mail, entry->mail.servers);
  if (result == kDeliveryRetryable &&
      static_cast<int64_t>(now - entry->firstFailureMs) < int64_t{maxRetrySeconds} * 1000) {
    return;
  }
  if (result == kDeliverySent) {
    LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
              "Retry for notification file (%s) suceeded.", entry->mail.path.c_str());
    delivery.ReportStatus(static_cast<int32_t>(entry->mail.profileId), 0);
  } else {
    LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
              "Retry timeout reached for notification file (%s).  Message for profile %s will be "
              "discarded",
              entry->mail.path.c_str(), entry->mail.profileDescription.c_str());
  }
  m_backoff = kFirstBackoffMs;
  Remove(entry, stream);
}

void RetryQueue::Clear(RetryDelivery& delivery, INotifyFileStream& stream) {
  if (m_queue.empty()) return;
  LogToHost(core::kModuleId, delivery.Callback(), LogLevelInfo,
            "Clearing retry notifications queue. %d failed notifications will be discarded",
            static_cast<int>(m_queue.size()));
  for (const Entry& entry : m_queue) stream.RemoveFile(entry.mail.path);
  m_queue.clear();
}

}  // namespace hx
