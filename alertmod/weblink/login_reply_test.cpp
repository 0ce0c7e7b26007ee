#include "alertmod/weblink/login_reply.h"

#include <gtest/gtest.h>

namespace hx {
namespace {

TEST(LoginReplyTest, FindsTheServerOfTheSerial) {
  struct Case {
    const char* name;
    std::string body;
    bool accepted;
    std::string serverId;
    bool itemForm;
  };
  const Case cases[] = {
      {"item form", R"({"list":[{"id":"12","model":"NVR","serial":"SN-1"}]})", true, "12", true},
      {"search form", R"({"list":[{"id":"12","serial":"SN-1"}]})", true, "12", false},
      {"id after serial", R"({"list":[{"serial":"SN-1","id":"abc"}]})", true, "abc", false},
      {"second entry", R"({"list":[{"id":"1","serial":"SN-0"},{"serial":"SN-1","id":"2"}]})", true,
       "2", false},
      {"blanks and colons", R"({"list" : [ {"id" :  "8" , "serial":::"SN-1"} ]})", true, "8",
       false},
      {"numeric id", R"({"list":[{"id":17,"serial":"SN-1"}]})", true, "", false},
      {"serial not listed", R"({"list":[{"id":"1","serial":"SN-9"}]})", true, "", false},
      {"serial in other case", R"({"list":[{"id":"1","serial":"sn-1"}]})", true, "", false},
      {"entry without id", R"({"list":[{"serial":"SN-1"},{"id":"7","serial":"SN-2"}]})", true, "",
       false},
      // A model seen in any earlier entry chooses the item form for all.
      {"model of another entry",
       R"({"list":[{"id":"1","model":"m","serial":"SN-0"},{"id":"2","serial":"SN-1"}]})", true, "2",
       true},
      // With the item form, an id already seen is taken at the serial.
      {"item form takes the first id",
       R"({"list":[{"id":"1","model":"m","serial":"SN-1","id":"2"}]})", true, "1", true},
      {"search form takes the last id", R"({"list":[{"id":"1","serial":"SN-1","id":"2"}]})", true,
       "2", false},
      {"nested objects",
       R"({"user":{"id":"u"},"list":[{"cam":{"serial":"SN-1","id":"9"},"id":"3","serial":"SN-2"},)"
       R"({"serial":"SN-1","info":{"id":"8","model":"x"},"id":"4"}],"more":[1]})",
       true, "4", false},
      {"closing brace in a string", R"({"list":[{"name":"Lobby }","serial":"SN-1","id":"5"}]})",
       true, "5", false},
      {"opening brace in a string", R"({"list":[{"name":"a{","serial":"SN-1","id":"5"}]})", true,
       "5", false},
      {"escaped quote in a string",
       R"({"list":[{"name":"say \"}\"","id":"q\"r","serial":"SN-1"}]})", true, R"(q\"r)", false},
      {"key word as a value", R"({"list":[{"name":"serial","serial":"SN-1","id":"6"}]})", true, "6",
       false},
      {"no list", R"({"items":[{"id":"1","serial":"SN-1"}]})", false, "", false},
      {"no serial anywhere", R"({"list":[{"id":"1","name":"x"}]})", false, "", false},
      {"numeric serial only", R"({"list":[{"id":"1","serial":7}]})", false, "", false},
      {"no array", R"({"list":{"id":"1","serial":"SN-1"}})", false, "", false},
      {"array closed before", R"(] {"list":[{"id":"1","serial":"SN-1"})", false, "", false},
      {"unterminated serial", R"({"list":[{"id":"1","serial":"SN-1]})", false, "", false},
      {"unterminated id", R"({"list":[{"serial":"SN-1","id":"1]})", false, "", false},
      {"too short", "[\"\"]", false, "", false},
      {"empty", "", false, "", false},
  };
  for (const Case& c : cases) {
    LoginReply reply = ParseLoginReply(c.body, "SN-1");
    EXPECT_EQ(reply.accepted, c.accepted) << c.name;
    EXPECT_EQ(reply.serverId, c.serverId) << c.name;
    EXPECT_EQ(reply.itemForm, c.itemForm) << c.name;
  }
}

}  // namespace
}  // namespace hx
