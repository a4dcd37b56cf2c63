// The traffic log of notifications: readable dumps of the notifications a device sends and of
// the Responses that answer its informs, written to the engine's log at level 1 and above, and
// the bindings as the three text arrays (OIDs, type names, values) the host is given. Stateless;
// safe from any thread.
#pragma once

#include "engine/host_bridge.h"
#include "notify/inform_list.h"
#include "snmp/pdu.h"

namespace tessel {

// The manager block, then the PDU.
void DumpNotification(const NotificationTarget& target, const SnmpPdu& pdu);

// Fills the report's oids, types and values from the bindings.
void BindingsToHostTexts(const VarBindList& bindings, InformReport* report);

}  // namespace tessel
