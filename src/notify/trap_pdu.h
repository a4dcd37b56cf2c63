// The PDUs of notifications: SNMPv1 Trap, SNMPv2-Trap and InformRequest as the engine builds them,
// the translation of a notification between its SNMPv1 and SNMPv2 forms (RFC 3584 section 3),
// and the community message (SNMPv1, SNMPv2c) that carries one to a manager. Pure functions on
// values; safe from any thread.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "snmp/pdu.h"

namespace tessel {

// The objects every notification names.
inline const Oid kSysUpTimeOid = {1, 3, 6, 1, 2, 1, 1, 3, 0};
inline const Oid kSnmpTrapOid = {1, 3, 6, 1, 6, 3, 1, 1, 4, 1, 0};
inline const Oid kSnmpTrapEnterpriseOid = {1, 3, 6, 1, 6, 3, 1, 1, 4, 3, 0};
inline const Oid kSnmpTrapAddressOid = {1, 3, 6, 1, 6, 3, 18, 1, 3, 0};
// snmpTraps: the standard traps are its children 1 (coldStart) to 6 (egpNeighborLoss), and it is
// the enterprise of a standard trap in SNMPv1 form.
inline const Oid kSnmpTrapsOid = {1, 3, 6, 1, 6, 3, 1, 1, 5};

inline constexpr std::int32_t kColdStart = 0;
inline constexpr std::int32_t kLinkDown = 2;
inline constexpr std::int32_t kAuthenticationFailure = 4;
inline constexpr std::int32_t kEnterpriseSpecific = 6;

// The SNMPv1 agent-addr of a device: its IPv4 address, or 0.0.0.0 for a device that has none.
using AgentAddress = std::array<std::uint8_t, 4>;
AgentAddress AgentAddressOf(const std::string& deviceAddress);

// An SNMPv1 Trap. A binding named sysUpTime.0 (a TimeTicks) also gives the time-stamp.
SnmpPdu BuildV1Trap(const Oid& enterprise, const AgentAddress& agentAddress,
                    std::int32_t genericTrap, std::int32_t specificTrap, std::uint32_t timeStamp,
                    VarBindList bindings);
// An SNMPv2-Trap (kTrapV2) or InformRequest (kInformRequest): sysUpTime.0 and snmpTrapOID.0,
// then the bindings.
SnmpPdu BuildV2Notification(std::uint8_t type, std::uint32_t upTime, const Oid& trapOid,
                            VarBindList bindings);
// A standard trap (genericTrap 0 to 5) as a device sends it in SNMPv1 form: enterprise snmpTraps
// and the device's own address, so that a manager can tell which device it came from.
SnmpPdu BuildStandardV1Trap(std::int32_t genericTrap, const AgentAddress& device,
                            std::uint32_t upTime);

// The SNMPv2 form of an SNMPv1 Trap, as an SNMPv2-Trap.
SnmpPdu ConvertV1TrapToV2(const SnmpPdu& trap);
// The SNMPv1 form of an SNMPv2 notification; nothing when it does not begin with sysUpTime.0 and
// snmpTrapOID.0 (an OBJECT IDENTIFIER). The agent-addr is the value of a snmpTrapAddress.0
// binding, else the sending device's address. Counter64 bindings have no SNMPv1 form and go.
std::optional<SnmpPdu> ConvertV2TrapToV1(const SnmpPdu& notification, const AgentAddress& device);

// The PDU in the form a manager of that version receives (an SNMPv1 Trap for SNMPv1, an SNMPv2
// notification otherwise); nothing when it has no such form.
std::optional<SnmpPdu> NotificationForVersion(const SnmpPdu& pdu, std::int32_t version,
                                              const AgentAddress& device);

// The whole SNMPv1/SNMPv2c message that carries the notification, with pdu.version and
// pdu.community; empty when it does not fit in a message of kMaxSnmpMessage octets.
std::vector<std::uint8_t> EncodeNotification(const SnmpPdu& pdu);
// The PDU alone, for the scoped PDU of an SNMPv3 message; empty when it does not fit.
std::vector<std::uint8_t> EncodeNotificationPdu(const SnmpPdu& pdu);

}  // namespace tessel
