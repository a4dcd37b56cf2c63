// The SNMP message codec: the single entry for a request datagram of an agent. It parses the
// message, applies the engine's version switches and the agent's community lists, hands the PDU
// to PDU processing and encodes the reply. SNMPv1 and SNMPv2c. Safe from many threads at once.
#pragma once

#include <cstddef>
#include <cstdint>

#include "engine/agent.h"
#include "snmp/pdu.h"

namespace tessel {

// Result of ProcessSnmpMessage.
inline constexpr int kMessageDrop = 0;
inline constexpr int kMessageReply = 1;
// Taken by the engine's notification side (a Response to an inform); nothing to send.
inline constexpr int kMessageConsumed = 2;

// Receives every SNMPv1/SNMPv2c Response that reaches an agent (whatever its community: it is
// matched with what the agent sent, not authorised as a request) and tells whether it answered
// something the agent sent. Installed once, before agents serve; a Response that answers nothing
// is dropped.
using ResponseReceiver = bool (*)(const SnmpPdu& pdu, const AgentSession& agent);
void InstallResponseReceiver(ResponseReceiver receiver);

// Processes one request datagram for the agent. *replyLength is the reply capacity in and the
// reply's length out. 1: send the reply; 0: drop; 99: resource failure.
int ProcessSnmpMessage(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                       std::size_t* replyLength, const AgentSession& agent);

// Parses a whole SNMPv1/v2c message into pdu. 1 parsed; 0 dropped; -1 malformed.
int ParseSnmpMessage(const std::uint8_t* message, std::size_t length, SnmpPdu* pdu);

// Encodes pdu (its responseVarBinds for a response, else its requestVarBinds) into reply.
// requestBindings/requestBindingsLength are the encoded binding list of the request, copied
// into error replies. False when no reply could be encoded.
bool CreateSnmpMessage(const std::uint8_t* requestBindings, std::size_t requestBindingsLength,
                       std::uint8_t* reply, std::size_t* replyLength, SnmpPdu* pdu);

// The SNMPv1 error status for an SNMPv2 one.
std::int32_t MapErrorStatusToV1(std::int32_t status);

}  // namespace tessel
