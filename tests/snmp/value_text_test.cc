#include "snmp/value_text.h"

#include <gtest/gtest.h>

#include "snmp/pdu.h"

namespace tessel {
namespace {

using namespace std::string_literals;

TEST(ValueTextTest, HostTextsBecomeValuesOfTheColumnType) {
  struct Case {
    std::uint8_t type;
    const char* syntax;
    std::string text;
    std::optional<VarValue> value;
  } cases[] = {
      {kAsnInteger, "", "-5", VarValue::Integer(-5)},
      {kAsnInteger, "", "abc", VarValue::Integer(-1)},
      {kAsnInteger, "", "3000000000", std::nullopt},
      {kAsnGauge, "", "4294967295", VarValue::Unsigned(kAsnGauge, 0xFFFFFFFFu)},
      {kAsnCounter64, "", "4294967296", VarValue::Unsigned(kAsnCounter64, 1ull << 32)},
      {kAsnCounter64, "", "18446744073709551616", std::nullopt},
      {kAsnOctetString, "", "'c0a80001'h", VarValue::Octets(kAsnOctetString, "\xC0\xA8\x00\x01"s)},
      {kAsnOctetString, "", "'abc'H", VarValue::Octets(kAsnOctetString, "\xAB\x0C"s)},
      {kAsnOctetString, "", "00:1a:2b:3c:4d:5e",
       VarValue::Octets(kAsnOctetString, "\x00\x1A\x2B\x3C\x4D\x5E"s)},
      {kAsnOctetString, "", "'xy'h", VarValue::Octets(kAsnOctetString, "'xy'h")},
      {kAsnOpaque, "", "00:1a:2b:3c:4d:5e", VarValue::Octets(kAsnOpaque, "00:1a:2b:3c:4d:5e")},
      {kAsnIpAddress, "", "10.0.0.1", VarValue::Octets(kAsnIpAddress, "\x0A\x00\x00\x01"s)},
      {kAsnIpAddress, "", "10.0.0.256", std::nullopt},
      {kAsnObjectId, "", "1.3.6", VarValue::ObjectId({1, 3, 6})},
      {kAsnObjectId, "", ".1.3.6", VarValue::ObjectId({1, 3, 6})},
      {kAsnNull, "", "anything", VarValue::Empty(kAsnNull)},
      {kAsnOctetString, "DateAndTime", "2024-5-6,7:8:9.1,+2:0",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01+\x02\x00"s)},
      {0x99, "", "2024-5-6,7:8:9.1",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01"s)},
      {kAsnOctetString, "DateAndTime", "2024-5-6,7:8", std::nullopt},
      // A BIT STRING's contents start with its count of unused bits, 0 to 7.
      {kAsnBitString, "", "'0380'h", VarValue::Octets(kAsnBitString, "\x03\x80"s)},
      {kAsnBitString, "", "'08ff'h", std::nullopt},
      {kAsnBitString, "", "", std::nullopt},
  };
  for (const Case& c : cases)
    EXPECT_EQ(TextToVarValue(c.type, c.syntax, c.text), c.value) << c.text;
}

TEST(ValueTextTest, SetValuesBecomeTheColumnText) {
  struct Case {
    std::uint8_t type;
    const char* syntax;
    VarValue value;
    std::optional<std::string> text;
    std::uint8_t error;
  } cases[] = {
      {kAsnOctetString, "", VarValue::Octets(kAsnOctetString, "AB"), "AB", 0},
      {kAsnOctetString, "", VarValue::Octets(kAsnOctetString, "\x00\xFF"s), "'00ff'h", 0},
      {kAsnOctetString, "", VarValue::Octets(kAsnOctetString, "'41'h"), "'2734312768'h", 0},
      {kAsnOctetString, "", VarValue::Octets(kAsnOctetString, ""), "", 0},
      {kAsnInteger, "", VarValue::Integer(-12), "-12", 0},
      {kAsnCounter64, "", VarValue::Unsigned(kAsnCounter64, (1ull << 32) + 5), "4294967301", 0},
      {kAsnIpAddress, "", VarValue::Octets(kAsnIpAddress, "\x0A\x00\x00\x01"s), "10.0.0.1", 0},
      {kAsnOctetString, "MacAddress",
       VarValue::Octets(kAsnOctetString, "\x00\x1A\x2B\x3C\x4D\x5E"s), "00:1a:2b:3c:4d:5e", 0},
      {kAsnOctetString, "DateAndTime",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01+\x02\x00"s),
       "2024-5-6,7:8:9.1,+2:0", 0},
      {kAsnOctetString, "DateAndTime",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01+"s), std::nullopt,
       kBadValue},
      {kAsnOctetString, "DateAndTime",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x0D\x06\x07\x08\x09\x01"s), std::nullopt,
       kBadValue},
      {kAsnOctetString, "DateAndTime",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01*\x02\x00"s),
       std::nullopt, kBadValue},
      {kAsnInteger, "", VarValue::Octets(kAsnOctetString, "A"), std::nullopt, kWrongType},
      {kAsnOctetString, "", VarValue::Integer(1), std::nullopt, kWrongType},
      {kAsnIpAddress, "", VarValue::Octets(kAsnIpAddress, "\x0A"s), std::nullopt, kGenErr},
  };
  for (const Case& c : cases) {
    std::uint8_t error = 0;
    EXPECT_EQ(SetValueText(c.type, c.syntax, c.value, &error), c.text) << c.text.value_or("");
    EXPECT_EQ(error, c.error) << c.text.value_or("");
  }
}

}  // namespace
}  // namespace tessel
