// SNMPv3 configuration from the host and the SNMPv3 side of the engine's lifecycle: users,
// contexts, groups, access rows and view families arrive through the host's configuration calls,
// before or after the SNMP service starts; a service start keeps what is already configured, and
// a stop releases it all. Safe from any thread.
#pragma once

#include <cstdint>
#include <string_view>

namespace tessel {

// Adds a USM user under the process engine ID; the first user makes the engine an SNMPv3
// engine. 1 added, 0 refused, 99 memory exhausted.
int AddUsmUserFromHost(std::string_view userName, std::string_view authProtocol,
                       std::string_view authPassword, std::string_view privProtocol,
                       std::string_view privPassword, std::int32_t discoveryTimeFlag);

// At a service start: sets the engine ID unless set, creates the VACM tables unless they exist,
// resets the SNMPv3 statistics and registers the engine's own objects (snmpEngine, snmpMPDStats
// and usmStats, served by the engine).
void InitSnmpV3Params();

// At a stop: every user, VACM row and the engine ID go; the engine speaks SNMPv3 again only once
// the host adds a user.
void FreeSnmpV3Resources();

}  // namespace tessel
