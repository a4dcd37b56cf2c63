// The few BER pieces the load generator's codecs share: definite-length TLVs, minimal INTEGERs,
// OBJECT IDENTIFIERs, and a bounds-checked reader. Stateless.
#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <vector>

namespace tessel::bench::ber {

using Bytes = std::vector<std::uint8_t>;

inline constexpr std::uint8_t kInteger = 0x02;
inline constexpr std::uint8_t kOctetString = 0x04;
inline constexpr std::uint8_t kObjectIdentifier = 0x06;
inline constexpr std::uint8_t kSequence = 0x30;

Bytes Tlv(std::uint8_t type, const Bytes& contents);
Bytes Integer(std::int64_t value);  // minimal two's complement contents
Bytes OctetString(const std::uint8_t* data, std::size_t length);
inline Bytes OctetString(const Bytes& contents) { return Tlv(kOctetString, contents); }
// False when the OID has fewer than two sub-identifiers or an impossible first pair.
bool ObjectIdentifier(const std::vector<std::uint32_t>& oid, Bytes* out);
Bytes Concat(std::initializer_list<const Bytes*> parts);
// The size of a TLV's type and length octets for contents of this size.
std::size_t HeaderSize(std::size_t contentsLength);

// A reader over one definite-length TLV sequence.
struct Reader {
  const std::uint8_t* data;
  std::size_t length;
  std::size_t position = 0;

  bool AtEnd() const { return position == length; }
  // Enters the next TLV: returns its contents as a new reader and steps past it.
  bool Next(std::uint8_t* type, Reader* contents);
  // The next TLV, which must have this type.
  bool Expect(std::uint8_t type, Reader* contents);
  bool NextInteger(std::int64_t* value);
};

}  // namespace tessel::bench::ber
