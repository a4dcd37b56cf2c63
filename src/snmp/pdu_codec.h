// The PDU inside every SNMP message, whatever the version: parsing a received PDU with its
// bindings, running a request PDU through processing (with the statistics and the error log),
// and encoding the response PDU, falling back to an error reply that fits. The v1/v2c community
// message and the SNMPv3 message both wrap what this file parses and builds.
#pragma once

#include <cstddef>
#include <cstdint>

#include "engine/agent.h"
#include "snmp/pdu.h"
#include "snmp/pdu_processing.h"

namespace tessel {

// Where a received PDU lies in its message, for replies that repeat parts of it.
struct PduLayout {
  std::size_t pduTypeOffset = 0;           // from the start of the message
  const std::uint8_t* bindings = nullptr;  // the binding list TLV as received
  std::size_t bindingsLength = 0;
};

// Outcome of parsing: the drop reasons are counted where they are found.
enum class ParseResult { kParsed, kDropped, kMalformed };

// Parses the PDU at data (remaining octets to the end of its enclosing message part). A trap is
// counted and dropped. countIncoming: a received request updates the incoming statistics; a
// message the engine only inspects does not.
ParseResult ParseSnmpPdu(const std::uint8_t* messageStart, const std::uint8_t* data,
                         std::int32_t remaining, SnmpPdu* pdu, PduLayout* layout,
                         bool countIncoming);

enum class RequestOutcome { kReply, kEchoInform, kDrop, kResourceFailure };

// Processes a parsed and authorised request PDU for the agent: dispatches it, records errors
// and counts. kReply: pdu now holds the response to encode; kEchoInform: acknowledge the inform.
RequestOutcome ProcessRequestPdu(SnmpPdu* pdu, const AgentSession& agent,
                                 const SecurityAccess* access);

// Encodes pdu as a Response at cursor: its response bindings, or, when the request failed or the
// bindings do not fit, the error reply (the request's bindings, or an empty list for tooBig
// beyond SNMPv1). The cursor behind it, or nullptr when even that does not fit.
std::uint8_t* BuildResponsePdu(std::uint8_t* cursor, std::int32_t* remaining, SnmpPdu* pdu,
                               const PduLayout& request);

// Fills in a header reserved with AsnBuildSequence once its contents end at `end`.
bool FillHeader(std::uint8_t* header, std::uint8_t type, const std::uint8_t* end);

// Counts the error status of a reply that was sent.
void CountErrorStatus(std::int32_t status);

}  // namespace tessel
