#include "base/conversions.h"

#include <gtest/gtest.h>

#include <climits>

namespace tessel {
namespace {

TEST(ConversionsTest, DecimalAndHexText) {
  const std::pair<const char*, std::int32_t> decimals[] = {
      {"-12", -12},      {"+7", 7}, {"12a", -1}, {"", 0}, {"-2147483648", INT32_MIN},
      {"4294967306", -1}};  // refused, not wrapped to 10
  for (auto [text, value] : decimals) EXPECT_EQ(TextToInt(text), value) << text;
  EXPECT_EQ(HexTextToInt("1aF"), 0x1AF);
  EXPECT_EQ(HexTextToInt("xyz"), -1);
  EXPECT_EQ(IntToText(INT32_MIN), "-2147483648");
  EXPECT_EQ(IntToText(0), "0");
  EXPECT_EQ(UIntToText(4294967295u), "4294967295");
}

TEST(ConversionsTest, DottedTextToOid) {
  Oid oid;
  EXPECT_EQ(ParseDottedText(&oid, ".1.3.6.1", false), 4);
  EXPECT_EQ(oid, (Oid{1, 3, 6, 1}));
  EXPECT_EQ(ParseDottedText(&oid, "10.0.0.1", true), 4);
  EXPECT_EQ(oid, (Oid{10, 0, 0, 1}));
  EXPECT_EQ(ParseDottedText(&oid, ".1.3.6.4294967295", false), 4);
  EXPECT_EQ(oid.back(), 4294967295u);
  for (const char* text : {".1..3", "1", ".1.3.", ".1.x", ".1.4294967296"})
    EXPECT_EQ(ParseDottedText(&oid, text, false), -1) << text;
}

TEST(ConversionsTest, OidTextAndOrder) {
  EXPECT_EQ(OidToText(Oid{1, 3, 6, 1, 4294967295u}), ".1.3.6.1.4294967295");
  EXPECT_EQ(OidToPlainText(Oid{2, 3}), "2.3");
  EXPECT_EQ(CompareOid(Oid{1, 3, 6}, Oid{1, 3, 6, 1}), -1);
  EXPECT_EQ(CompareOid(Oid{1, 3, 7}, Oid{1, 3, 6, 1}), 1);
  EXPECT_EQ(CompareOid(Oid{1, 3, 4294967295u}, Oid{1, 3, 1}), 1);
  EXPECT_EQ(CompareOid(Oid{1, 3}, Oid{1, 3}), 0);
  EXPECT_EQ(CompareOid(Oid{1, 3, 6, 1}, Oid{1, 3, 6}), 2);
  EXPECT_EQ(BytesToHex(std::string("\x00\xff\x1a", 3)), "00ff1a");
}

}  // namespace
}  // namespace tessel
