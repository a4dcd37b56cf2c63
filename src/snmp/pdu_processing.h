// PDU processing: answers the bindings of a Get, GetNext, Set or GetBulk. Bindings are grouped
// by the tree cell that answers them, each cell's handlers are asked, GetNext and GetBulk walk
// the MIB in OID order, and the outcome becomes the reply's error status and response bindings
// in request order, by the rules of the message's version.
#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "engine/agent.h"
#include "snmp/mib_tree.h"
#include "snmp/pdu.h"

namespace tessel {

// The SNMPv3 principal of a request: every object it reads or writes is checked against its
// views by isAccessAllowed (1 allowed, 16 authorizationError, 5 genErr), which keeps in
// *viewCache the view chosen for the request.
struct SecurityAccess {
  std::string contextName;
  std::string securityName;
  std::int32_t securityModel = 3;
  std::int32_t securityLevel = 0;
  int (*isAccessAllowed)(const SecurityAccess& access, std::uint8_t pduType,
                         std::span<const std::uint32_t> oid, std::string* viewCache) = nullptr;
};

// Both return the reply's error status (pdu->errorStatus/errorIndex are set, the answers are in
// pdu->responseVarBinds), or 99 when memory ran out. access is null for SNMPv1 and SNMPv2c.
std::int32_t ProcessPDU(SnmpPdu* pdu, const AgentSession& agent,
                        const SecurityAccess* access = nullptr);
std::int32_t ProcessGetBulkVarBinds(SnmpPdu* pdu, const AgentSession& agent,
                                    const SecurityAccess* access = nullptr);

// Normalises oid to the first object at or after it within cell; false when the cell has
// nothing there.
bool GetNextOid(const TreeCell& cell, Oid* oid);

}  // namespace tessel
