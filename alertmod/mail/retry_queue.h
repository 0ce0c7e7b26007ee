// RetryQueue keeps the message files whose delivery failed for a reason that
// may pass, and offers them again with a doubling back-off, until they are
// sent, fail for good, or have been failing for longer than the retry window.
// Before a message joins, the queue stays within its size limit and the data
// volume above its free-space floor, discarding the oldest messages first.
//
// The queue lives in memory only; its message files live in the data
// directory. Only the manager's worker thread touches a RetryQueue (through
// its NotifyHelper); it takes no lock. The queue reaches delivery, status
// reports and the log only through RetryDelivery, which the notification job
// implements.
#ifndef ALERTMOD_MAIL_RETRY_QUEUE_H_
#define ALERTMOD_MAIL_RETRY_QUEUE_H_

#include <cstdint>
#include <deque>
#include <vector>

#include "alertmod/config/notify_types.h"
#include "alertmod/host_records.h"
#include "alertmod/mail/mail_file.h"
#include "alertmod/mail/notify_file_stream.h"
#include "alertmod/mail/smtp_delivery.h"
#include "alertmod/platform/env.h"

namespace hx {

// What the queue needs of the notification job to retry its messages.
class RetryDelivery {
 public:
  virtual ~RetryDelivery() = default;

  // The host callback the queue logs through.
  virtual core::HostCallbackFn Callback() const = 0;

  // Tries `servers` in order until one takes `mail`, as DeliverMailFile does.
  virtual DeliveryResult Deliver(const MailFile& mail, const std::vector<SmtpServer>& servers) = 0;

  // Tells the host the delivery status of a profile: 0 all sent, 1 otherwise.
  virtual void ReportStatus(int32_t profileId, int32_t status) = 0;
};

// Below this many free bytes on the data volume, queued messages are purged.
constexpr uint64_t kFreeSpaceFloorBytes = 104857600;
// Messages of at most this many bytes are not worth purging.
constexpr uint64_t kSmallestPurgedMessageBytes = 4096;
// The first interval between retry cycles.
constexpr uint32_t kFirstBackoffMs = 60000;
// The longest interval between retry cycles. Doubling stops here, so that
// tick differences stay well inside the signed 32-bit range.
constexpr uint32_t kLongestBackoffMs = 1u << 30;

class RetryQueue {
 public:
  // The queue reads its tick from `env`, which must outlive it.
  explicit RetryQueue(platform::Env& env) : m_env(env) {}
  RetryQueue(const RetryQueue&) = delete;
  RetryQueue& operator=(const RetryQueue&) = delete;

  bool Empty() const { return m_queue.empty(); }
  size_t Size() const { return m_queue.size(); }

  // Numbers the message files of a notification; grows with every enqueue.
  uint32_t Sequence() const { return m_sequence; }
  void ResetSequence() { m_sequence = 0; }

  // Queues `mail` (to be sent through `servers`) for later delivery. First
  // the oldest message goes when the queue holds `maxRetryQueue` or more, then
  // old messages are purged while the data volume is below its floor; each
  // discard is logged and its file removed. When the floor cannot be reached,
  // `mail` itself is discarded and its file removed.
  void Enqueue(RetryDelivery& delivery, const MailFile& mail,
               const std::vector<SmtpServer>& servers, int32_t maxRetryQueue,
               INotifyFileStream& stream);

  // Retries at most one message when its cycle is due. A message that is
  // sent, fails for good, or has failed for `maxRetrySeconds` or longer
  // leaves the queue with its file; a sent one is reported with status 0.
  void RetryPass(RetryDelivery& delivery, INotifyFileStream& stream, int32_t maxRetrySeconds);

  // Discards every queued message and its file (the configuration changed).
  void Clear(RetryDelivery& delivery, INotifyFileStream& stream);

  // The tick at which the next cycle may begin, and the current interval.
  uint32_t NextRetry() const { return m_nextRetry; }
  uint32_t Backoff() const { return m_backoff; }

 private:
  struct Entry {
    MailFile mail;
    uint64_t firstFailureMs;  // on the widened clock
  };

  uint64_t Now();
  void DropOldestForLimit(RetryDelivery& delivery, int32_t maxRetryQueue,
                          INotifyFileStream& stream);
  bool MakeRoom(RetryDelivery& delivery, INotifyFileStream& stream);
  void Remove(std::deque<Entry>::iterator entry, INotifyFileStream& stream);

  platform::Env& m_env;
  uint32_t m_sequence = 0;
  uint32_t m_backoff = 0;
  uint32_t m_nextRetry = 0;
  std::deque<Entry> m_queue;
  // The 32-bit tick widened to 64 bits, so that retry windows longer than
  // the tick's signed range (about 24.8 days) are still measured correctly.
  uint32_t m_lastTick = 0;
  uint64_t m_widenedMs = 0;
  bool m_clockStarted = false;
};

}  // namespace hx

#endif  // ALERTMOD_MAIL_RETRY_QUEUE_H_
