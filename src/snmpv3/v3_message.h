// SNMPv3 message processing (RFC 3412 with the user-based security model of RFC 3414): takes a
// received v3 message apart, checks it (discovery, user, level, digest, time window,
// decryption), answers security errors with Report PDUs, runs the scoped PDU through the same
// PDU processing as v1/v2c under the principal's views, and wraps, encrypts and authenticates
// the response. Safe from many threads at once.
#pragma once

#include <cstddef>
#include <cstdint>

#include "engine/agent.h"

namespace tessel {

// The counters of the SNMP-MPD-MIB and SNMP-USER-BASED-SM-MIB statistics groups.
enum class V3Counter : int {
  kUnsupportedSecLevels = 0,
  kNotInTimeWindows,
  kUnknownUserNames,
  kUnknownEngineIds,
  kWrongDigests,
  kDecryptionErrors,
  kUnknownSecurityModels,
  kInvalidMsgs,
  kUnknownPduHandlers,
  kCount
};
std::uint32_t V3Count(V3Counter counter);
void ResetV3Statistics();

// Processes one SNMPv3 datagram for the agent, as ProcessSnmpMessage does for v1/v2c: 1 send the
// reply (a Response or a Report) in reply/*replyLength, 0 drop, 99 memory exhausted.
int ProcessSnmpV3Message(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                         std::size_t* replyLength, const AgentSession& agent);

}  // namespace tessel
