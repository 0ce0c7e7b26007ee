#include "alertmod/mail/mail_file.h"

#include <algorithm>
#include <cstdio>
#include <ctime>
#include <exception>
#include <mutex>
#include <regex>

#include "alertmod/diag/log.h"
#include "alertmod/mail/notify_file.h"
#include "alertmod/platform/file_system.h"
#include "alertmod/platform/local_time.h"
#include "alertmod/platform/utc_time.h"
#include "alertmod/util/base64.h"

namespace hx {
namespace {

// SMTP knows no other line end (servers hardened against smuggling refuse a
// bare LF), so every line the composer writes ends with it.
constexpr char kCrLf[] = "\r\n";
constexpr size_t kCrLfChars = sizeof(kCrLf) - 1;
// The date line's parts around the zone's offset. C99's "%T" and "%z" are
// not used: the Windows C runtime knows no "%T" and writes the zone's name
// for "%z", so the time is spelled out and the offset computed.
constexpr char kDateFormat[] = "%a, %d %b %Y %H:%M:%S";
constexpr char kZoneNameFormat[] = " (%Z)";
constexpr int kSecondsPerHour = 3600;
constexpr int kSecondsPerMinute = 60;
constexpr char kImageType[] = "image/jpeg";
constexpr char kVideoType[] = "video/quicktime";
constexpr char kAddressPattern[] = "[a-zA-Z0-9.!#$%&'*+/=?^_`{}|~-]+@[a-zA-Z0-9.-]+";
constexpr char kDataDirectoryName[] = "data";

// Longest header line a message may carry. The pattern engine recurses once
// per matched character, so a longer text could exhaust the worker's stack.
constexpr size_t kMaxAddressTextLength = 998;

// Attachment lines of 57 bytes (76 characters). Attachments are read and
// written in blocks of many lines so that a large file costs few calls.
constexpr size_t kLineBytes = 57;
constexpr size_t kLineChars = Base64EncodedLength(kLineBytes);
constexpr size_t kLinesPerBlock = 4096;

// A CR or LF inside a header value would start a header of the sender's
// choosing; it becomes a space. (Extracted addresses cannot hold either.)
std::string HeaderValue(std::string value) {
  for (char& c : value) {
    if (c == '\r' || c == '\n') c = ' ';
  }
  return value;
}

// The body with every bare LF made CR LF; a CR LF stays as it is, so a body
// typed either way keeps its lines. A line holding a single "." is left as it
// is: the transfer tool doubles a leading dot, but only after a CR LF.
std::string CrLfLines(const std::string& body) {
  std::string lines;
  for (size_t i = 0; i < body.size(); ++i) {
    if (body[i] == '\n' && (i == 0 || body[i - 1] != '\r')) lines += '\r';
    lines += body[i];
  }
  return lines;
}

std::string MailFileName(const NotifyWorkItem& item, uint32_t part, uint32_t total,
                         uint32_t sequence) {
  std::string name = std::string("./") + kDataDirectoryName + "/" + kMailFilePrefix +
                     std::to_string(item.profile.id) + "-" + std::to_string(item.eventTime) + "-" +
                     std::to_string(item.milliseconds) + "-" + std::to_string(sequence);
  if (part > 0) name += "-Part-" + std::to_string(part) + "-of-" + std::to_string(total);
  return name;
}

// "+hhmm" or "-hhmm": how far the local fields `local` of `seconds` are
// ahead of UTC.
std::string UtcOffsetText(int64_t seconds, const std::tm& local) {
  const int64_t ahead = platform::UtcSeconds(local) - seconds;
  const int64_t magnitude = ahead < 0 ? -ahead : ahead;
  char text[16];
  snprintf(text, sizeof(text), "%c%02d%02d", ahead < 0 ? '-' : '+',
           static_cast<int>(magnitude / kSecondsPerHour),
           static_cast<int>(magnitude % kSecondsPerHour / kSecondsPerMinute));
  return text;
}

std::string DateLine(int64_t dateSeconds) {
  std::tm local{};
  char date[128] = {0};
  char zone[128] = {0};
  std::string line = "Date: ";
  if (platform::LocalFields(dateSeconds, &local)) {
    strftime(date, sizeof(date), kDateFormat, &local);
    strftime(zone, sizeof(zone), kZoneNameFormat, &local);
    line += date + (" " + UtcOffsetText(dateSeconds, local)) + zone;
  }
  return line + kCrLf;
}

// Extracts every address of `texts` into the recipients and, when `label` is
// not null, writes them as one header line. False when a text has no address.
bool AddRecipients(const char* label, const std::vector<std::string>& texts,
                   INotifyFileStream& stream, MailFile& mail) {
  if (texts.empty()) return true;
  if (label != nullptr) stream.WriteText(label);
  for (size_t i = 0; i < texts.size(); ++i) {
    std::string address = texts[i];
    if (!ExtractAddress(address)) return false;
    mail.recipients.push_back(address);
    if (label == nullptr) continue;
    stream.WriteString(address);
    stream.WriteText(i + 1 < texts.size() ? "," : kCrLf);
  }
  return true;
}

bool WriteHeader(const NotifyWorkItem& item, uint32_t part, uint32_t total, int64_t dateSeconds,
                 INotifyFileStream& stream, MailFile& mail) {
  std::string sender = item.profile.from;
  if (!ExtractAddress(sender)) return false;
  mail.sender = sender;
  stream.WriteText("From: ").WriteString(sender).WriteText(kCrLf);
  if (!AddRecipients("To: ", item.profile.to, stream, mail)) return false;
  stream.WriteString(DateLine(dateSeconds));
  if (!AddRecipients("Cc: ", item.profile.cc, stream, mail)) return false;
  // Blind copies travel in the envelope only: a header line would show their
  // addresses to every other recipient.
  if (!AddRecipients(nullptr, item.profile.bcc, stream, mail)) return false;
  stream.WriteText("Subject: ").WriteString(HeaderValue(item.profile.subject));
  if (part > 0) stream.WriteText(" - Part ").WriteUInt(part).WriteText(" of ").WriteUInt(total);
  stream.WriteText(kCrLf);
  return true;
}

// Encodes `length` bytes as lines of 57 bytes. A piece whose encoding needs
// no padding ends with CR LF; a padded piece (only ever the last) ends without.
size_t EncodeLines(const uint8_t* data, size_t length, char* out) {
  char* start = out;
  for (size_t offset = 0; offset < length; offset += kLineBytes) {
    size_t piece = length - offset < kLineBytes ? length - offset : kLineBytes;
    out += Base64EncodeTo(data + offset, piece, out);
    if (piece % 3 == 0) out = std::copy(kCrLf, kCrLf + kCrLfChars, out);
  }
  return static_cast<size_t>(out - start);
}

void WriteBase64File(const std::string& path, INotifyFileStream& stream) {
  CNotifyFileImpl file(path);
  if (!file.IsGood()) return;
  std::vector<uint8_t> input(kLineBytes * kLinesPerBlock);
  std::string output;
  const size_t outputCapacity = (kLineChars + kCrLfChars) * kLinesPerBlock;
  while (file.IsGood() && stream.IsGood()) {
    size_t got = file.Read(input.data(), input.size());
    if (got == 0) break;
    output.resize(outputCapacity);
    output.resize(EncodeLines(input.data(), got, &output[0]));
    stream.WriteString(output);
  }
}

bool HasVideoExtension(const std::string& file) {
  size_t slash = file.find_last_of('/');
  size_t dot = file.find_last_of('.');
  if (dot == std::string::npos || (slash != std::string::npos && dot < slash)) return false;
  std::string extension = file.substr(dot);
  return extension == ".mov" || extension == ".mp4";
}

std::string LeafName(const std::string& file) {
  size_t slash = file.find_last_of('/');
  return slash == std::string::npos ? file : file.substr(slash + 1);
}

void WriteAttachmentPart(const MailAttachment& attachment, INotifyFileStream& stream) {
  stream.WriteText(kCrLf).WriteText("--").WriteText(kMailBoundary).WriteText(kCrLf);
  stream.WriteText("Content-Type: ")
      .WriteText(HasVideoExtension(attachment.file) ? kVideoType : kImageType)
      .WriteText(kCrLf);
  stream.WriteText("Content-Transfer-Encoding: base64").WriteText(kCrLf);
  stream.WriteText("Content-Disposition: attachment; filename=\"")
      .WriteString(HeaderValue(LeafName(attachment.file)))
      .WriteText("\"")
      .WriteText(kCrLf);
  stream.WriteText(kCrLf);
  WriteBase64File(attachment.file, stream);
}

void WriteMultipartBody(const NotifyWorkItem& item, const std::vector<MailAttachment>& attachments,
                        INotifyFileStream& stream) {
  stream.WriteText("Content-Type: multipart/mixed; boundary=\"")
      .WriteText(kMailBoundary)
      .WriteText("\"")
      .WriteText(kCrLf);
  stream.WriteText(kCrLf).WriteText("--").WriteText(kMailBoundary).WriteText(kCrLf);
  stream.WriteText("Content-Type: text/plain").WriteText(kCrLf).WriteText(kCrLf);
  stream.WriteString(CrLfLines(item.profile.body));
  for (const MailAttachment& attachment : attachments) {
    if (!attachment.description.empty())
      stream.WriteText(kCrLf).WriteText("- ").WriteString(attachment.description);
  }
  for (const MailAttachment& attachment : attachments) {
    if (attachment.include) WriteAttachmentPart(attachment, stream);
  }
  stream.WriteText(kCrLf).WriteText("--").WriteText(kMailBoundary).WriteText("--").WriteText(kCrLf);
}

struct DataDirectoryCache {
  std::mutex mutex;
  bool known = false;
  std::string path;
};

DataDirectoryCache& TheDataDirectoryCache() {
  static DataDirectoryCache cache;
  return cache;
}

std::string ComputeDataDirectory() {
  std::string path;
  if (!platform::AbsolutePath(kDataDirectoryName, &path).ok()) path = kDataDirectoryName;
  return path;
}

std::string RefreshDataDirectory() {
  DataDirectoryCache& cache = TheDataDirectoryCache();
  std::lock_guard<std::mutex> lock(cache.mutex);
  cache.path = ComputeDataDirectory();
  cache.known = true;
  return cache.path;
}

}  // namespace

bool ComposeMailFile(const NotifyWorkItem& item, const std::vector<MailAttachment>& attachments,
                     uint32_t part, uint32_t total, uint32_t sequence, int64_t dateSeconds,
                     INotifyFileStream& stream, MailFile& mail) {
  mail.path = MailFileName(item, part, total, sequence);
  mail.sender.clear();
  mail.recipients.clear();
  if (!stream.Open(mail.path, std::ios_base::binary | std::ios_base::trunc)) return false;
  bool addressed = WriteHeader(item, part, total, dateSeconds, stream, mail);
  if (addressed && attachments.empty()) {
    stream.WriteText(kCrLf).WriteString(CrLfLines(item.profile.body));
  } else if (addressed) {
    WriteMultipartBody(item, attachments, stream);
  }
  mail.size = stream.Position();
  // Buffered bytes reach the disk at Close; a failure there (a full volume)
  // must fail the message rather than send a truncated one.
  stream.Close();
  return addressed && !stream.Failed();
}

bool ExtractAddress(std::string& text) {
  if (text.size() > kMaxAddressTextLength) return false;
  try {
    static const std::regex pattern(kAddressPattern, std::regex::ECMAScript);
    std::smatch match;
    if (!std::regex_search(text, match, pattern)) return false;
    text = match.str(0);
    return true;
  } catch (const std::exception&) {
    return false;
  }
}

std::vector<std::vector<MailAttachment>> SplitAttachments(
    const std::vector<PreparedAttachment>& attachments, int64_t limitBytes) {
  std::vector<std::vector<MailAttachment>> messages(1);
  uint64_t total = 0;
  for (const PreparedAttachment& prepared : attachments) {
    if (prepared.entry.include) {
      total += prepared.bytes;
      if (limitBytes > 0 && total > static_cast<uint64_t>(limitBytes)) {
        messages.emplace_back();
        total = prepared.bytes;
      }
    }
    messages.back().push_back(prepared.entry);
  }
  return messages;
}

std::string DataDirectory() {
  DataDirectoryCache& cache = TheDataDirectoryCache();
  std::lock_guard<std::mutex> lock(cache.mutex);
  if (!cache.known) {
    cache.path = ComputeDataDirectory();
    cache.known = true;
  }
  return cache.path;
}

void ClearDataDirectory(core::HostCallbackFn callback) {
  std::string directory = RefreshDataDirectory();
  std::vector<std::string> names;
  platform::Status status = platform::ListRegularFiles(directory, &names);
  for (size_t i = 0; status.ok() && i < names.size(); ++i) {
    if (names[i].compare(0, sizeof(kMailFilePrefix) - 1, kMailFilePrefix) != 0) continue;
    status = platform::DeleteFile(directory + "/" + names[i]);
  }
  // A data directory that does not exist yet has nothing to clear.
  if (!status.ok() && !status.IsNotFound()) {
    LogToHost(core::kModuleId, callback, LogLevelInfo,
              "Exception while clearing data subdirectory: %s", status.message().c_str());
  }
}

}  // namespace hx
