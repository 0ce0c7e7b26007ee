#include "alertmod/mail/mail_file.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <memory>

#include "alertmod/platform/testing/manual_env.h"
#include "tests/support/fake_host.h"
#include "tests/support/temp_dir.h"

namespace hx {
namespace {

using testsupport::FileExists;
using testsupport::ReadFile;
using testsupport::WriteFile;

constexpr char kPython[] = "/usr/bin/python3";
// The zone of the expected texts, set with putenv: the Windows C runtime
// has no setenv.
constexpr char kTimeZone[] = "TZ=CET-1CEST,M3.5.0,M10.5.0/3";
constexpr char kBoundaryLine[] = "--b1914efc629febb89915e8a6f83ba6eb";
constexpr char kMessagePath[] = "./data/notify-mail-3-1700000000-250-7";

// The composition time of every message: 2024-01-02 09:00:00 UTC.
constexpr int64_t kCompositionTime = 1704186000;

// Deterministic bytes that exercise every byte value.
std::string Bytes(size_t count, uint32_t seed) {
  std::string bytes(count, '\0');
  uint32_t state = seed;
  for (char& b : bytes) {
    state = state * 1664525u + 1013904223u;
    b = static_cast<char>(state >> 24);
  }
  return bytes;
}

// A message with every attachment body cut to its first and last line and
// the number of lines between, so that a large message can be compared with a
// small golden file.
std::string ElideAttachments(const std::string& text) {
  const std::string marker = "Content-Disposition: attachment";
  const std::string closing = std::string("\r\n") + kBoundaryLine;
  std::string result;
  size_t copied = 0;
  for (size_t at = text.find(marker); at != std::string::npos; at = text.find(marker, at)) {
    size_t begin = text.find("\r\n\r\n", at) + 4;
    size_t end = text.find(closing, begin);
    std::vector<std::string> lines;
    for (size_t line = begin; line < end;) {
      size_t next = std::min(text.find('\n', line), end);
      lines.push_back(text.substr(line, next - line + (next < end ? 1 : 0)));
      line = next + 1;
    }
    result.append(text, copied, begin - copied);
    if (lines.size() > 2) {
      lines[1] = "[" + std::to_string(lines.size() - 2) + " lines]\r\n" + lines.back();
      lines.resize(2);
    }
    for (const std::string& line : lines) result += line;
    copied = at = end;
  }
  return result + text.substr(copied);
}

class MailFileTest : public ::testing::Test {
 protected:
  void SetUp() override {
    putenv(const_cast<char*>(kTimeZone));
    tzset();
    setlocale(LC_ALL, "C");
    m_chdir = std::make_unique<testsupport::ScopedChdir>(m_dir.path());
    ASSERT_TRUE(std::filesystem::create_directory("data"));
  }

  static NotifyWorkItem Item() {
    NotifyWorkItem item(kWorkItemNotification);
    item.profile.id = 3;
    item.profile.description = "Front door";
    item.profile.from = "Front Desk <desk@example.com>";
    item.profile.to = {"ops@example.com", "Night Shift <night@example.com>"};
    item.profile.cc = {"boss@example.com"};
    item.profile.bcc = {"audit@example.com"};
    item.profile.subject = "Motion on Lobby";
    item.profile.body = "Motion was detected.\r\nSecond line.\n";
    item.eventTime = 1700000000;
    item.milliseconds = 250;
    return item;
  }

  // Composes `item` as sequence 7 and returns the file's content.
  std::string Compose(const NotifyWorkItem& item, const std::vector<MailAttachment>& attachments,
                      uint32_t part = 0, uint32_t total = 1) {
    NotifyFileStreamImpl stream(m_host.callback(), *platform::SystemEnvForTests());
    m_mail = MailFile();
    EXPECT_TRUE(
        ComposeMailFile(item, attachments, part, total, 7, kCompositionTime, stream, m_mail));
    std::string content = ReadFile(m_mail.path);
    EXPECT_EQ(m_mail.size, content.size());
    return content;
  }

  // Writes `bytes` as an attachment file in the data directory.
  static MailAttachment Attachment(const std::string& name, const std::string& bytes) {
    std::string path = "data/" + name;
    EXPECT_TRUE(WriteFile(path, bytes));
    return MailAttachment{true, path, ""};
  }

  // What Python's email package makes of the message file at `path`.
  static std::string MimeCheck(const std::string& path, const std::vector<std::string>& files) {
    if (access(kPython, X_OK) != 0) {
      ADD_FAILURE() << kPython << " is needed to parse the messages";
      return std::string();
    }
    std::string command =
        std::string(kPython) + " " + ALERTMOD_MAIL_TESTDATA "/mime_check.py " + path;
    for (const std::string& file : files) command += " " + file;
    FILE* pipe = popen((command + " 2>&1").c_str(), "r");
    std::string output;
    char buffer[4096];
    size_t got = 0;
    while ((got = fread(buffer, 1, sizeof(buffer), pipe)) > 0) output.append(buffer, got);
    EXPECT_EQ(pclose(pipe), 0) << output;
    return output;
  }

  // Compares `content` with testdata/`name`; ALERTMOD_UPDATE_GOLDEN=1 rewrites it.
  static void ExpectGolden(const std::string& name, const std::string& content) {
    std::string path = std::string(ALERTMOD_MAIL_TESTDATA "/") + name;
    if (getenv("ALERTMOD_UPDATE_GOLDEN") != nullptr) {
      ASSERT_TRUE(WriteFile(path, content));
    }
    ASSERT_TRUE(FileExists(path)) << path;
    EXPECT_EQ(content, ReadFile(path)) << name;
  }

  testsupport::TempDir m_dir;
  std::unique_ptr<testsupport::ScopedChdir> m_chdir;
  testsupport::FakeHost m_host;
  MailFile m_mail;
};

const char kHeaderCheck[] =
    "header From: desk@example.com\n"
    "header To: ops@example.com, night@example.com\n"
    "header Date: Tue, 02 Jan 2024 10:00:00 +0100\n"
    "header Cc: boss@example.com\n";

TEST_F(MailFileTest, PlainMessage) {
  std::string content = Compose(Item(), {});
  EXPECT_EQ(m_mail.path, kMessagePath);
  EXPECT_EQ(m_mail.sender, "desk@example.com");
  EXPECT_EQ(m_mail.recipients, (std::vector<std::string>{"ops@example.com", "night@example.com",
                                                         "boss@example.com", "audit@example.com"}));
  ExpectGolden("plain.eml", content);
  EXPECT_EQ(MimeCheck(m_mail.path, {}),
            std::string(kHeaderCheck) +
                "header Subject: Motion on Lobby\n"
                "text text/plain Motion was detected.\\r\\nSecond line.\\r\\n\n");
}

TEST_F(MailFileTest, OneJpeg) {
  std::string jpeg = "\xFF\xD8\xFF\xE0" + Bytes(196, 1);
  std::string content = Compose(Item(), {Attachment("Lobby.jpg", jpeg)});
  ExpectGolden("jpeg.eml", content);
  EXPECT_EQ(MimeCheck(m_mail.path, {"data/Lobby.jpg"}),
            std::string(kHeaderCheck) +
                "header Subject: Motion on Lobby\n"
                "header Content-Type: multipart/mixed; "
                "boundary=\"b1914efc629febb89915e8a6f83ba6eb\"\n"
                "text text/plain Motion was detected.\\r\\nSecond line.\\r\\n\n"
                "part image/jpeg Lobby.jpg base64 200 SAME\n");
}

TEST_F(MailFileTest, FailedAttachmentIsDescribedInTheBody) {
  MailAttachment failed{false, "data/Door.mov",
                        "Failed to prepare video attachment for source: \"Door\", "};
  std::string content =
      Compose(Item(), {failed, Attachment("Yard.mp4", Bytes(300, 2)), {true, "data/gone.mov", ""}});
  ExpectGolden("failed_attachment.eml", content);
  EXPECT_EQ(MimeCheck(m_mail.path, {"data/Yard.mp4", "/dev/null"}),
            std::string(kHeaderCheck) +
                "header Subject: Motion on Lobby\n"
                "header Content-Type: multipart/mixed; "
                "boundary=\"b1914efc629febb89915e8a6f83ba6eb\"\n"
                "text text/plain Motion was detected.\\r\\nSecond line.\\r\\n\\r\\n- Failed to "
                "prepare video attachment for source: \"Door\", \n"
                "part video/quicktime Yard.mp4 base64 300 SAME\n"
                "part video/quicktime gone.mov base64 0 SAME\n");
}

TEST_F(MailFileTest, SplitsBySizeLimit) {
  constexpr size_t kMiB = 1048576;
  std::vector<PreparedAttachment> prepared;
  const std::pair<const char*, size_t> files[] = {
      {"Lobby.mov", 6 * kMiB}, {"Yard.mov", 6 * kMiB}, {"Door.jpg", 3 * kMiB}};
  for (size_t i = 0; i < 3; ++i) {
    prepared.push_back(
        {Attachment(files[i].first, Bytes(files[i].second, i + 10)), files[i].second});
  }
  std::vector<std::vector<MailAttachment>> messages = SplitAttachments(prepared, 10 * kMiB);
  ASSERT_EQ(messages.size(), 2u);
  std::vector<std::string> expected = {"part video/quicktime Lobby.mov base64 6291456 SAME\n",
                                       "part video/quicktime Yard.mov base64 6291456 SAME\n"
                                       "part image/jpeg Door.jpg base64 3145728 SAME\n"};
  std::vector<std::vector<std::string>> originals = {{"data/Lobby.mov"},
                                                     {"data/Yard.mov", "data/Door.jpg"}};
  for (uint32_t part = 1; part <= 2; ++part) {
    std::string content = Compose(Item(), messages[part - 1], part, 2);
    EXPECT_EQ(m_mail.path, std::string(kMessagePath) + "-Part-" + std::to_string(part) + "-of-2");
    ExpectGolden(part == 1 ? "split_first.eml" : "split_second.eml", ElideAttachments(content));
    EXPECT_EQ(MimeCheck(m_mail.path, originals[part - 1]),
              std::string(kHeaderCheck) + "header Subject: Motion on Lobby - Part " +
                  std::to_string(part) + " of 2\n" +
                  "header Content-Type: multipart/mixed; "
                  "boundary=\"b1914efc629febb89915e8a6f83ba6eb\"\n"
                  "text text/plain Motion was detected.\\r\\nSecond line.\\r\\n\n" +
                  expected[part - 1]);
  }
}

TEST_F(MailFileTest, Base64Pieces) {
  std::string full;
  for (int i = 0; i < 19; ++i) full += "QUFB";
  struct Case {
    size_t bytes;
    std::string encoded;
  };
  const Case cases[] = {
      {0, ""},
      {3, "QUFB\r\n"},
      {56, full.substr(0, 72) + "QUE="},
      {57, full + "\r\n"},
      {58, full + "\r\nQQ=="},
      {114, full + "\r\n" + full + "\r\n"},
      {115, full + "\r\n" + full + "\r\nQQ=="},
  };
  for (const Case& c : cases) {
    std::string content = Compose(Item(), {Attachment("a.jpg", std::string(c.bytes, 'A'))});
    size_t begin = content.find("filename=\"a.jpg\"\r\n\r\n");
    ASSERT_NE(begin, std::string::npos);
    EXPECT_EQ(content.substr(begin + 20), c.encoded + "\r\n" + kBoundaryLine + "--\r\n") << c.bytes;
  }
  // A file that cannot be read contributes nothing.
  std::string content = Compose(Item(), {{true, "data/missing.jpg", ""}});
  EXPECT_EQ(content.substr(content.find("filename=\"missing.jpg\"\r\n\r\n") + 26),
            std::string("\r\n") + kBoundaryLine + "--\r\n");
}

TEST_F(MailFileTest, AddressLines) {
  struct Case {
    std::vector<std::string> to;
    std::vector<std::string> cc;
    std::string lines;  // from the To line up to the Subject line
  };
  const std::string date = "Date: Tue, 02 Jan 2024 10:00:00 +0100 (CET)\r\n";
  const Case cases[] = {
      {{"a@x.com"}, {}, "To: a@x.com\r\n" + date},
      {{"a@x.com", "B <b@x.com>", "c@x.com"}, {}, "To: a@x.com,b@x.com,c@x.com\r\n" + date},
      {{}, {"c@x.com", "d@x.com"}, date + "Cc: c@x.com,d@x.com\r\n"},
      {{}, {}, date},
  };
  for (const Case& c : cases) {
    NotifyWorkItem item = Item();
    item.profile.to = c.to;
    item.profile.cc = c.cc;
    item.profile.bcc.clear();
    std::string content = Compose(item, {});
    EXPECT_EQ(content,
              "From: desk@example.com\r\n" + c.lines +
                  "Subject: Motion on Lobby\r\n\r\nMotion was detected.\r\nSecond line.\r\n");
  }
}

// Blind copies go to the envelope only; a header line would show them to
// everybody else.
TEST_F(MailFileTest, BlindCopiesStayOutOfTheHeader) {
  NotifyWorkItem item = Item();
  item.profile.bcc = {"Audit <audit@example.com>", "legal@example.com"};
  std::string content = Compose(item, {});
  EXPECT_EQ(content.find("Bcc"), std::string::npos);
  EXPECT_EQ(content.find("audit@"), std::string::npos);
  EXPECT_EQ(m_mail.recipients.back(), "legal@example.com");
  EXPECT_EQ(m_mail.recipients.size(), 5u);
}

TEST_F(MailFileTest, LineBreaksCannotForgeHeaders) {
  NotifyWorkItem item = Item();
  item.profile.subject = "Alarm\r\nBcc: spy@evil.com\nX-Forged: 1";
  item.profile.body = "Body\r\nX-Not-A-Header: 2\r\n";
  std::string content = Compose(item, {Attachment("a\r\nX-Evil: 3.jpg", "xyz")});
  EXPECT_NE(content.find("Subject: Alarm  Bcc: spy@evil.com X-Forged: 1\r\n"), std::string::npos);
  EXPECT_NE(content.find("filename=\"a  X-Evil: 3.jpg\"\r\n"), std::string::npos);
  EXPECT_NE(content.find("\r\nBody\r\nX-Not-A-Header: 2\r\n"), std::string::npos);
  std::string check = MimeCheck(m_mail.path, {"'data/a\r\nX-Evil: 3.jpg'"});
  EXPECT_EQ(check.find("header Bcc"), std::string::npos) << check;
  EXPECT_EQ(check.find("header X-"), std::string::npos) << check;
  EXPECT_NE(check.find("part image/jpeg a  X-Evil: 3.jpg base64 3 SAME"), std::string::npos)
      << check;
}

TEST_F(MailFileTest, CompositionFailures) {
  struct Case {
    const char* name;
    std::string from;
    std::vector<std::string> to;
    std::vector<std::string> bcc;
    std::string written;  // the partial file left behind
  };
  const Case cases[] = {
      {"from", "Front Desk", {"a@x.com"}, {}, ""},
      {"to", "d@x.com", {"a@x.com", "nobody"}, {}, "From: d@x.com\r\nTo: a@x.com,"},
      {"bcc",
       "d@x.com",
       {},
       {"x@"},
       "From: d@x.com\r\nDate: Tue, 02 Jan 2024 10:00:00 +0100 (CET)\r\n"},
  };
  for (const Case& c : cases) {
    NotifyWorkItem item = Item();
    item.profile.from = c.from;
    item.profile.to = c.to;
    item.profile.cc.clear();
    item.profile.bcc = c.bcc;
    NotifyFileStreamImpl stream(m_host.callback(), *platform::SystemEnvForTests());
    MailFile mail;
    EXPECT_FALSE(ComposeMailFile(item, {}, 0, 1, 7, kCompositionTime, stream, mail)) << c.name;
    EXPECT_EQ(ReadFile(kMessagePath), c.written) << c.name;
  }
}

TEST_F(MailFileTest, MissingDataDirectoryFailsTheOpen) {
  ASSERT_EQ(rmdir("data"), 0);
  NotifyFileStreamImpl stream(m_host.callback(), *platform::SystemEnvForTests());
  MailFile mail;
  EXPECT_FALSE(ComposeMailFile(Item(), {}, 0, 1, 7, kCompositionTime, stream, mail));
  EXPECT_EQ(mail.path, kMessagePath);
}

// Whatever the stream still buffers reaches the disk at the close; a full
// volume there must fail the message instead of sending it truncated.
TEST_F(MailFileTest, FullVolumeFailsTheMessage) {
  for (size_t attachmentBytes : {size_t{0}, size_t{5000000}}) {
    std::filesystem::create_symlink("/dev/full", kMessagePath);
    std::vector<MailAttachment> attachments;
    if (attachmentBytes > 0)
      attachments.push_back(Attachment("big.jpg", Bytes(attachmentBytes, 3)));
    NotifyFileStreamImpl stream(m_host.callback(), *platform::SystemEnvForTests());
    MailFile mail;
    EXPECT_FALSE(ComposeMailFile(Item(), attachments, 0, 1, 7, kCompositionTime, stream, mail))
        << attachmentBytes;
    ASSERT_TRUE(std::filesystem::remove(kMessagePath));
  }
}

TEST_F(MailFileTest, ExtractAddress) {
  struct Case {
    std::string text;
    bool found;
    std::string result;
  };
  const Case cases[] = {
      {"desk@example.com", true, "desk@example.com"},
      {"Front Desk <desk@example.com>", true, "desk@example.com"},
      {"\"Ops\" <o.p+s!#$%&'*/=?^_`{|}~-@mail-1.example.com>", true,
       "o.p+s!#$%&'*/=?^_`{|}~-@mail-1.example.com"},
      {"a@b, c@d", true, "a@b"},
      {"x@@y.com z@w", true, "z@w"},
      {"user@", false, "user@"},
      {"@example.com", false, "@example.com"},
      {"nobody", false, "nobody"},
      {"", false, ""},
      {"Ünïcödé <ü@x.com> v@y.org", true, "v@y.org"},
      // Longer than a header line may be: rejected before the pattern engine,
      // whose recursion would otherwise overflow the stack.
      {std::string(998 - 6, 'a') + "@x.com", true, std::string(998 - 6, 'a') + "@x.com"},
      {std::string(200000, 'a') + "@x.com", false, std::string(200000, 'a') + "@x.com"},
  };
  for (const Case& c : cases) {
    std::string text = c.text;
    EXPECT_EQ(ExtractAddress(text), c.found) << c.text.substr(0, 60);
    EXPECT_EQ(text, c.result) << c.text.substr(0, 60);
  }
}

TEST(SplitAttachmentsTest, Groups) {
  auto ok = [](const char* file, uint64_t bytes) {
    return PreparedAttachment{{true, file, ""}, bytes};
  };
  auto failed = [](const char* file) { return PreparedAttachment{{false, file, "failed"}, 999}; };
  struct Case {
    const char* name;
    std::vector<PreparedAttachment> prepared;
    int64_t limit;
    std::vector<std::vector<std::string>> files;
  };
  const Case cases[] = {
      {"nothing", {}, 10, {{}}},
      {"6 6 3 at 10", {ok("a", 6), ok("b", 6), ok("c", 3)}, 10, {{"a"}, {"b", "c"}}},
      {"exactly the limit", {ok("a", 6), ok("b", 4)}, 10, {{"a", "b"}}},
      {"no limit", {ok("a", 60), ok("b", 60)}, 0, {{"a", "b"}}},
      {"negative is no limit", {ok("a", 60), ok("b", 60)}, -1, {{"a", "b"}}},
      {"large one alone", {ok("a", 2), ok("b", 30), ok("c", 2)}, 10, {{"a"}, {"b"}, {"c"}}},
      {"first too large", {ok("a", 30), ok("b", 2)}, 10, {{}, {"a"}, {"b"}}},
      {"first too large, then failed", {ok("a", 30), failed("x")}, 10, {{}, {"a", "x"}}},
      {"failed before first", {failed("x"), ok("a", 30)}, 10, {{"x"}, {"a"}}},
      {"failed adds nothing", {ok("a", 6), failed("x"), ok("b", 4)}, 10, {{"a", "x", "b"}}},
      {"failed joins the last", {ok("a", 6), ok("b", 6), failed("x")}, 10, {{"a"}, {"b", "x"}}},
  };
  for (const Case& c : cases) {
    std::vector<std::vector<std::string>> files;
    for (const std::vector<MailAttachment>& message : SplitAttachments(c.prepared, c.limit)) {
      files.emplace_back();
      for (const MailAttachment& entry : message) files.back().push_back(entry.file);
    }
    EXPECT_EQ(files, c.files) << c.name;
  }
}

TEST_F(MailFileTest, ClearDataDirectoryRemovesOnlyMessageFiles) {
  for (const char* name : {"notify-mail-3-1-2-0", "notify-mail-x", "notify-mail-", "other.jpg",
                           "notify-mailx", "x-notify-mail-1"}) {
    ASSERT_TRUE(WriteFile(std::string("data/") + name, "x"));
  }
  ASSERT_TRUE(std::filesystem::create_directory("data/notify-mail-dir"));
  ClearDataDirectory(m_host.callback());
  for (const char* gone : {"notify-mail-3-1-2-0", "notify-mail-x", "notify-mail-"}) {
    EXPECT_FALSE(FileExists(std::string("data/") + gone)) << gone;
  }
  for (const char* kept : {"other.jpg", "notify-mailx", "x-notify-mail-1", "notify-mail-dir"}) {
    EXPECT_TRUE(FileExists(std::string("data/") + kept)) << kept;
  }
  EXPECT_TRUE(m_host.LogTexts().empty());
}

TEST_F(MailFileTest, ClearDataDirectoryErrors) {
  // No data directory yet: nothing to clear, nothing to say.
  ASSERT_EQ(rmdir("data"), 0);
  ClearDataDirectory(m_host.callback());
  EXPECT_TRUE(m_host.LogTexts().empty());
  // A file in its place cannot be read as a directory.
  ASSERT_TRUE(WriteFile("data", "x"));
  ClearDataDirectory(m_host.callback());
  std::vector<std::string> lines = m_host.LogTexts(25);
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_EQ(lines[0], "Exception while clearing data subdirectory: cannot read directory \"" +
                          m_dir.path() + "/data\": Not a directory");
}

TEST_F(MailFileTest, DataDirectoryIsKeptUntilCleared) {
  ClearDataDirectory(m_host.callback());
  std::string first = DataDirectory();
  EXPECT_EQ(first, m_dir.path() + "/data");
  testsupport::TempDir other;
  testsupport::ScopedChdir move(other.path());
  EXPECT_EQ(DataDirectory(), first);
  ClearDataDirectory(m_host.callback());
  EXPECT_EQ(DataDirectory(), other.path() + "/data");
}

}  // namespace
}  // namespace hx
