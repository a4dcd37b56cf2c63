// SNMPv3 message processing (RFC 3412 with the user-based security model of RFC 3414): takes a
// received v3 message apart, checks it (discovery, user, level, digest, time window,
// decryption), answers security errors with Report PDUs, runs the scoped PDU through the same
// PDU processing as v1/v2c under the principal's views, and wraps, encrypts and authenticates
// the response. Safe from many threads at once.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include "engine/agent.h"
#include "snmp/pdu.h"
#include "snmpv3/usm_crypto.h"
#include "snmpv3/usm_users.h"

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

// What an SNMPv3 message carries around its PDU: the header, the user-based security parameters
// (keys already localised to engineId) and the scoped PDU's context.
struct V3Envelope {
  std::int32_t msgId = 0;
  std::int32_t msgMaxSize = 0;
  std::uint8_t level = kNoAuthNoPriv;
  bool reportable = false;
  std::string engineId;  // msgAuthoritativeEngineID
  std::uint32_t boots = 0;
  std::uint32_t time = 0;
  std::string userName;
  AuthProtocol auth = AuthProtocol::kNone;
  std::string authKey;
  PrivProtocol priv = PrivProtocol::kNone;
  std::string privKey;
  std::string contextEngineId;
  std::string contextName;
};

// Encodes the whole message around an encoded PDU into out (capacity *length in, the message's
// length out): the scoped PDU, encrypted at authPriv, and the digest at authNoPriv and above.
// False when it does not fit or a cryptographic step fails.
bool EncodeV3Message(const V3Envelope& envelope, const std::uint8_t* pdu, std::size_t pduLength,
                     std::uint8_t* out, std::size_t* length);

// An SNMPv3 message taken apart: its header, security parameters and scoped PDU.
struct V3Received {
  std::int32_t msgId = 0;
  std::uint8_t level = kNoAuthNoPriv;
  std::string engineId;  // msgAuthoritativeEngineID
  std::uint32_t boots = 0;
  std::uint32_t time = 0;
  std::string userName;
  std::string contextEngineId;
  std::string contextName;
  SnmpPdu pdu;
};

// Parses a message that another engine, authoritative for it, sent to one of the engine's own
// requests. Above noAuthNoPriv the digest is checked and the scoped PDU decrypted with user's
// keys localised to the message's engine ID. False when it is malformed or not authentic, or
// when it is above noAuthNoPriv and no user is given (the header fields are then filled in).
bool ParseV3Message(const std::uint8_t* message, std::size_t length, const UsmUser* user,
                    V3Received* received);

// Receives the SNMPv3 messages that reach an agent from another authoritative engine (Responses
// to the agent's informs) and tells whether it took one; the others are processed as requests.
using V3MessageReceiver = bool (*)(const std::uint8_t* message, std::size_t length,
                                   const AgentSession& agent);
void InstallV3MessageReceiver(V3MessageReceiver receiver);

// Processes one SNMPv3 datagram for the agent, as ProcessSnmpMessage does for v1/v2c: 1 send the
// reply (a Response or a Report) in reply/*replyLength, 0 drop, 99 memory exhausted.
int ProcessSnmpV3Message(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                         std::size_t* replyLength, const AgentSession& agent);

}  // namespace tessel
