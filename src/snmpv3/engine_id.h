// SNMPv3 engine identity: the process-wide engine ID that keys the USM user table (from
// conf/snmp/snmpv3.txt below the base directory, else generated), and each agent's own
// authoritative engine ID, the "ADDR#PORT" text of the agent. Safe from any thread.
#pragma once

#include <cstdint>
#include <string>

#include "engine/agent.h"

namespace tessel {

inline constexpr std::size_t kMaxEngineIdLength = 32;

// Sets the process engine ID unless it is set: read from baseDirectory + conf/snmp/snmpv3.txt
// (its non-blank characters, at most 32; fewer than 5 are ignored), else generated. False only
// when memory ran out.
bool ReadFromSnmpV3ConfFile(const std::string& baseDirectory = "./");
std::string EngineId();
void ClearEngineId();

// The agent's authoritative engine ID: its address, '#' and its configured port. A text longer
// than 32 octets (a long IPv6 address) keeps its last 32 octets, which hold the most specific
// part of the address and the port.
std::string AgentEngineId(const AgentSession& agent);

// The agent's snmpEngineTime: whole seconds since it started, at most 2^31 - 1.
std::uint32_t AgentEngineTime(const AgentSession& agent);

}  // namespace tessel
