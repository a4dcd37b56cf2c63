#include "snmp/ber.h"

#include <algorithm>
#include <array>
#include <cstring>

#include "engine/log.h"

namespace tessel {
namespace {

constexpr std::uint64_t kMaxSubId = 0xFFFFFFFFu;
constexpr std::size_t kMaxBuiltLength = 0xFFFF;  // the engine's buffers are smaller than this

// True when `need` octets fit in a remaining counter (a negative counter holds nothing).
bool Fits(const std::int32_t* remaining, std::uint64_t need) {
  return remaining != nullptr && *remaining >= 0 && need <= static_cast<std::uint64_t>(*remaining);
}

void Consume(std::int32_t* remaining, std::uint64_t octets) {
  *remaining = static_cast<std::int32_t>(static_cast<std::uint64_t>(*remaining) - octets);
}

// One complete TLV at the cursor whose contents fit the remaining octets.
struct Tlv {
  const std::uint8_t* contents = nullptr;
  std::size_t length = 0;  // contents octets
  std::size_t total = 0;   // identifier, length and contents octets
};

bool ReadTlv(const std::uint8_t* data, const std::int32_t* remaining, std::uint8_t* type,
             Tlv* tlv) {
  if (remaining == nullptr) return false;
  std::int32_t contentsLength = *remaining;
  tlv->contents = AsnParseHeader(data, &contentsLength, type);
  if (tlv->contents == nullptr) return false;
  tlv->length = static_cast<std::size_t>(contentsLength);
  tlv->total = static_cast<std::size_t>(tlv->contents - data) + tlv->length;
  return true;
}

// Accepts the TLV: takes it off the remaining count and returns the cursor behind it.
const std::uint8_t* Behind(const std::uint8_t* data, std::int32_t* remaining, const Tlv& tlv) {
  Consume(remaining, tlv.total);
  return data + tlv.total;
}

// Copies one TLV's contents into a buffer whose capacity is *length; *length becomes the
// contents length.
bool CopyContents(const std::uint8_t* data, const std::int32_t* remaining, std::uint8_t* type,
                  std::uint8_t* buffer, std::size_t* length, const char* what, Tlv* tlv) {
  if (!ReadTlv(data, remaining, type, tlv)) {
    LOG_ERROR("overflow of message\n");
    return false;
  }
  if (tlv->length > *length) {
    LOG_ERROR("I don't support such long %s\n", what);
    return false;
  }
  if (tlv->length > 0) std::memcpy(buffer, tlv->contents, tlv->length);
  *length = tlv->length;
  return true;
}

// Shifts big-endian contents into 64 bits, starting from all ones when `signExtend` and the
// first octet is negative. The caller has bounded the length to fit.
std::uint64_t ShiftIn(const std::uint8_t* contents, std::size_t length, bool signExtend) {
  std::uint64_t value =
      (signExtend && length > 0 && (contents[0] & 0x80) != 0) ? ~std::uint64_t{0} : 0;
  for (std::size_t i = 0; i < length; ++i) value = (value << 8) | contents[i];
  return value;
}

// An unsigned value of `width` octets may carry one leading 0x00 in front of them.
bool UnsignedFits(const std::uint8_t* contents, std::size_t length, std::size_t width) {
  return length <= width || (length == width + 1 && contents[0] == 0x00);
}

// A 32-bit INTEGER-like TLV as two's-complement bits. An unsigned value may carry a leading
// 0x00 as a fifth octet; shorter contents with the top bit set are sign-extended, as peers that
// send them intend.
const std::uint8_t* ParseInteger(const std::uint8_t* data, std::int32_t* remaining,
                                 std::uint8_t* type, bool isUnsigned, std::uint32_t* bits) {
  Tlv tlv;
  if (!ReadTlv(data, remaining, type, &tlv)) {
    LOG_ERROR("bad length\n");
    return nullptr;
  }
  if (isUnsigned ? !UnsignedFits(tlv.contents, tlv.length, 4) : tlv.length > 4) {
    LOG_ERROR("I don't support such large integers\n");
    return nullptr;
  }
  *bits = static_cast<std::uint32_t>(ShiftIn(tlv.contents, tlv.length, true));
  return Behind(data, remaining, tlv);
}

// Reads the base-128 sub-identifiers of OBJECT IDENTIFIER contents; the first value is split
// into the first two arcs. Empty contents read as 0.0, which a peer that sends 06 00 means.
bool DecodeSubIds(const std::uint8_t* contents, std::size_t length, std::uint32_t* ids,
                  std::size_t capacity, std::size_t* count) {
  capacity = std::min(capacity, kMaxOidLength);
  if (ids == nullptr || capacity < 2) return false;
  ids[0] = ids[1] = 0;
  std::size_t stored = 2;
  bool first = true;
  std::uint64_t value = 0;
  for (std::size_t i = 0; i < length; ++i) {
    value = (value << 7) | (contents[i] & 0x7Fu);
    if (value > kMaxSubId) return false;
    if ((contents[i] & 0x80) != 0) continue;
    if (first) {
      // X.690: arcs 0 and 1 take 40 values each; arc 2 takes everything above 79.
      ids[0] = static_cast<std::uint32_t>(std::min<std::uint64_t>(value / 40, 2));
      ids[1] = static_cast<std::uint32_t>(value - std::uint64_t{ids[0]} * 40);
      first = false;
    } else {
      if (stored >= capacity) return false;
      ids[stored++] = static_cast<std::uint32_t>(value);
    }
    value = 0;
  }
  if (length > 0 && (contents[length - 1] & 0x80) != 0) return false;
  *count = stored;
  return true;
}

// The fewest two's-complement octets of a value held as nine octets big-endian (the leading
// one carries the sign, so every unsigned 64-bit value has room for its 0x00).
std::size_t Shorten(const std::array<std::uint8_t, 9>& octets) {
  std::size_t start = 0;
  while (start + 1 < octets.size()) {
    bool redundantZero = octets[start] == 0x00 && (octets[start + 1] & 0x80) == 0;
    bool redundantOnes = octets[start] == 0xFF && (octets[start + 1] & 0x80) != 0;
    if (!redundantZero && !redundantOnes) break;
    ++start;
  }
  return start;
}

std::uint8_t* BuildInteger(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                           std::uint64_t value, bool negative) {
  std::array<std::uint8_t, 9> octets{};
  octets[0] = negative ? 0xFF : 0x00;
  for (std::size_t i = 0; i < 8; ++i) octets[8 - i] = static_cast<std::uint8_t>(value >> (8 * i));
  std::size_t start = Shorten(octets);
  return AsnBuildString(data, remaining, type, octets.data() + start, octets.size() - start);
}

std::size_t SubIdOctets(std::uint32_t value) {
  std::size_t octets = 1;
  while (octets < 5 && value >= (std::uint32_t{1} << (7 * octets))) ++octets;
  return octets;
}

std::uint8_t* PutSubId(std::uint8_t* out, std::uint32_t value) {
  for (std::size_t i = SubIdOctets(value); i > 0; --i) {
    std::uint8_t septet = static_cast<std::uint8_t>((value >> (7 * (i - 1))) & 0x7F);
    *out++ = i > 1 ? static_cast<std::uint8_t>(septet | 0x80) : septet;
  }
  return out;
}

std::uint8_t* BuildValue(std::uint8_t* data, std::int32_t* remaining, const VarValue& value) {
  const auto* octets = reinterpret_cast<const std::uint8_t*>(value.octets.data());
  switch (value.type) {
    case kAsnInteger:
      return AsnBuildInt(data, remaining, value.type, value.AsInt32());
    case kAsnCounter:
    case kAsnGauge:
    case kAsnTimeTicks:
    case kAsnUInteger32:
      return AsnBuildUnsignedInt(data, remaining, value.type,
                                 static_cast<std::uint32_t>(value.number));
    case kAsnCounter64:
      return AsnBuildUnsignedInt64(data, remaining, value.type, value.number);
    case kAsnOctetString:
    case kAsnIpAddress:
    case kAsnOpaque:
    case kAsnNsapAddress:
      return AsnBuildString(data, remaining, value.type, octets, value.octets.size());
    case kAsnObjectId:
      return AsnBuildObjid(data, remaining, value.type, value.oid.data(), value.oid.size());
    case kAsnBitString:
      return AsnBuildBitString(data, remaining, value.type, octets, value.octets.size());
    case kAsnNull:
    case kNoSuchObject:
    case kNoSuchInstance:
    case kEndOfMibView:
      return AsnBuildNull(data, remaining, value.type);
    default:
      LOG_ERROR("wrong type %d\n", value.type);
      return nullptr;
  }
}

}  // namespace

const std::uint8_t* AsnParseLength(const std::uint8_t* data, std::int32_t available,
                                   std::uint32_t* length) {
  if (data == nullptr || available < 1) return nullptr;
  if ((data[0] & 0x80) == 0) {
    *length = data[0];
    return data + 1;
  }
  std::size_t octets = data[0] & 0x7Fu;
  if (octets == 0) {
    LOG_ERROR("We don't support indefinite lengths\n");
    return nullptr;
  }
  if (octets > 4) {
    LOG_ERROR("we can't support data lengths that long\n");
    return nullptr;
  }
  if (octets >= static_cast<std::size_t>(available)) return nullptr;
  std::uint64_t value = ShiftIn(data + 1, octets, false);
  if (value > INT32_MAX) {  // no remaining counter can hold it
    LOG_ERROR("we can't support data lengths that long\n");
    return nullptr;
  }
  *length = static_cast<std::uint32_t>(value);
  return data + 1 + octets;
}

const std::uint8_t* AsnParseHeader(const std::uint8_t* data, std::int32_t* remaining,
                                   std::uint8_t* type) {
  if (data == nullptr || remaining == nullptr || *remaining < 2) return nullptr;
  if ((data[0] & 0x1F) == 0x1F) {
    LOG_ERROR("can't process ID >= 30\n");
    return nullptr;
  }
  std::uint32_t length = 0;
  const std::uint8_t* contents = AsnParseLength(data + 1, *remaining - 1, &length);
  if (contents == nullptr) return nullptr;
  if (!Fits(remaining, static_cast<std::uint64_t>(contents - data) + length)) {
    LOG_ERROR("asn length too long\n");
    return nullptr;
  }
  *type = data[0];
  *remaining = static_cast<std::int32_t>(length);
  return contents;
}

const std::uint8_t* AsnParseInt(const std::uint8_t* data, std::int32_t* remaining,
                                std::uint8_t* type, std::int32_t* value) {
  std::uint32_t bits = 0;
  const std::uint8_t* behind = ParseInteger(data, remaining, type, false, &bits);
  if (behind != nullptr) *value = static_cast<std::int32_t>(bits);
  return behind;
}

const std::uint8_t* AsnParseUnsignedInt(const std::uint8_t* data, std::int32_t* remaining,
                                        std::uint8_t* type, std::uint32_t* value) {
  return ParseInteger(data, remaining, type, true, value);
}

const std::uint8_t* AsnParseString(const std::uint8_t* data, std::int32_t* remaining,
                                   std::uint8_t* type, std::uint8_t* buffer, std::size_t* length) {
  Tlv tlv;
  if (!CopyContents(data, remaining, type, buffer, length, "strings", &tlv)) return nullptr;
  return Behind(data, remaining, tlv);
}

const std::uint8_t* AsnParseBitString(const std::uint8_t* data, std::int32_t* remaining,
                                      std::uint8_t* type, std::uint8_t* buffer,
                                      std::size_t* length) {
  Tlv tlv;
  if (!CopyContents(data, remaining, type, buffer, length, "bitstrings", &tlv)) return nullptr;
  if (tlv.length == 0 || buffer[0] >= 8) {
    LOG_ERROR("Invalid bitstring\n");
    return nullptr;
  }
  return Behind(data, remaining, tlv);
}

const std::uint8_t* AsnParseObjid(const std::uint8_t* data, std::int32_t* remaining,
                                  std::uint8_t* type, std::uint32_t* ids, std::size_t* count) {
  Tlv tlv;
  if (!ReadTlv(data, remaining, type, &tlv)) return nullptr;
  if (!DecodeSubIds(tlv.contents, tlv.length, ids, *count, count)) {
    LOG_ERROR("malformed or too long object identifier\n");
    return nullptr;
  }
  return Behind(data, remaining, tlv);
}

const std::uint8_t* AsnParseNull(const std::uint8_t* data, std::int32_t* remaining,
                                 std::uint8_t* type) {
  Tlv tlv;
  if (!ReadTlv(data, remaining, type, &tlv)) return nullptr;
  if (tlv.length != 0) {
    LOG_ERROR("Malformed NULL\n");
    return nullptr;
  }
  return Behind(data, remaining, tlv);
}

const std::uint8_t* ParseVarOp(const std::uint8_t* data, std::uint32_t* name,
                               std::size_t* nameLength, std::uint8_t* valueType,
                               std::size_t* valueLength, const std::uint8_t** value,
                               std::int32_t* remaining) {
  std::uint8_t type = 0;
  Tlv binding;
  if (!ReadTlv(data, remaining, &type, &binding)) {
    LOG_ERROR("No header for variable\n");
    return nullptr;
  }
  if (type != kAsnSequence) return nullptr;
  // Name and value must lie inside the binding's own SEQUENCE.
  std::int32_t inside = static_cast<std::int32_t>(binding.length);
  const std::uint8_t* cursor = AsnParseObjid(binding.contents, &inside, &type, name, nameLength);
  if (cursor == nullptr || type != kAsnObjectId) {
    LOG_ERROR("No OID for variable\n");
    return nullptr;
  }
  Tlv contents;
  if (!ReadTlv(cursor, &inside, valueType, &contents)) {
    LOG_ERROR("No header for value\n");
    return nullptr;
  }
  *valueLength = contents.length;
  *value = cursor;
  return Behind(data, remaining, binding);
}

bool DecodeAsnSyntaxValue(std::uint8_t type, const std::uint8_t* contents, std::size_t length,
                          VarValue* out) {
  if (length > 0 && contents == nullptr) return false;
  switch (type) {
    case kAsnInteger:
      // Longer contents cannot be a 32-bit INTEGER; the message is taken as malformed.
      if (length > 4) return false;
      *out = VarValue::Integer(
          static_cast<std::int32_t>(static_cast<std::uint32_t>(ShiftIn(contents, length, true))));
      return true;
    case kAsnCounter:
    case kAsnGauge:
    case kAsnTimeTicks:
    case kAsnUInteger32:
      if (!UnsignedFits(contents, length, 4)) return false;
      *out = VarValue::Unsigned(type, ShiftIn(contents, length, false));
      return true;
    case kAsnCounter64:
      if (!UnsignedFits(contents, length, 8)) return false;
      *out = VarValue::Unsigned(type, ShiftIn(contents, length, false));
      return true;
    case kAsnObjectId: {
      Oid oid(kMaxOidLength);
      std::size_t count = 0;
      if (!DecodeSubIds(contents, length, oid.data(), oid.size(), &count)) return false;
      oid.resize(count);
      *out = VarValue::ObjectId(std::move(oid));
      return true;
    }
    case kAsnNull:
    case kNoSuchObject:
    case kNoSuchInstance:
    case kEndOfMibView:
      *out = VarValue::Empty(type);
      return true;
    default:
      *out = VarValue::Octets(type, std::string(reinterpret_cast<const char*>(contents), length));
      return true;
  }
}

std::uint8_t* AsnBuildLength(std::uint8_t* data, std::int32_t* remaining, std::size_t length) {
  std::size_t octets = length < 0x80 ? 1 : length <= 0xFF ? 2 : 3;
  if (data == nullptr || length > kMaxBuiltLength || !Fits(remaining, octets)) {
    LOG_ERROR("build_length\n");
    return nullptr;
  }
  if (octets == 1) {
    data[0] = static_cast<std::uint8_t>(length);
  } else if (octets == 2) {
    data[0] = 0x81;
    data[1] = static_cast<std::uint8_t>(length);
  } else {
    data[0] = 0x82;
    data[1] = static_cast<std::uint8_t>(length >> 8);
    data[2] = static_cast<std::uint8_t>(length);
  }
  Consume(remaining, octets);
  return data + octets;
}

std::uint8_t* AsnBuildHeader(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                             std::size_t length) {
  if (data == nullptr || !Fits(remaining, 1)) return nullptr;
  data[0] = type;
  Consume(remaining, 1);
  return AsnBuildLength(data + 1, remaining, length);
}

std::uint8_t* AsnBuildSequence(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                               std::size_t length) {
  if (data == nullptr || length > kMaxBuiltLength || !Fits(remaining, 4)) return nullptr;
  data[0] = type;
  data[1] = 0x82;
  data[2] = static_cast<std::uint8_t>(length >> 8);
  data[3] = static_cast<std::uint8_t>(length);
  Consume(remaining, 4);
  return data + 4;
}

std::uint8_t* AsnBuildInt(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                          std::int32_t value) {
  return BuildInteger(data, remaining, type,
                      static_cast<std::uint64_t>(static_cast<std::int64_t>(value)), value < 0);
}

std::uint8_t* AsnBuildUnsignedInt(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                                  std::uint32_t value) {
  return BuildInteger(data, remaining, type, value, false);
}

std::uint8_t* AsnBuildUnsignedInt64(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                                    std::uint64_t value) {
  return BuildInteger(data, remaining, type, value, false);
}

std::uint8_t* AsnBuildString(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                             const std::uint8_t* octets, std::size_t length) {
  if (length > 0 && octets == nullptr) return nullptr;
  std::uint8_t* contents = AsnBuildHeader(data, remaining, type, length);
  if (contents == nullptr || !Fits(remaining, length)) return nullptr;
  if (length > 0) std::memcpy(contents, octets, length);
  Consume(remaining, length);
  return contents + length;
}

std::uint8_t* AsnBuildBitString(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                                const std::uint8_t* octets, std::size_t length) {
  if (length == 0 || octets == nullptr || octets[0] >= 8) {
    LOG_ERROR("Building invalid bitstring\n");
    return nullptr;
  }
  return AsnBuildString(data, remaining, type, octets, length);
}

std::uint8_t* AsnBuildObjid(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                            const std::uint32_t* ids, std::size_t count) {
  if (count > kMaxOidLength || (count > 0 && ids == nullptr)) return nullptr;
  // Fewer than two arcs are sent as 0.0, the shortest OID the encoding can carry.
  std::uint64_t head = count < 2 ? 0 : std::uint64_t{ids[0]} * 40 + ids[1];
  if (head > kMaxSubId) return nullptr;
  std::size_t length = SubIdOctets(static_cast<std::uint32_t>(head));
  for (std::size_t i = 2; i < count; ++i) length += SubIdOctets(ids[i]);
  std::uint8_t* out = AsnBuildHeader(data, remaining, type, length);
  if (out == nullptr || !Fits(remaining, length)) return nullptr;
  out = PutSubId(out, static_cast<std::uint32_t>(head));
  for (std::size_t i = 2; i < count; ++i) out = PutSubId(out, ids[i]);
  Consume(remaining, length);
  return out;
}

std::uint8_t* AsnBuildNull(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type) {
  return AsnBuildHeader(data, remaining, type, 0);
}

std::uint8_t* BuildVarOp(std::uint8_t* data, const std::uint32_t* name, std::size_t nameLength,
                         const VarValue& value, std::int32_t* remaining) {
  // The SEQUENCE header's four octets are reserved now and filled once the length is known.
  std::int32_t headerRoom = 4;
  if (data == nullptr || !Fits(remaining, 4)) return nullptr;
  std::int32_t inside = *remaining - 4;
  std::uint8_t* cursor = AsnBuildObjid(data + 4, &inside, kAsnObjectId, name, nameLength);
  if (cursor == nullptr) {
    LOG_ERROR("Can't build OID for variable\n");
    return nullptr;
  }
  cursor = BuildValue(cursor, &inside, value);
  if (cursor == nullptr) {
    LOG_ERROR("Can't build value\n");
    return nullptr;
  }
  std::size_t contentsLength = static_cast<std::size_t>(cursor - (data + 4));
  if (AsnBuildSequence(data, &headerRoom, kAsnSequence, contentsLength) == nullptr) return nullptr;
  *remaining = inside;
  return cursor;
}

}  // namespace tessel
