// Feeds arbitrary octets to every BER parse primitive and the variable-binding parser, and
// checks that each binding that decodes is rebuilt into octets that decode to the same name
// and value.
#include "snmp/ber.h"

#include <algorithm>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <vector>

namespace tessel {
namespace {

void ParseEachPrimitive(const std::uint8_t* data, std::int32_t size) {
  std::int32_t remaining = size;
  auto all = [&] { return &(remaining = size); };  // each parse starts on the whole input
  std::uint8_t type = 0, buffer[64];
  std::int32_t signedValue = 0;
  std::uint32_t length = 0, unsignedValue = 0, ids[kMaxOidLength];
  std::size_t capacity = sizeof buffer, count = 16;  // a small capacity exercises the overflow path
  AsnParseHeader(data, all(), &type);
  AsnParseLength(data, size, &length);
  AsnParseInt(data, all(), &type, &signedValue);
  AsnParseUnsignedInt(data, all(), &type, &unsignedValue);
  AsnParseString(data, all(), &type, buffer, &capacity);
  capacity = sizeof buffer;
  AsnParseBitString(data, all(), &type, buffer, &capacity);
  AsnParseObjid(data, all(), &type, ids, &count);
  AsnParseNull(data, all(), &type);
}

struct Decoded {
  Oid name;
  VarValue value;
};

// One binding at the cursor, its value decoded; false when either step refuses it.
bool ParseBinding(const std::uint8_t** cursor, std::int32_t* remaining, Decoded* out) {
  const std::uint8_t* start = *cursor;
  std::vector<std::uint32_t> ids(kMaxOidLength);
  std::size_t count = ids.size(), valueLength = 0;
  std::uint8_t type = 0;
  const std::uint8_t* value = nullptr;
  std::int32_t before = *remaining;
  *cursor = ParseVarOp(start, ids.data(), &count, &type, &valueLength, &value, remaining);
  if (*cursor == nullptr) return false;
  if (*remaining < 0 || *remaining >= before || *cursor != start + (before - *remaining)) abort();
  std::int32_t contentsLength = static_cast<std::int32_t>(*cursor - value);
  const std::uint8_t* contents = AsnParseHeader(value, &contentsLength, &type);
  if (contents == nullptr || static_cast<std::size_t>(contentsLength) != valueLength) abort();
  ids.resize(count);
  out->name = ids;
  return DecodeAsnSyntaxValue(type, contents, valueLength, &out->value);
}

void CheckRoundTrip(const Decoded& decoded) {
  std::uint8_t buffer[1024];
  std::int32_t remaining = sizeof buffer;
  std::uint8_t* end =
      BuildVarOp(buffer, decoded.name.data(), decoded.name.size(), decoded.value, &remaining);
  if (end == nullptr) return;  // types the builder refuses (unknown, invalid bit strings)
  if (end - buffer + remaining != static_cast<std::int32_t>(sizeof buffer)) abort();
  const std::uint8_t* cursor = buffer;
  std::int32_t built = static_cast<std::int32_t>(end - buffer);
  Decoded again;
  if (!ParseBinding(&cursor, &built, &again) || built != 0) {
    std::fprintf(stderr, "rebuilt binding does not parse\n");
    abort();
  }
  if (again.name != decoded.name || !(again.value == decoded.value)) {
    std::fprintf(stderr, "rebuilt binding decodes to another name or value\n");
    abort();
  }
}

}  // namespace
}  // namespace tessel

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  std::int32_t remaining = static_cast<std::int32_t>(std::min<std::size_t>(size, INT32_MAX));
  tessel::ParseEachPrimitive(data, remaining);
  const std::uint8_t* cursor = data;
  while (cursor != nullptr && remaining > 0) {
    tessel::Decoded decoded;
    if (tessel::ParseBinding(&cursor, &remaining, &decoded)) tessel::CheckRoundTrip(decoded);
  }
  return 0;
}
