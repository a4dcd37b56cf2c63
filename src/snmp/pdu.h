// SnmpPdu: one SNMP message being processed, and VarBind: one variable binding. Both belong to
// the call that processes the message.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "snmp/var_value.h"

namespace tessel {

inline constexpr std::uint8_t kGetRequest = 0xA0;
inline constexpr std::uint8_t kGetNextRequest = 0xA1;
inline constexpr std::uint8_t kGetResponse = 0xA2;
inline constexpr std::uint8_t kSetRequest = 0xA3;
inline constexpr std::uint8_t kTrapV1 = 0xA4;
inline constexpr std::uint8_t kGetBulkRequest = 0xA5;
inline constexpr std::uint8_t kInformRequest = 0xA6;
inline constexpr std::uint8_t kTrapV2 = 0xA7;
inline constexpr std::uint8_t kReport = 0xA8;

inline constexpr std::int32_t kSnmpV1 = 0;
inline constexpr std::int32_t kSnmpV2c = 1;
inline constexpr std::int32_t kSnmpV3 = 3;

// SNMP error statuses.
inline constexpr std::int32_t kNoError = 0;
inline constexpr std::int32_t kTooBig = 1;
inline constexpr std::int32_t kNoSuchName = 2;
inline constexpr std::int32_t kBadValue = 3;
inline constexpr std::int32_t kReadOnly = 4;
inline constexpr std::int32_t kGenErr = 5;
inline constexpr std::int32_t kNoAccess = 6;
inline constexpr std::int32_t kWrongType = 7;
inline constexpr std::int32_t kCommitFailed = 14;
inline constexpr std::int32_t kUndoFailed = 15;
inline constexpr std::int32_t kAuthorizationError = 16;
inline constexpr std::int32_t kNotWritable = 17;
// Not an SNMP status: memory exhausted; the message is abandoned.
inline constexpr std::int32_t kResourceFailure = 99;

inline constexpr std::uint8_t kVarBindPending = 1;
inline constexpr std::uint8_t kVarBindAnswered = 5;

struct VarBind {
  Oid name;
  VarValue value;           // value.type is the binding's type
  std::uint32_t index = 0;  // 1-based position in the request
  std::uint8_t state = 0;
};

using VarBindList = std::vector<VarBind>;

struct SnmpPdu {
  std::int32_t version = kSnmpV3;
  std::string community;
  std::uint8_t type = 0;
  std::uint8_t requestType = 0;
  std::int32_t requestId = 0;
  std::int32_t errorStatus = 0;  // GetBulk: non-repeaters as received
  std::int32_t errorIndex = 0;   // GetBulk: max-repetitions as received
  // SNMPv1 trap fields.
  Oid enterprise;
  std::uint8_t agentAddress[4] = {0, 0, 0, 0};
  std::string agentAddressV6;
  std::int32_t genericTrap = 0;
  std::int32_t specificTrap = 0;
  std::uint32_t timeStamp = 0;
  // An inform's wait (seconds) and retransmissions, as the host's scrambler sees and sets them.
  std::int32_t timeout = 0;
  std::int32_t retries = 0;

  VarBindList requestVarBinds;
  VarBindList responseVarBinds;
  std::int32_t varBindCount = 0;
  std::int32_t holderReuseCount = 0;
};

// The largest reply the engine builds, and the largest request it accepts (exclusive).
inline constexpr std::size_t kMaxSnmpMessage = 20000;
inline constexpr std::size_t kMaxRequestSize = 19990;

}  // namespace tessel
