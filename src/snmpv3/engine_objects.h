// The engine's own SNMPv3 objects: the snmpEngine group (SNMP-FRAMEWORK-MIB), the snmpMPDStats
// group (SNMP-MPD-MIB) and the usmStats group (SNMP-USER-BASED-SM-MIB). Their values live in the
// engine, not in the host: the requested agent's engine ID, boots and time, the largest message
// the engine accepts, and the engine's SNMPv3 counters. They are read-only. Safe from any thread.
#pragma once

namespace tessel {

// Registers the three groups in the MIB tree with the engine's read handlers. A group the host
// has registered under the same OID keeps the host's definition.
void RegisterEngineObjects();

}  // namespace tessel
