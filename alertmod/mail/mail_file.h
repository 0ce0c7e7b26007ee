// Message files: every notification becomes one or more complete Internet
// messages (MIME multipart with base64 attachments when it carries files),
// written into the data directory for the transfer tool to upload unchanged.
//
// Composition, the data directory and the splitting of attachments into
// messages are used by the manager's worker thread only. ExtractAddress and
// SplitAttachments are pure and may be called from any thread.
#ifndef ALERTMOD_MAIL_MAIL_FILE_H_
#define ALERTMOD_MAIL_MAIL_FILE_H_

#include <cstdint>
#include <string>
#include <vector>

#include "alertmod/config/notify_types.h"
#include "alertmod/host_records.h"
#include "alertmod/mail/notify_file_stream.h"
#include "alertmod/mail/notify_work_item.h"

namespace hx {

// Start of the name of every message file in the data directory.
constexpr char kMailFilePrefix[] = "notify-mail-";
// Separates the parts of every message.
constexpr char kMailBoundary[] = "b1914efc629febb89915e8a6f83ba6eb";

// One composed message file with its envelope, as delivered and retried.
struct MailFile {
  std::string sender;                   // the address taken from the From text
  std::vector<std::string> recipients;  // To, then Cc, then Bcc addresses
  std::string path;                     // the message file
  std::string profileDescription;       // for log lines
  uint32_t profileId = 0;
  std::vector<SmtpServer> servers;  // tried in order by delivery
  uint32_t firstFailure = 0;        // tick when queued for retry
  uint32_t lastAttempt = 0;         // tick of the last retry
  uint64_t size = 0;                // bytes in the file
};

// One entry of a message's attachment list.
struct MailAttachment {
  bool include = false;     // the file exists and goes into the message
  std::string file;         // the attachment file in the data directory
  std::string description;  // a line for the body (why a file is missing), or empty
};

// An attachment as the notification job prepared it, with the bytes that count
// against the profile's size limit.
struct PreparedAttachment {
  MailAttachment entry;
  uint64_t bytes = 0;  // counted only when entry.include is set
};

// Writes the message file "./data/notify-mail-<profile id>-<event second>-
// <millisecond>-<sequence>" (with "-Part-<part>-of-<total>" when `part` is
// not 0) through `stream`, and fills `mail`'s path, sender, recipients and
// size. The subject and body are taken from `item.profile` as they stand
// (templates already expanded). `attachments` empty gives a plain message;
// otherwise a multipart one whose text lists every non-empty description and
// which carries every included file in base64. Every line ends with CR LF:
// a bare LF of the body becomes CR LF, a CR LF there stays as it is. `part`
// is 1-based, or 0 when the notification is not split; `total` is the number
// of parts. The Date line shows `dateSeconds` (since 1970) in local time.
// Returns false when the file cannot be created, when the From text or any
// To, Cc or Bcc text holds no address (the partly written file stays), or
// when any write, including the final flush, failed. The stream is closed
// before returning whenever it was opened.
bool ComposeMailFile(const NotifyWorkItem& item, const std::vector<MailAttachment>& attachments,
                     uint32_t part, uint32_t total, uint32_t sequence, int64_t dateSeconds,
                     INotifyFileStream& stream, MailFile& mail);

// Replaces `text` by the first e-mail address found in it ("Front Desk
// <desk@example.com>" gives "desk@example.com") and returns true; returns
// false and leaves `text` unchanged when there is none. Texts longer than a
// header line may be (998 characters) hold no address.
bool ExtractAddress(std::string& text);

// Splits the attachments of one notification into messages by the profile's
// size limit (`limitBytes`; 0 or less means no limit). In order, each included
// attachment adds its bytes to a running total; when the total exceeds the
// limit a new message starts with that attachment and the total restarts at
// its bytes. Entries of failed attachments join the current message. Always
// returns at least one message (possibly with no entries).
std::vector<std::vector<MailAttachment>> SplitAttachments(
    const std::vector<PreparedAttachment>& attachments, int64_t limitBytes);

// The absolute path of "data" in the current directory ("data" itself when
// the current directory cannot be read). Computed on the first call and kept;
// ClearDataDirectory computes it afresh.
std::string DataDirectory();

// Called when the worker starts: computes the data directory afresh (the
// library may be loaded again by a process that changed its directory), then
// removes every regular file in it whose name begins with "notify-mail-", so
// that no message of an earlier run is retried. Other files stay. The first
// file-system error ends the sweep and is logged at information level through
// `callback`; a missing directory is not an error.
void ClearDataDirectory(core::HostCallbackFn callback);

}  // namespace hx

#endif  // ALERTMOD_MAIL_MAIL_FILE_H_
