// One SNMP value in the engine's internal form, and the BER identifiers the engine handles.
#pragma once

#include <cstdint>
#include <string>

#include "base/conversions.h"

namespace tessel {

inline constexpr std::uint8_t kAsnInteger = 0x02;
inline constexpr std::uint8_t kAsnBitString = 0x03;
inline constexpr std::uint8_t kAsnOctetString = 0x04;
inline constexpr std::uint8_t kAsnNull = 0x05;
inline constexpr std::uint8_t kAsnObjectId = 0x06;
inline constexpr std::uint8_t kAsnSequence = 0x30;
inline constexpr std::uint8_t kAsnIpAddress = 0x40;
inline constexpr std::uint8_t kAsnCounter = 0x41;
inline constexpr std::uint8_t kAsnGauge = 0x42;
inline constexpr std::uint8_t kAsnTimeTicks = 0x43;
inline constexpr std::uint8_t kAsnOpaque = 0x44;
inline constexpr std::uint8_t kAsnNsapAddress = 0x45;
inline constexpr std::uint8_t kAsnCounter64 = 0x46;
inline constexpr std::uint8_t kAsnUInteger32 = 0x47;
inline constexpr std::uint8_t kNoSuchObject = 0x80;
inline constexpr std::uint8_t kNoSuchInstance = 0x81;
inline constexpr std::uint8_t kEndOfMibView = 0x82;

// Which member carries the value depends on the type:
//   INTEGER                                  number holds the 32-bit value (see AsInt32)
//   Counter, Gauge, TimeTicks, UInteger32    number (32 bits)
//   Counter64                                number (64 bits)
//   OCTET STRING, Opaque, NsapAddress,       octets
//   BIT STRING, IpAddress (its 4 octets)
//   OBJECT IDENTIFIER                        oid
//   NULL and the three exceptions            nothing
struct VarValue {
  std::uint8_t type = kAsnNull;
  std::uint64_t number = 0;
  std::string octets;
  Oid oid;

  std::int32_t AsInt32() const {
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(number));
  }
  static VarValue Integer(std::int32_t value) {
    return {kAsnInteger, static_cast<std::uint32_t>(value), {}, {}};
  }
  static VarValue Unsigned(std::uint8_t type, std::uint64_t value) { return {type, value, {}, {}}; }
  static VarValue Octets(std::uint8_t type, std::string value) {
    return {type, 0, std::move(value), {}};
  }
  static VarValue ObjectId(Oid value) { return {kAsnObjectId, 0, {}, std::move(value)}; }
  static VarValue Empty(std::uint8_t type) { return {type, 0, {}, {}}; }
  bool operator==(const VarValue&) const = default;
};

inline bool IsExceptionType(std::uint8_t type) {
  return type >= kNoSuchObject && type <= kEndOfMibView;
}

}  // namespace tessel
