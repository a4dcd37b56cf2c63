// The engine's manager table: the trap sinks of each device, and the standard traps a device
// raises to them (coldStart when its agent starts, authenticationFailure when a request fails
// its community or SNMPv3 digest check). Each sink receives the trap in its own version and
// kind, from the device's own address and SNMP port. A device without sinks raises nothing and
// pays one atomic load. Safe from any thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "engine/agent.h"
#include "snmp/pdu.h"

namespace tessel {

struct TrapSinkConfig {
  std::int32_t version = kSnmpV2c;
  std::string host;  // a name, an IPv4 or an IPv6 address
  std::uint16_t port = 162;
  std::string community;  // SNMPv1, SNMPv2c
  std::string userName;   // SNMPv3: a user of the engine's USM table, at its level
  std::string contextName;
  bool inform = false;  // SNMPv2c and SNMPv3 only
  std::uint32_t timeout = 5;
  std::uint32_t retries = 0;
};

// The sinks of the devices with agent IDs [firstAgentId, firstAgentId + count): they replace the
// sinks given before for a range with the same first ID (no sinks: the range has none). Returns
// -1, or the index of the first sink whose host does not resolve (nothing is then changed).
std::int32_t SetTrapSinks(std::int32_t firstAgentId, std::int32_t count,
                          const std::vector<TrapSinkConfig>& sinks);
void ClearTrapSinks();

// Sends standard trap genericTrap (0 coldStart .. 5 egpNeighborLoss) from device to each of its
// sinks; returns how many sinks it went to.
std::size_t RaiseStandardTrap(const AgentSession& device, std::int32_t genericTrap);

}  // namespace tessel
