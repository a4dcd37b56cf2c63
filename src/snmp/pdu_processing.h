// PDU processing: answers the bindings of a Get, GetNext, Set or GetBulk. Bindings are grouped
// by the tree cell that answers them, each cell's handlers are asked, GetNext and GetBulk walk
// the MIB in OID order, and the outcome becomes the reply's error status and response bindings
// in request order, by the rules of the message's version.
#pragma once

#include <cstdint>

#include "engine/agent.h"
#include "snmp/mib_tree.h"
#include "snmp/pdu.h"

namespace tessel {

// Both return the reply's error status (pdu->errorStatus/errorIndex are set, the answers are in
// pdu->responseVarBinds), or 99 when memory ran out.
std::int32_t ProcessPDU(SnmpPdu* pdu, const AgentSession& agent);
std::int32_t ProcessGetBulkVarBinds(SnmpPdu* pdu, const AgentSession& agent);

// Normalises oid to the first object at or after it within cell; false when the cell has
// nothing there.
bool GetNextOid(const TreeCell& cell, Oid* oid);

}  // namespace tessel
