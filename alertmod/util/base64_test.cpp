#include "alertmod/util/base64.h"

#include <gtest/gtest.h>

namespace hx {
namespace {

TEST(Base64Test, EncodesWithPadding) {
  struct Case {
    std::string bytes;
    std::string text;
  };
  const Case cases[] = {
      {"", ""},
      {"f", "Zg=="},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {"foob", "Zm9vYg=="},
      {"fooba", "Zm9vYmE="},
      {"foobar", "Zm9vYmFy"},
      {std::string("\xff\xfe\x00", 3), "//4A"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Base64Encode(c.bytes), c.text) << c.bytes;
    EXPECT_EQ(Base64Decode(c.text), c.bytes) << c.text;
  }
}

TEST(Base64Test, DecodesLeniently) {
  EXPECT_EQ(Base64Decode("Zm9v\r\nYmFy"), "foobar");
  EXPECT_EQ(Base64Decode(" Zm 9v*"), "foo");
  // An incomplete final group yields nothing.
  EXPECT_EQ(Base64Decode("Zm9vYm"), "foo");
  // Decoding stops after a padded group.
  EXPECT_EQ(Base64Decode("Zg==Zm9v"), "f");
  // A later alphabet character clears the padding count: "=" was a zero digit.
  EXPECT_EQ(Base64Decode("Z=9v"), std::string("d\x0fo", 3));
}

TEST(Base64Test, RoundTripsEveryLength) {
  std::string bytes;
  for (int n = 0; n < 300; ++n) {
    EXPECT_EQ(Base64Decode(Base64Encode(bytes)), bytes) << n;
    bytes.push_back(static_cast<char>(n * 37));
  }
}

}  // namespace
}  // namespace hx
