// Composition of a message with one 10 MiB attachment, against OpenSSL's
// EVP_EncodeBlock on the same bytes (the ceiling: base64 alone, in memory).
// Both report bytes of attachment per second of the benchmark thread's CPU
// time (file system work in the kernel included), which stays comparable on a
// busy machine; the wall times are printed beside them.
#include <benchmark/benchmark.h>
#include <openssl/evp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "alertmod/mail/mail_file.h"
#include "alertmod/mail/notify_file_stream.h"
#include "alertmod/platform/testing/manual_env.h"

namespace {

constexpr size_t kAttachmentBytes = 10 * 1048576;
constexpr size_t kLineBytes = 57;

std::string AttachmentBytes() {
  std::string bytes(kAttachmentBytes, '\0');
  uint32_t state = 7;
  for (char& b : bytes) {
    state = state * 1664525u + 1013904223u;
    b = static_cast<char>(state >> 24);
  }
  return bytes;
}

const std::string& Attachment() {
  static const std::string bytes = AttachmentBytes();
  return bytes;
}

// The attachment's expected encoding, line by line with OpenSSL.
std::string ReferenceEncoding(const std::string& bytes) {
  std::string text;
  std::vector<unsigned char> line(EVP_ENCODE_LENGTH(kLineBytes));
  for (size_t offset = 0; offset < bytes.size(); offset += kLineBytes) {
    size_t piece = std::min(kLineBytes, bytes.size() - offset);
    int length =
        EVP_EncodeBlock(line.data(), reinterpret_cast<const unsigned char*>(bytes.data()) + offset,
                        static_cast<int>(piece));
    text.append(reinterpret_cast<const char*>(line.data()), length);
    if (piece % 3 == 0) text += "\r\n";
  }
  return text;
}

std::string ReadWholeFile(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return std::string(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

// A working directory with "data/Lobby.jpg" for the life of the benchmark.
class Workspace {
 public:
  Workspace() {
    const char* base = getenv("TMPDIR");
    std::string pattern = std::string(base && *base ? base : "/tmp") + "/mail-bench-XXXXXX";
    std::vector<char> name(pattern.begin(), pattern.end());
    name.push_back('\0');
    m_dir = mkdtemp(name.data()) ? name.data() : "";
    m_ok = !m_dir.empty() && chdir(m_dir.c_str()) == 0 && mkdir("data", 0777) == 0;
    std::ofstream out("data/Lobby.jpg", std::ios::binary);
    out.write(Attachment().data(), static_cast<std::streamsize>(Attachment().size()));
    m_ok = m_ok && out.good();
  }
  ~Workspace() {
    std::string command = "rm -rf '" + m_dir + "'";
    if (!m_dir.empty() && system(command.c_str()) != 0)
      fprintf(stderr, "cannot remove %s\n", m_dir.c_str());
  }
  bool ok() const { return m_ok; }

 private:
  std::string m_dir;
  bool m_ok = false;
};

constexpr int64_t kComposedAt = 1767225600;

void BM_ComposeMailFile(benchmark::State& state) {
  Workspace workspace;
  hx::NotifyWorkItem item(hx::kWorkItemNotification);
  item.profile.from = "desk@example.com";
  item.profile.to = {"ops@example.com"};
  item.profile.subject = "Motion";
  item.profile.body = "Motion was detected.";
  std::vector<hx::MailAttachment> attachments = {{true, "data/Lobby.jpg", ""}};
  hx::NotifyFileStreamImpl stream(nullptr, *hx::platform::SystemEnvForTests());
  hx::MailFile mail;
  if (!workspace.ok() ||
      !hx::ComposeMailFile(item, attachments, 0, 1, 0, kComposedAt, stream, mail)) {
    state.SkipWithError("cannot compose");
    return;
  }
  std::string content = ReadWholeFile(mail.path);
  std::string header = "filename=\"Lobby.jpg\"\r\n\r\n";
  std::string trailer = "\r\n--" + std::string(hx::kMailBoundary) + "--\r\n";
  size_t begin = content.find(header) + header.size();
  if (content.compare(begin, std::string::npos, ReferenceEncoding(Attachment()) + trailer) != 0) {
    state.SkipWithError("the composed attachment differs from the reference encoding");
    return;
  }
  for (auto _ : state) {
    // Every message file is new, as in the notification job, which removes
    // it after delivery: rewriting one file in place would measure the file
    // system's flush on truncation instead of composition.
    state.PauseTiming();
    unlink(mail.path.c_str());
    state.ResumeTiming();
    bool ok = hx::ComposeMailFile(item, attachments, 0, 1, 0, kComposedAt, stream, mail);
    benchmark::DoNotOptimize(ok);
  }
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * kAttachmentBytes));
}
BENCHMARK(BM_ComposeMailFile)->Unit(benchmark::kMillisecond);

void BM_EvpEncodeBlock(benchmark::State& state) {
  const std::string& bytes = Attachment();
  std::vector<unsigned char> out(EVP_ENCODE_LENGTH(bytes.size()));
  for (auto _ : state) {
    int length = EVP_EncodeBlock(out.data(), reinterpret_cast<const unsigned char*>(bytes.data()),
                                 static_cast<int>(bytes.size()));
    benchmark::DoNotOptimize(length);
    benchmark::ClobberMemory();
  }
  state.SetBytesProcessed(static_cast<int64_t>(state.iterations() * kAttachmentBytes));
}
BENCHMARK(BM_EvpEncodeBlock)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
