// BER codec (X.690) primitives for SNMP. Each works on a caller's buffer and a running signed
// remaining-length counter: parse primitives consume octets and return the cursor behind them,
// build primitives write octets and return the cursor behind them. Failure is a null cursor.
// Stateless; safe from any thread. Failures are logged at the error class, never sent anywhere.
#pragma once

#include <cstddef>
#include <cstdint>

#include "snmp/var_value.h"

namespace tessel {

// Parsing. `remaining` counts the octets available from the cursor.
// Reads identifier and length; returns the cursor at the contents and sets *remaining to the
// contents length.
const std::uint8_t* AsnParseHeader(const std::uint8_t* data, std::int32_t* remaining,
                                   std::uint8_t* type);
// Reads a definite length (at most four length octets) from at most `available` octets.
const std::uint8_t* AsnParseLength(const std::uint8_t* data, std::int32_t available,
                                   std::uint32_t* length);
const std::uint8_t* AsnParseInt(const std::uint8_t* data, std::int32_t* remaining,
                                std::uint8_t* type, std::int32_t* value);
const std::uint8_t* AsnParseUnsignedInt(const std::uint8_t* data, std::int32_t* remaining,
                                        std::uint8_t* type, std::uint32_t* value);
// Copies the contents into buffer; *length is its capacity in and the contents length out.
const std::uint8_t* AsnParseString(const std::uint8_t* data, std::int32_t* remaining,
                                   std::uint8_t* type, std::uint8_t* buffer, std::size_t* length);
const std::uint8_t* AsnParseBitString(const std::uint8_t* data, std::int32_t* remaining,
                                      std::uint8_t* type, std::uint8_t* buffer,
                                      std::size_t* length);
// Reads an OBJECT IDENTIFIER; *count is the capacity of ids in (at most kMaxOidLength is ever
// accepted) and the number of sub-identifiers out. More than the capacity, or a sub-identifier
// above 2^32 - 1, is malformed.
const std::uint8_t* AsnParseObjid(const std::uint8_t* data, std::int32_t* remaining,
                                  std::uint8_t* type, std::uint32_t* ids, std::size_t* count);
const std::uint8_t* AsnParseNull(const std::uint8_t* data, std::int32_t* remaining,
                                 std::uint8_t* type);
// One variable binding: the name into name/nameLength (capacity in), the value's type, its
// contents length and a cursor at the value's identifier octet. Reduces *remaining by the whole
// binding and returns the cursor behind it.
const std::uint8_t* ParseVarOp(const std::uint8_t* data, std::uint32_t* name,
                               std::size_t* nameLength, std::uint8_t* valueType,
                               std::size_t* valueLength, const std::uint8_t** value,
                               std::int32_t* remaining);
// Decodes value contents (behind identifier and length) of the given type into *out. False when
// the contents are malformed for the type (an OBJECT IDENTIFIER that ends inside a
// sub-identifier, has more than kMaxOidLength sub-identifiers or one above 2^32 - 1).
bool DecodeAsnSyntaxValue(std::uint8_t type, const std::uint8_t* contents, std::size_t length,
                          VarValue* out);

// Building.
std::uint8_t* AsnBuildHeader(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                             std::size_t length);
std::uint8_t* AsnBuildLength(std::uint8_t* data, std::int32_t* remaining, std::size_t length);
// Always four octets: identifier, 0x82 and two length octets, so a header reserved before its
// contents are built can be filled in afterwards.
std::uint8_t* AsnBuildSequence(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                               std::size_t length);
std::uint8_t* AsnBuildInt(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                          std::int32_t value);
std::uint8_t* AsnBuildUnsignedInt(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                                  std::uint32_t value);
std::uint8_t* AsnBuildUnsignedInt64(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                                    std::uint64_t value);
std::uint8_t* AsnBuildString(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                             const std::uint8_t* octets, std::size_t length);
std::uint8_t* AsnBuildBitString(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                                const std::uint8_t* octets, std::size_t length);
std::uint8_t* AsnBuildObjid(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type,
                            const std::uint32_t* ids, std::size_t count);
std::uint8_t* AsnBuildNull(std::uint8_t* data, std::int32_t* remaining, std::uint8_t type);
// One variable binding SEQUENCE { name, value } with the value encoded by its type.
std::uint8_t* BuildVarOp(std::uint8_t* data, const std::uint32_t* name, std::size_t nameLength,
                         const VarValue& value, std::int32_t* remaining);

}  // namespace tessel
