// SNMPv3 traps from a device: the device is the authoritative engine of the traps it sends (its
// engine ID, boots and time), so the user's keys are localised to the device's engine ID. A trap
// goes to a user of the engine's USM table, at that user's level, in a known context, and only
// when the user's notify view holds the trap and every binding. Stateless; safe from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "engine/agent.h"
#include "notify/inform_list.h"
#include "snmp/pdu.h"
#include "snmpv3/usm_users.h"

namespace tessel {

enum class V3Refusal { kNone, kUnknownUser, kUnknownContext, kNotInView, kNotEncoded };

// Whether the principal's notify view holds the trap (the value of snmpTrapOID.0) and the name of
// every binding behind it.
bool NotifyViewAllows(const SnmpPdu& notification, const std::string& contextName,
                      const std::string& securityName, int securityLevel);

// The user of the engine's table that may receive the notification in the target's context;
// nothing with *refusal set when the user or context is unknown or the notify view refuses.
std::optional<UsmUser> V3Principal(const SnmpPdu& notification, const NotificationTarget& target,
                                   V3Refusal* refusal);

// The SNMPv2 notification as an SNMPv3 message from device to the target's user and context;
// empty with *refusal set when it is not to be sent.
std::vector<std::uint8_t> EncodeV3Trap(const SnmpPdu& notification,
                                       const NotificationTarget& target, const AgentSession& device,
                                       V3Refusal* refusal);

}  // namespace tessel
