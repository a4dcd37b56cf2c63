#include "snmp/ber.h"

#include <gtest/gtest.h>

#include <vector>

namespace tessel {
namespace {

using Bytes = std::vector<std::uint8_t>;

Bytes Encode(const VarValue& value, std::int32_t room = 64) {
  Bytes buffer(static_cast<std::size_t>(room));
  const Oid name = {1, 3};
  std::uint8_t* end = BuildVarOp(buffer.data(), name.data(), name.size(), value, &room);
  if (end == nullptr) return {};
  buffer.resize(static_cast<std::size_t>(end - buffer.data()));
  return Bytes(buffer.begin() + 7, buffer.end());  // behind 30 82 hi lo 06 01 2B
}

// One binding as ParseVarOp reads it; end is where it left off, nullptr when it refused.
struct ParsedBinding {
  Oid name = Oid(kMaxOidLength);
  std::size_t nameLength = kMaxOidLength, valueLength = 0;
  std::uint8_t type = 0;
  const std::uint8_t* value = nullptr;
  std::int32_t remaining = 0;
  const std::uint8_t* end = nullptr;
};

ParsedBinding Parse(const Bytes& binding) {
  ParsedBinding parsed;
  parsed.remaining = static_cast<std::int32_t>(binding.size());
  parsed.end = ParseVarOp(binding.data(), parsed.name.data(), &parsed.nameLength, &parsed.type,
                          &parsed.valueLength, &parsed.value, &parsed.remaining);
  parsed.name.resize(parsed.end ? parsed.nameLength : 0);
  return parsed;
}

// Parses one binding and decodes its value; a value of type 0xFF says that either failed.
VarValue Decode(const Bytes& binding, Oid* name = nullptr) {
  ParsedBinding parsed = Parse(binding);
  VarValue out = VarValue::Empty(0xFF);
  if (parsed.end == nullptr || parsed.remaining != 0) return out;
  std::int32_t contentsLength =
      static_cast<std::int32_t>(binding.data() + binding.size() - parsed.value);
  std::uint8_t type = 0;
  const std::uint8_t* contents = AsnParseHeader(parsed.value, &contentsLength, &type);
  if (contents == nullptr || !DecodeAsnSyntaxValue(type, contents, parsed.valueLength, &out))
    return VarValue::Empty(0xFF);
  if (name != nullptr) *name = parsed.name;
  return out;
}

// Hand-written TLV (contents below 256 octets), so inputs do not depend on the builder.
Bytes Tlv(std::uint8_t type, const Bytes& contents) {
  Bytes out = {type};
  if (contents.size() >= 0x80) out.push_back(0x81);
  out.push_back(static_cast<std::uint8_t>(contents.size()));
  out.insert(out.end(), contents.begin(), contents.end());
  return out;
}

Bytes Binding(Bytes name, const Bytes& value) {
  name.insert(name.end(), value.begin(), value.end());
  return Tlv(kAsnSequence, name);
}

TEST(BerTest, ValuesEncodeToTheseOctetsAndDecodeBack) {
  struct Case {
    VarValue value;
    Bytes octets;
  };
  const Case cases[] = {
      {VarValue::Integer(127), {0x02, 0x01, 0x7F}},
      {VarValue::Integer(128), {0x02, 0x02, 0x00, 0x80}},
      {VarValue::Integer(-1), {0x02, 0x01, 0xFF}},
      {VarValue::Integer(-129), {0x02, 0x02, 0xFF, 0x7F}},
      {VarValue::Integer(INT32_MIN), {0x02, 0x04, 0x80, 0x00, 0x00, 0x00}},
      {VarValue::Unsigned(kAsnGauge, 0xFFFFFFFF), {0x42, 0x05, 0x00, 0xFF, 0xFF, 0xFF, 0xFF}},
      {VarValue::Unsigned(kAsnTimeTicks, 0x8000), {0x43, 0x03, 0x00, 0x80, 0x00}},
      {VarValue::Unsigned(kAsnUInteger32, 0x7FFFFFFF), {0x47, 0x04, 0x7F, 0xFF, 0xFF, 0xFF}},
      {VarValue::Unsigned(kAsnCounter64, 1ull << 63),
       {0x46, 0x09, 0x00, 0x80, 0, 0, 0, 0, 0, 0, 0}},
      {VarValue::Unsigned(kAsnCounter64, 0x0100000000ull), {0x46, 0x05, 0x01, 0, 0, 0, 0}},
      {VarValue::ObjectId({1, 3, 6, 1}), {0x06, 0x03, 0x2B, 0x06, 0x01}},
      {VarValue::ObjectId({1, 3, 128, 0xFFFFFFFF}),
       {0x06, 0x08, 0x2B, 0x81, 0x00, 0x8F, 0xFF, 0xFF, 0xFF, 0x7F}},
      {VarValue::ObjectId({2, 100}), {0x06, 0x02, 0x81, 0x34}},
      {VarValue::Octets(kAsnOctetString, ""), {0x04, 0x00}},
      {VarValue::Octets(kAsnOctetString, "ab"), {0x04, 0x02, 'a', 'b'}},
      {VarValue::Octets(kAsnIpAddress, std::string("\x0A\x00\x00\x01", 4)),
       {0x40, 0x04, 0x0A, 0x00, 0x00, 0x01}},
      {VarValue::Octets(kAsnNsapAddress, "y"), {0x45, 0x01, 'y'}},
      {VarValue::Octets(kAsnBitString, std::string("\x07\x80", 2)), {0x03, 0x02, 0x07, 0x80}},
      {VarValue::Empty(kAsnNull), {0x05, 0x00}},
      {VarValue::Empty(kNoSuchObject), {0x80, 0x00}},
      {VarValue::Empty(kNoSuchInstance), {0x81, 0x00}},
      {VarValue::Empty(kEndOfMibView), {0x82, 0x00}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.octets));
    EXPECT_EQ(Encode(c.value), c.octets);
    Oid name;
    EXPECT_EQ(Decode(Binding({0x06, 0x01, 0x2B}, c.octets), &name), c.value);
    EXPECT_EQ(name, (Oid{1, 3}));
  }
}

TEST(BerTest, BuildRefusesWhatItCannotEncodeOrFit) {
  EXPECT_TRUE(Encode(VarValue::Empty(0x01)).empty());                    // unknown type
  EXPECT_TRUE(Encode(VarValue::Octets(kAsnBitString, "")).empty());      // no unused-bits octet
  EXPECT_TRUE(Encode(VarValue::Octets(kAsnBitString, "\x08")).empty());  // 8 unused bits
  EXPECT_TRUE(Encode(VarValue::ObjectId(Oid(kMaxOidLength + 1, 1))).empty());
  EXPECT_TRUE(Encode(VarValue::ObjectId({0xFFFFFFFF, 0})).empty());  // first two arcs overflow
  EXPECT_EQ(Encode(VarValue::ObjectId(Oid(kMaxOidLength, 1)), 200).size(), 2u + 127u);
  const Bytes whole = {0x30, 0x82, 0x00, 0x07, 0x06, 0x01, 0x2B, 0x02, 0x02, 0x00, 0x80};
  for (std::int32_t room = 0; room <= 11; ++room) {
    Bytes buffer(static_cast<std::size_t>(room) + 1, 0xEE);  // one guard octet behind the room
    std::int32_t remaining = room;
    const Oid name = {1, 3};
    std::uint8_t* end =
        BuildVarOp(buffer.data(), name.data(), 2, VarValue::Integer(128), &remaining);
    EXPECT_EQ(buffer.back(), 0xEE) << room;
    EXPECT_EQ(end != nullptr, room == 11) << room;
    if (end != nullptr) {
      EXPECT_EQ(Bytes(buffer.begin(), buffer.end() - 1), whole);
    }
  }
}

TEST(BerTest, LengthsAndHeaders) {
  std::uint8_t buffer[8];
  std::int32_t remaining = 8;
  ASSERT_NE(AsnBuildSequence(buffer, &remaining, kAsnSequence, 5), nullptr);
  EXPECT_EQ(Bytes(buffer, buffer + 4), (Bytes{0x30, 0x82, 0x00, 0x05}));
  remaining = 3;
  EXPECT_EQ(AsnBuildSequence(buffer, &remaining, kAsnSequence, 5), nullptr);
  EXPECT_EQ(remaining, 3);
  for (std::size_t length : {0x7Full, 0x80ull, 0xFFull, 0x100ull, 0xFFFFull}) {
    remaining = 8;
    std::uint8_t* end = AsnBuildLength(buffer, &remaining, length);
    ASSERT_NE(end, nullptr);
    std::uint32_t parsed = 0;
    EXPECT_EQ(AsnParseLength(buffer, static_cast<std::int32_t>(end - buffer), &parsed), end);
    EXPECT_EQ(parsed, length);
  }
  for (auto [room, length] : {std::pair{8, 0x10000ull}, std::pair{2, 0x100ull}}) {
    remaining = room;
    EXPECT_EQ(AsnBuildLength(buffer, &remaining, length), nullptr) << length;
  }
  // Length octets: the four-octet form, cut off, indefinite, too many, above 31 bits.
  std::uint32_t length = 0;
  const Bytes four = {0x84, 0x00, 0x00, 0x01, 0x02};
  EXPECT_EQ(AsnParseLength(four.data(), 5, &length), four.data() + 5);
  EXPECT_EQ(length, 0x102u);
  for (Bytes bad : {Bytes{0x84, 0, 0, 1}, Bytes{0x80, 0x00}, Bytes{0x85, 0, 0, 0, 0, 1},
                    Bytes{0x84, 0x80, 0, 0, 0}})
    EXPECT_EQ(AsnParseLength(bad.data(), static_cast<std::int32_t>(bad.size()), &length), nullptr);

  // Multi-octet identifiers, and headers cut off or with contents past the end.
  const Bytes header = {0x04, 0x02, 'a', 'b'};
  std::uint8_t type = 0;
  for (auto [bytes, room] :
       {std::pair{Bytes{0x1F, 0x01, 0x00}, 3}, std::pair{Bytes{0x3F, 1, 0}, 3},
        std::pair{header, -1}, std::pair{header, 0}, std::pair{header, 1}, std::pair{header, 3}}) {
    remaining = room;
    EXPECT_EQ(AsnParseHeader(bytes.data(), &remaining, &type), nullptr) << room;
  }
  remaining = 4;
  EXPECT_EQ(AsnParseHeader(header.data(), &remaining, &type), header.data() + 2);
  EXPECT_EQ(remaining, 2);
}

TEST(BerTest, IntegerParsersBoundTheirContents) {
  std::uint8_t type = 0;
  std::int32_t value = 0;
  std::uint32_t unsignedValue = 0;
  const Bytes five = {0x02, 0x05, 0x00, 0xFF, 0xFF, 0xFF, 0xFF};
  std::int32_t remaining = 7;
  EXPECT_EQ(AsnParseInt(five.data(), &remaining, &type, &value), nullptr);
  remaining = 7;
  EXPECT_EQ(AsnParseUnsignedInt(five.data(), &remaining, &type, &unsignedValue), five.data() + 7);
  EXPECT_EQ(unsignedValue, 0xFFFFFFFFu);
  EXPECT_EQ(remaining, 0);
  const Bytes fiveNonZero = {0x41, 0x05, 0x01, 0x00, 0x00, 0x00, 0x00};
  remaining = 7;
  EXPECT_EQ(AsnParseUnsignedInt(fiveNonZero.data(), &remaining, &type, &unsignedValue), nullptr);
  const Bytes negative = {0x02, 0x02, 0xFF, 0x7F, 0xAA};
  remaining = 5;
  EXPECT_EQ(AsnParseInt(negative.data(), &remaining, &type, &value), negative.data() + 4);
  EXPECT_EQ(value, -129);
  EXPECT_EQ(remaining, 1);

  VarValue out;
  const std::uint8_t contents[] = {0x01, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00};
  EXPECT_FALSE(DecodeAsnSyntaxValue(kAsnInteger, contents + 1, 5, &out));  // not 32 bits
  EXPECT_FALSE(DecodeAsnSyntaxValue(kAsnGauge, contents, 5, &out));
  EXPECT_FALSE(DecodeAsnSyntaxValue(kAsnCounter64, contents, 9, &out));
  EXPECT_TRUE(DecodeAsnSyntaxValue(kAsnCounter64, contents, 8, &out));
  EXPECT_EQ(out.number, 1ull << 56);
}

TEST(BerTest, ObjectIdentifierLimits) {
  auto encodedOid = [](std::size_t arcs, Bytes last) {
    Bytes contents = {0x2B};
    contents.insert(contents.end(), arcs - 3, 0x01);
    contents.insert(contents.end(), last.begin(), last.end());
    return contents;
  };
  VarValue out;
  const Bytes longest = encodedOid(kMaxOidLength, {0x05});
  ASSERT_TRUE(DecodeAsnSyntaxValue(kAsnObjectId, longest.data(), longest.size(), &out));
  EXPECT_EQ(out.oid.size(), kMaxOidLength);
  const Bytes tooLong = encodedOid(kMaxOidLength + 1, {0x05});
  EXPECT_FALSE(DecodeAsnSyntaxValue(kAsnObjectId, tooLong.data(), tooLong.size(), &out));
  const Bytes subIdTooLarge = encodedOid(4, {0x90, 0x80, 0x80, 0x80, 0x00});  // 2^32
  EXPECT_FALSE(
      DecodeAsnSyntaxValue(kAsnObjectId, subIdTooLarge.data(), subIdTooLarge.size(), &out));
  const Bytes unfinished = encodedOid(4, {0x81});
  EXPECT_FALSE(DecodeAsnSyntaxValue(kAsnObjectId, unfinished.data(), unfinished.size(), &out));

  // The longest name through the binding parser, and a name buffer smaller than the name.
  Oid parsed;
  EXPECT_EQ(Decode(Binding(Tlv(kAsnObjectId, longest), {0x05, 0x00}), &parsed).type, kAsnNull);
  EXPECT_EQ(parsed.size(), kMaxOidLength);
  std::uint32_t ids[3];
  std::size_t count = 3;
  const Bytes fourArcs = {0x06, 0x03, 0x2B, 0x06, 0x01};
  std::int32_t remaining = 5;
  std::uint8_t type = 0;
  EXPECT_EQ(AsnParseObjid(fourArcs.data(), &remaining, &type, ids, &count), nullptr);
  EXPECT_EQ(Encode(VarValue::ObjectId({1})), (Bytes{0x06, 0x01, 0x00}));
}

TEST(BerTest, TruncatedBindingsAreRefused) {
  const Bytes whole = Binding({0x06, 0x03, 0x2B, 0x06, 0x01}, {0x04, 0x03, 'a', 'b', 'c'});
  ASSERT_EQ(Decode(whole), VarValue::Octets(kAsnOctetString, "abc"));
  for (std::size_t cut = 0; cut < whole.size(); ++cut)
    EXPECT_EQ(Decode(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(cut))).type,
              0xFF)
        << cut;
  // The value may not run past its binding even when the message goes on behind it.
  Bytes overrun = whole;
  overrun[1] = static_cast<std::uint8_t>(overrun[1] - 1);
  EXPECT_EQ(Parse(overrun).end, nullptr);
  EXPECT_EQ(Decode(Binding({0x04, 0x01, 0x2B}, {0x05, 0x00})).type, 0xFF);  // name is not an OID
  Bytes notSequence = whole;
  notSequence[0] = 0x31;
  EXPECT_EQ(Decode(notSequence).type, 0xFF);
}

}  // namespace
}  // namespace tessel
