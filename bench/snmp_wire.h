// The load generator's own small SNMP wire codec: it encodes one v1/v2c request template (Get,
// GetNext or GetBulk of one OID) whose request-id can be patched in place, and decodes only what
// matching an answer needs (PDU type, request-id, error-status). Independent of the engine's
// codec, so a fault there cannot hide behind the same fault here. Stateless.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace tessel::bench {

inline constexpr std::uint8_t kPduGet = 0xA0;
inline constexpr std::uint8_t kPduGetNext = 0xA1;
inline constexpr std::uint8_t kPduResponse = 0xA2;
inline constexpr std::uint8_t kPduGetBulk = 0xA5;
inline constexpr std::uint8_t kPduInform = 0xA6;
inline constexpr std::uint8_t kPduReport = 0xA8;
// A request must fit one unfragmented loopback datagram on any MTU in use.
inline constexpr std::size_t kMaxRequestSize = 1472;

struct RequestTemplate {
  std::vector<std::uint8_t> bytes;
  std::size_t requestIdOffset = 0;  // the four contents octets of the request-id
};

// version is the wire value (0 SNMPv1, 1 SNMPv2c). For GetBulk the two integers after the
// request-id are non-repeaters and max-repetitions, otherwise both are zero. False when the OID
// is not encodable or the message would exceed kMaxRequestSize.
bool EncodeRequestTemplate(int version, const std::string& community, std::uint8_t pduType,
                           const std::vector<std::uint32_t>& oid, int nonRepeaters,
                           int maxRepetitions, RequestTemplate* out);

// The PDU alone, as the scoped PDU of an SNMPv3 message carries it; requestIdOffset is within it.
bool EncodePduTemplate(std::uint8_t pduType, const std::vector<std::uint32_t>& oid,
                       int nonRepeaters, int maxRepetitions, RequestTemplate* out);

// requestId must lie in [2^23, 2^31) so that it takes exactly four octets.
void PatchRequestId(std::uint8_t* message, const RequestTemplate& request, std::uint32_t requestId);

struct ReplySummary {
  std::uint8_t pduType = 0;
  std::uint32_t requestId = 0;  // negative request-ids decode as 0
  std::int64_t errorStatus = 0;
};

// A PDU (its first TLV) up to its error-status; false when malformed.
bool DecodePdu(const std::uint8_t* data, std::size_t length, ReplySummary* out);

// Where the PDU of a v1/v2c message starts (its type octet); false when the datagram is not
// such a message up to the PDU.
bool FindCommunityPdu(const std::uint8_t* data, std::size_t length, std::size_t* pduOffset);

// Turns a v1/v2c InformRequest in place into the Response that acknowledges it: the same message
// with the PDU type changed. False, and nothing changed, for any other datagram.
bool AnswerInform(std::uint8_t* datagram, std::size_t length);

// False when the datagram is not a well-formed v1/v2c message up to its error-status.
bool DecodeReply(const std::uint8_t* data, std::size_t length, ReplySummary* out);

// Dotted OID text, with or without a leading dot, of at least two sub-identifiers.
bool ParseOid(const std::string& text, std::vector<std::uint32_t>* oid);

}  // namespace tessel::bench
