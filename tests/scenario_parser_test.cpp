// Scenario files: the words of a line, a whole scenario read into its model,
// every fault reported at its line, and the configuration a scenario gives
// the module.
#include <gtest/gtest.h>

#include <map>
#include <string>
#include <vector>

#include "host/scenario/notify_config.h"
#include "host/scenario/scenario_lexer.h"
#include "host/scenario/scenario_parser.h"

namespace {

using refhost::scenario::ConfigSetting;
using refhost::scenario::ParseOptions;
using refhost::scenario::ParseResult;
using refhost::scenario::ParseScenario;
using refhost::scenario::TimelineEntry;
using refhost::scenario::Token;

refhost::scenario::VariableLookup Variables(std::map<std::string, std::string> values) {
  return [values](const std::string& name) -> std::optional<std::string> {
    const auto found = values.find(name);
    if (found == values.end()) return std::nullopt;
    return found->second;
  };
}

std::string Words(const std::vector<Token>& tokens) {
  std::string text;
  for (const Token& token : tokens) {
    text += "[" + (token.key.empty() ? "" : token.key + "=") + token.value + "]";
  }
  return text;
}

TEST(ScenarioLexerTest, WordsQuotesEscapesAndVariables) {
  const auto variables = Variables({{"PORT", "2525"}, {"SPACED", "a b  c"}, {"EMPTY", ""}});
  struct Case {
    const char* line;
    const char* words;  // nullptr: an error containing `error`
    const char* error;
  };
  const Case cases[] = {
      {"", "", nullptr},
      {"   # only a comment", "", nullptr},
      {"camera Lobby input=1", "[camera][Lobby][input=1]", nullptr},
      {"camera \"Front door\" # the door", "[camera][Front door]", nullptr},
      {"x subject=\"a = b\" to=a@b#c", "[x][subject=a = b][to=a@b#c]", nullptr},
      {"x \"k=v\" k2=\"\"", "[x][k=v][k2=]", nullptr},
      {"x \"say \\\"hi\\\"\\n\\\\\"", "[x][say \"hi\"\n\\]", nullptr},
      {"x port=${PORT} p=${MISSING:-25} e=${EMPTY:-x}", "[x][port=2525][p=25][e=]", nullptr},
      {"x v=${SPACED}", "[x][v=a b  c]", nullptr},
      {"x price=$$5 lone=$", "[x][price=$5][lone=$]", nullptr},
      {"x \"unterminated", nullptr, "unterminated quote starting at column 3"},
      {"x \"\\q\"", nullptr, "unknown escape \\q"},
      {"x v=${NOPE}", nullptr, "variable NOPE is not set"},
      {"x v=${OPEN", nullptr, "without a closing"},
      {"x v=${bad name}", nullptr, "bad variable name"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.line);
    std::vector<Token> tokens;
    std::string error;
    const bool ok = refhost::scenario::SplitLine(c.line, variables, &tokens, &error);
    if (c.words != nullptr) {
      ASSERT_TRUE(ok) << error;
      EXPECT_EQ(Words(tokens), c.words);
    } else {
      EXPECT_FALSE(ok);
      EXPECT_NE(error.find(c.error), std::string::npos) << error;
    }
  }
}

constexpr char kGoodScenario[] = R"(# A small system
system serial=${SERIAL} name="Test server"
camera Lobby feed=videos/lobby.mp4
stream Lobby context=1 codec=jpeg width=320 height=240 feed=/abs/still.avi
camera "Back door" plugin=0x20000 device=2 input=3 codec=h265 width=640 height=480
trigger Door device=1 number=4
group 5 "Ground floor" members=Lobby,"Back door",Door
event 10 camera=Lobby prealarm=3 notify=1,2
event 11 group=5 notify=2
event 12 type=storage notify=3

web 127.0.0.1:8080
smtp "Office" address=127.0.0.1 port=${SMTP_PORT:-25} security=starttls \
     user=desk password="p&ss"
limits retry-queue=5 size-limit-mb=4
profile 1 "Lobby" from="Desk <desk@example.com>" to=a@example.com,b@example.com \
     subject="{source}" attach=yes video-seconds=6 edge=both throttle=30
body 1 "First line"
body 1 "Second line"
profile 2 "Groups" from=d@example.com to=c@example.com bcc=audit@example.com
profile 3 "Health" from=d@example.com to=it@example.com body="one\ntwo"

at 9 wait reports=3 profile=1 timeout=20s
at 2.5 alarm start event=10
at 3 alarm end camera="Back door" profile=1 type=video-loss message="lost"
at 4 alarm start event=11
at 5 alarm start event=12
at 6 test 1 2
at 20 stop
)";

TEST(ScenarioParserTest, ReadsAWholeScenario) {
  ParseOptions options;
  options.baseDir = "/scenarios";
  options.variables = Variables({{"SERIAL", "S-1"}});
  const ParseResult result = ParseScenario(kGoodScenario, options);
  ASSERT_TRUE(result.ok()) << refhost::scenario::FormatDiagnostic("good", result.errors[0]);
  const auto& s = result.scenario;
  EXPECT_EQ(s.serverSerial, "S-1");
  EXPECT_EQ(s.serverDescription, "Test server");

  ASSERT_EQ(s.cameras.size(), 2u);
  ASSERT_EQ(s.cameras[0].streams.size(), 2u);
  EXPECT_EQ(s.cameras[0].streams[0].feed, "/scenarios/videos/lobby.mp4");
  EXPECT_FALSE(s.cameras[0].streams[0].formatGiven) << "taken from the feed";
  EXPECT_EQ(s.cameras[0].streams[1].feed, "/abs/still.avi");
  EXPECT_EQ(s.cameras[0].streams[1].description.context, 1);
  EXPECT_EQ(s.cameras[0].streams[1].description.standard, refhost::kStandardJpeg);
  EXPECT_EQ(s.cameras[1].plugin, 0x20000);
  EXPECT_EQ(s.cameras[1].streams[0].description.standard, refhost::kStandardH265);
  ASSERT_EQ(s.system.groups.size(), 1u);
  EXPECT_EQ(s.system.groups[0].members.size(), 3u);
  ASSERT_EQ(s.system.events.size(), 3u);
  EXPECT_EQ(s.system.events[0].preAlarmSeconds, 3);
  EXPECT_EQ(s.system.events[0].notifyProfiles, (std::vector<int32_t>{1, 2}));

  const ConfigSetting& config = s.config;
  EXPECT_EQ(config.source, ConfigSetting::Source::kInline);
  ASSERT_EQ(config.servers.size(), 1u);
  EXPECT_EQ(config.servers[0].port, 25);
  EXPECT_EQ(config.servers[0].security, 2);
  EXPECT_EQ(config.servers[0].password, "p&ss");
  ASSERT_EQ(config.profiles.size(), 3u);
  EXPECT_EQ(config.profiles[0].to, (std::vector<std::string>{"a@example.com", "b@example.com"}));
  EXPECT_EQ(config.profiles[0].eventEdge, 2);
  EXPECT_EQ(refhost::scenario::ProfileBody(config.profiles[0]), "First line\r\nSecond line");
  EXPECT_EQ(refhost::scenario::ProfileBody(config.profiles[2]), "one\r\ntwo");

  std::vector<double> times;
  for (const TimelineEntry& entry : s.timeline) times.push_back(entry.at);
  EXPECT_EQ(times, (std::vector<double>{2.5, 3, 4, 5, 6, 9, 20}));
  const TimelineEntry& motion = s.timeline[0];
  ASSERT_EQ(motion.requests.size(), 2u) << "one request per profile the event notifies";
  EXPECT_EQ(motion.requests[1].profile, 2);
  EXPECT_EQ(motion.requests[0].action, 10);
  ASSERT_TRUE(motion.requests[0].source);
  EXPECT_EQ(motion.requests[0].source->type, 2) << "a camera's alarm is motion";
  const TimelineEntry& loss = s.timeline[1];
  EXPECT_EQ(loss.requests[0].alarm, 0);
  EXPECT_EQ(loss.requests[0].source->device, 2);
  EXPECT_EQ(loss.requests[0].source->type, 1);
  EXPECT_EQ(loss.requests[0].message, "lost");
  const TimelineEntry& group = s.timeline[2];
  EXPECT_EQ(group.requests[0].group, 5);
  EXPECT_FALSE(group.requests[0].source);
  EXPECT_EQ(group.requests[0].groupMembers.size(), 3u);
  const TimelineEntry& health = s.timeline[3];
  EXPECT_EQ(health.requests[0].source->type, 8);
  EXPECT_EQ(health.requests[0].source->plugin, 0) << "the system itself, no camera";
  const TimelineEntry& test = s.timeline[4];
  EXPECT_TRUE(test.test);
  ASSERT_EQ(test.requests.size(), 2u);
  EXPECT_EQ(test.requests[0].message, "Testing Profile");
  EXPECT_EQ(s.timeline[5].wait.timeoutSeconds, 20);
  EXPECT_EQ(s.timeline[6].kind, TimelineEntry::Kind::kStop);
}

TEST(ScenarioParserTest, EveryFaultAtItsLine) {
  // Line 1 defines what the faulty second line may refer to.
  const char kBase[] = "camera Lobby\n";
  struct Case {
    const char* line;
    const char* error;
  };
  const Case cases[] = {
      {"frobnicate", "unknown directive \"frobnicate\""},
      {"input=3", "a line starts with a directive"},
      {"camera", "missing camera name"},
      {"camera Hall fed=x.mp4", "unknown attribute fed for camera"},
      {"camera Hall input=300", "input must lie between 0 and 255, not 300"},
      {"camera Hall plugin=0x10001", "plugin must be a multiple of 0x10000"},
      {"camera Hall codec=vp9", "codec must be one of"},
      {"camera Lobby", "\"Lobby\" is defined twice"},
      {"camera Hall input=0", "already has this plugin, device and input"},
      {"camera \"Hall", "unterminated quote"},
      {"camera ${NOPE}", "variable NOPE is not set"},
      {"stream Lobby codec=jpeg", "stream needs context="},
      {"stream Lobby context=0", "context must lie between 1 and 15"},
      {"stream Hall context=1", "unknown camera \"Hall\""},
      {"group 1 G members=Lobby,Ghost", "unknown camera or trigger \"Ghost\""},
      {"group 1 G members=Lobby,,Lobby", "members has an empty entry"},
      {"event 1 camera=Lobby group=1", "give only one of camera=, trigger= and group="},
      {"event 1 type=sneeze", "type must be one of"},
      {"smtp S port=25", "smtp needs address="},
      {"smtp S address=h security=tls", "security must be one of plain, smtps, starttls"},
      {"profile 1 P from=a@b", "profile needs from= and to="},
      {"profile 1 P from=a to=b attach=maybe", "attach must be yes or no"},
      {"profile 1 P from=a to=b to=c", "attribute to is given twice"},
      {"body 9 \"text\"", "unknown profile 9"},
      {"limits size-limit-mb=5000", "size-limit-mb must lie between 0 and 2047"},
      {"config-as later", "config-as takes notify.xml or update"},
      {"at soon alarm start", "at needs a time in seconds"},
      {"at 1", "at needs a time and an action"},
      {"at 1 dance", "unknown action \"dance\""},
      {"at 1 alarm begin camera=Lobby profile=1", "alarm start or alarm end"},
      {"at 1 alarm start camera=Hall profile=1", "unknown camera \"Hall\""},
      {"at 1 alarm start profile=1", "needs type="},
      {"at 1 alarm start camera=Lobby", "alarm needs profile="},
      {"at 1 alarm start event=4", "unknown event 4"},
      {"at 1 test", "test needs a profile number"},
      {"at 1 wait timeout=5", "wait needs reports=N or log=TEXT"},
      {"at 1 wait reports=1 timeout=never", "timeout must be a number of seconds"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.line);
    const ParseResult result = ParseScenario(std::string(kBase) + c.line + "\n", ParseOptions());
    ASSERT_FALSE(result.ok());
    EXPECT_EQ(result.errors[0].line, 2);
    EXPECT_NE(result.errors[0].message.find(c.error), std::string::npos)
        << result.errors[0].message;
  }
}

TEST(ScenarioParserTest, FaultsOfOrderAndMixingAcrossLines) {
  struct Case {
    const char* text;
    int line;
    const char* error;
  };
  const Case cases[] = {
      {"at 5 stop\nat 6 test 1\n", 2, "comes after the stop at line 1"},
      {"at 5 stop\n\nat 5 test 1\n", 3, "comes after the stop at line 1"},
      {"at 5 stop\nat 9 stop\n", 2, "stop is given twice"},
      {"smtp S address=h\nconfig-file other.xml\n", 2, "cannot be mixed"},
      {"config-file other.xml\nweb h:80\n", 2, "cannot be mixed"},
      {"camera A \\\n  input=999\ncamera B\n", 1, "input must lie between"},
      {"camera A\n\nevent 1 camera=A\nevent 1 camera=A\n", 4, "event 1 is defined twice"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.text);
    const ParseResult result = ParseScenario(c.text, ParseOptions());
    ASSERT_EQ(result.errors.size(), 1u);
    EXPECT_EQ(result.errors[0].line, c.line);
    EXPECT_NE(result.errors[0].message.find(c.error), std::string::npos)
        << result.errors[0].message;
  }
}

TEST(ScenarioParserTest, ReportsEveryFaultOfAFileInLineOrder) {
  const ParseResult result =
      ParseScenario("camera A\ncamera\nweb\nat 1 alarm start camera=B profile=1\n", ParseOptions());
  ASSERT_EQ(result.errors.size(), 3u);
  EXPECT_EQ(result.errors[0].line, 2);
  EXPECT_EQ(result.errors[1].line, 3);
  EXPECT_EQ(result.errors[2].line, 4);
  EXPECT_EQ(refhost::scenario::FormatDiagnostic("x.scn", result.errors[2]),
            "x.scn:4: unknown camera \"B\"");
}

TEST(ScenarioParserTest, MissingFileIsOneFaultOfTheFile) {
  const ParseResult result =
      refhost::scenario::LoadScenario("/nonexistent/demo.scn", Variables({}));
  ASSERT_EQ(result.errors.size(), 1u);
  EXPECT_EQ(refhost::scenario::FormatDiagnostic("demo.scn", result.errors[0]),
            "demo.scn: cannot read the file");
}

TEST(ScenarioConfigTest, WritesOnlyWhatTheScenarioGives) {
  ConfigSetting config;
  config.source = ConfigSetting::Source::kInline;
  config.maxRetryQueue = 5;
  refhost::scenario::SmtpServerSetting server;
  server.description = "S & T";
  server.address = "mail";
  config.servers.push_back(server);
  refhost::scenario::ProfileSetting profile;
  profile.id = 4;
  profile.description = "P";
  profile.from = "a@b";
  profile.to = {"c@d"};
  profile.bodyLines = {"x"};
  config.profiles.push_back(profile);
  const std::string element = refhost::scenario::NotifyElementText(config);
  EXPECT_EQ(element,
            "<Notify ID=\"786432\" MaxRetryQueue=\"5\"><Servers><smtp description=\"S &amp; T\" "
            "address=\"mail\" /></Servers><Profiles autoincrement=\"5\"><smtp ID=\"4\" "
            "description=\"P\" from=\"a@b\" subject=\"\"><to>c@d</to><body>x</body></smtp>"
            "</Profiles></Notify>");
  const std::string file = refhost::scenario::NotifyFileText(config);
  EXPECT_EQ(file.rfind("<?xml ?>\n<Trellan Delta=\"0\">\n    <Notify", 0), 0u) << file;
}

}  // namespace
