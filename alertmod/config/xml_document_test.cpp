#include "alertmod/config/xml_document.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

namespace hx {
namespace {

std::string Nested(size_t levels, const std::string& open = "<Trellan>",
                   const std::string& close = "</Trellan>") {
  std::string text;
  for (size_t i = 0; i < levels; ++i) text += open;
  for (size_t i = 0; i < levels; ++i) text += close;
  return text;
}

// One element with `count` attributes, whose values look like more of them.
std::string WithAttributes(size_t count) {
  std::string text = "<a";
  for (size_t i = 0; i < count; ++i) text += " v" + std::to_string(i) + "='w=\"x\" />'";
  return text + "/>";
}

TEST(XmlDocumentTest, MeasuresNestingAsTinyXmlReadsIt) {
  struct Case {
    std::string text;
    std::optional<size_t> depth;
  };
  const Case cases[] = {
      {"", 0},
      {"<a/>", 1},
      {"<a></a>", 1},
      {"<a><b/><b><c/></b></a>", 3},
      {"<?xml version=\"1.0\" encoding='UTF-8'?><!-- <x><y><z> --><a></a>", 1},
      {"<!DOCTYPE a><a><![CDATA[<b><c><d>]]></a>", 1},
      {"<a v=\"/>\" w='</a>'><b/></a>", 2},
      {"<a v=1 w=x.y><b/></a>", 2},
      {"<a/> trailing text", 1},
      {"</x><a></a>", 1},  // a stray end tag outside the root is skipped
      {"<a><b>", std::nullopt},
      {"<a x=\"1", std::nullopt},
      {"<a><!-- never closed", std::nullopt},
      {"<a><![CDATA[never closed", std::nullopt},
      {"<a v=x\"y\"/>", std::nullopt},
      {"<a\xC3\xA9/>", std::nullopt},  // a non-ASCII name
      {"<a v=\"caf\xC3\xA9\">caf\xC3\xA9</a>", 1},
      {std::string("<a>\0<b><c>", 10), std::nullopt},  // TinyXML stops at the NUL
      {WithAttributes(kMaxXmlAttributes), 1},
      {WithAttributes(kMaxXmlAttributes + 1), std::nullopt},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(XmlNestingDepth(c.text, 100), c.depth) << c.text;
  }
  EXPECT_GT(XmlNestingDepth(Nested(50), 10).value_or(0), 10u);
}

TEST(XmlDocumentTest, RefusesDeepNestingBeforeParsing) {
  TiXmlDocument document;
  EXPECT_TRUE(ParseXmlDocument(Nested(kMaxXmlNesting), document));
  ASSERT_NE(document.RootElement(), nullptr);
  // Deep enough to overflow the stack inside TinyXML if it were parsed.
  const std::string deep[] = {
      Nested(200000),
      Nested(kMaxXmlNesting + 1),
      Nested(100000, "<a x='</a>'>", "</a>"),
  };
  for (const std::string& text : deep) {
    TiXmlDocument refused;
    EXPECT_FALSE(ParseXmlDocument(text, refused)) << text.substr(0, 60);
    EXPECT_EQ(refused.FirstChild(), nullptr);
  }
  // A lead byte that TinyXML's UTF-8 mode would read together with the "<"
  // after it, nesting every following element; read byte by byte, these are
  // siblings.
  TiXmlDocument siblings;
  EXPECT_TRUE(ParseXmlDocument(
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>" + Nested(100000, "<a>\xF0</a>", ""), siblings));
  ASSERT_NE(siblings.RootElement(), nullptr);
  EXPECT_EQ(siblings.RootElement()->FirstChildElement(), nullptr);
}

TEST(XmlDocumentTest, ParsesHostDocumentsByteForByte) {
  TiXmlDocument document;
  ASSERT_TRUE(
      ParseXmlDocument("\xEF\xBB\xBF<?xml version=\"1.0\" encoding=\"UTF-8\"?>"
                       "<Trellan Delta=\"0\"><Input Name=\"Caf\xC3\xA9 &amp; Bar\"/></Trellan>",
                       document));
  const TiXmlElement* input = document.RootElement()->FirstChildElement("Input");
  ASSERT_NE(input, nullptr);
  EXPECT_STREQ(input->Attribute("Name"), "Caf\xC3\xA9 & Bar");
  // The UTF-8 mode would drop a byte order mark at the start of a value.
  ASSERT_TRUE(ParseXmlDocument("<?xml ?><a><to>\xEF\xBB\xBF</to></a>", document));
  EXPECT_STREQ(document.RootElement()->FirstChildElement("to")->GetText(), "\xEF\xBB\xBF");
}

TEST(XmlDocumentTest, ReportsParseErrorsWithoutNodes) {
  const char* const broken[] = {"<a><b></a>", "<a", "", "just text", "<a></b>"};
  for (const char* text : broken) {
    TiXmlDocument document;
    EXPECT_FALSE(ParseXmlDocument(text, document)) << text;
    EXPECT_EQ(document.FirstChild(), nullptr) << text;
  }
}

}  // namespace
}  // namespace hx
