// Text and value conversions shared by the SNMP, VACM, notification and CLI code: decimal and
// hexadecimal text to integers and back, object identifiers between dotted text and arrays of
// 32-bit sub-identifiers, OID comparison. Pure functions; safe from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace tessel {

// An object identifier: at most kMaxOidLength unsigned 32-bit sub-identifiers.
using Oid = std::vector<std::uint32_t>;
inline constexpr std::size_t kMaxOidLength = 128;

// Decimal digits alone (no sign, no blank); nothing when the text is empty, holds anything else,
// or names a number above limit. The one decimal reader: every other is built on it.
std::optional<std::uint64_t> ParseDecimal(std::string_view digits,
                                          std::uint64_t limit = UINT64_MAX);
// Decimal text with an optional leading sign. -1 when the text is not a number or lies outside
// the 32-bit signed range, 0 for the empty text.
std::int32_t TextToInt(std::string_view text);
// Hexadecimal digits; -1 when the text is not hexadecimal.
std::int32_t HexTextToInt(std::string_view text);
std::string IntToText(std::int32_t value);
std::string UIntToText(std::uint32_t value);
// 0-15 for a hexadecimal digit, -1 otherwise.
int HexDigitValue(char c);

// Dotted text to sub-identifiers. An OID text (plain false) starts with '.', as .1.3.6.1; a plain
// text (an IPv4 address) does not. Returns the number of sub-identifiers, 0 when the count does
// not match the dots, -1 on a malformed text.
int ParseDottedText(Oid* out, std::string_view text, bool plain);
// Sub-identifiers with a '.' before each: .1.3.6.1.
std::string OidToText(std::span<const std::uint32_t> oid);
// The same without the leading dot: 1.3.6.1.
std::string OidToPlainText(std::span<const std::uint32_t> oid);
// 0 equal; -1 a sorts first (smaller, or a proper prefix of b); 1 a greater; 2 a greater because
// b is a proper prefix of it (the MIB tree tells an instance below a registered OID by this).
int CompareOid(std::span<const std::uint32_t> a, std::span<const std::uint32_t> b);

// Two lowercase hex digits per octet.
std::string BytesToHex(std::string_view bytes);

}  // namespace tessel
