// The engine's process-wide switches and counters that the host sets through the exports and
// the subsystems read on every request.
#pragma once

#include <atomic>
#include <cstdint>

namespace tessel {

inline std::atomic<std::int16_t> gv_dropV1V2Requests{0};
inline std::atomic<std::int16_t> gv_processV1Only{0};
inline std::atomic<std::int16_t> gv_processV2Only{0};
inline std::atomic<std::int32_t> gv_scramblePdu{0};
inline std::atomic<std::uint8_t> gv_snmpServiceStarted{0};
inline std::atomic<std::uint16_t> gv_snmpPort{0};
inline std::atomic<std::uint16_t> gv_trapPort{0};
inline std::atomic<std::int32_t> gv_virtualIpBase{100};
inline std::atomic<std::uint32_t> gv_engineBoots{0};
inline std::atomic<std::int32_t> gv_ipv6InterfaceIndex{0};
// Set once an SNMPv3 user is configured: the engine then speaks SNMPv3.
inline std::atomic<bool> gv_snmpv3Configured{false};
// SNMPv3 Reports and unauthenticated replies carry the agent's boots and time (so that a manager
// can synchronise at discovery) while set; 0 and 0 otherwise. Given with every USM user.
inline std::atomic<bool> gv_discoveryTimeFlag{true};
// Authentication-failure traps on a bad community.
inline std::atomic<bool> gv_authenticationTraps{false};

}  // namespace tessel
