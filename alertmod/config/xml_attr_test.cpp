#include "alertmod/config/xml_attr.h"

#include <gtest/gtest.h>
#include <tinyxml.h>

namespace hx {
namespace {

TEST(XmlAttrTest, ReadsSignedDecimalOnly) {
  struct Case {
    const char* text;
    std::optional<int32_t> value;
  };
  const Case cases[] = {
      {"0", 0},
      {"786432", 786432},
      {"-17", -17},
      {"+5", 5},
      {" 42 ", 42},
      {"007", 7},
      {"2147483647", INT32_MAX},
      {"-2147483648", INT32_MIN},
      {"2147483648", std::nullopt},
      {"-2147483649", std::nullopt},
      {"99999999999999999999999", std::nullopt},
      {"0xC0000", std::nullopt},
      {"12abc", std::nullopt},
      {"1.5", std::nullopt},
      {"1 2", std::nullopt},
      {"", std::nullopt},
      {" ", std::nullopt},
      {"-", std::nullopt},
      {"abc", std::nullopt},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(ParseDecimalInt32(c.text), c.value) << '"' << c.text << '"';
  }
  EXPECT_EQ(ParseDecimalInt32(nullptr), std::nullopt);
}

TEST(XmlAttrTest, MissingAttributeIsAbsent) {
  TiXmlDocument doc;
  doc.Parse("<Notify ID=\"786432\" Hex=\"0xC0000\" Empty=\"\"/>");
  const TiXmlElement* notify = doc.RootElement();
  ASSERT_NE(notify, nullptr);
  EXPECT_EQ(IntAttribute(*notify, "ID"), 786432);
  EXPECT_EQ(IntAttribute(*notify, "Hex"), std::nullopt);
  EXPECT_EQ(IntAttribute(*notify, "Empty"), std::nullopt);
  EXPECT_EQ(IntAttribute(*notify, "Missing"), std::nullopt);
  EXPECT_EQ(IntAttributeOr(*notify, "Missing", -3), -3);
  EXPECT_EQ(IntAttributeOr(*notify, "Hex", 9), 9);
  EXPECT_EQ(IntAttributeOr(*notify, "ID", 9), 786432);
}

}  // namespace
}  // namespace hx
