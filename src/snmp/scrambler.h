// PDU scrambling: while the host has it switched on, every PDU an agent receives and every reply
// it sends is shown to the host's scrambler, which may replace header fields (request-id, error
// status and index, PDU type, community, the enterprise OID, an inform's timeout and retries) to
// make the device misbehave. The bindings are shown but never replaced.
#pragma once

#include <atomic>

#include "engine/agent.h"
#include "engine/engine_state.h"
#include "snmp/pdu.h"

namespace tessel {

// Hands pdu to the host's scrambler and applies what it returns. isResponse: pdu is the reply
// about to be encoded (its response bindings are shown), else the PDU as received (its request
// bindings). Any failure leaves pdu exactly as it was.
void ScrambleThePdu(SnmpPdu* pdu, const AgentSession& agent, bool isResponse);

// The call the service threads make: while scrambling is off it costs one relaxed load.
inline void ScrambleIfOn(SnmpPdu* pdu, const AgentSession& agent, bool isResponse) {
  if (gv_scramblePdu.load(std::memory_order_relaxed) != 0) ScrambleThePdu(pdu, agent, isResponse);
}

}  // namespace tessel
