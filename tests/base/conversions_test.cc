#include "base/conversions.h"

#include <gtest/gtest.h>

#include <climits>

namespace tessel {
namespace {

TEST(ConversionsTest, DecimalAndHexText) {
  EXPECT_EQ(TextToInt("-12"), -12);
  EXPECT_EQ(TextToInt("+7"), 7);
  EXPECT_EQ(TextToInt("12a"), -1);
  EXPECT_EQ(TextToInt(""), 0);
  EXPECT_EQ(TextToInt("-2147483648"), INT32_MIN);
  EXPECT_EQ(TextToInt("4294967306"), -1);  // refused, not wrapped to 10
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
  EXPECT_EQ(ParseDottedText(&oid, ".1..3", false), -1);
  EXPECT_EQ(ParseDottedText(&oid, "1", false), -1);
  EXPECT_EQ(ParseDottedText(&oid, ".1.3.", false), -1);
  EXPECT_EQ(ParseDottedText(&oid, ".1.x", false), -1);
  EXPECT_EQ(ParseDottedText(&oid, ".1.4294967296", false), -1);
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
