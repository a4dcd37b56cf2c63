// Notifications that the host asks a device to send: an SNMPv1 Trap, an SNMPv2-Trap or an
// InformRequest to one manager, built once, put in the
// form of the manager's version and sent from the device's own address and SNMP port (its agent
// socket), so that the manager sees the device as the sender and answers an inform there. Informs
// are kept until a Response from that manager acknowledges them, and sent again or dropped by the
// inform timer; the host is told of each answered and each dropped inform. Safe from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "engine/agent.h"
#include "notify/inform_list.h"
#include "snmp/pdu.h"

namespace tessel {

// The extra bindings as the host gives them: three arrays of one length (the BER type codes in
// types; 153 stands for OCTET STRING). Absent arrays mean no extra bindings.
struct NotificationBindingTexts {
  std::optional<std::vector<std::string>> oids;
  std::optional<std::vector<std::int32_t>> types;
  std::optional<std::vector<std::string>> values;
};

struct NotificationRequest {
  std::uint8_t pduType = kTrapV2;   // kTrapV1, kTrapV2 or kInformRequest
  std::int32_t version = kSnmpV2c;  // the manager's
  std::string managerHost;          // a name, an IPv4 address, or an IPv6 address (it has ':')
  std::int32_t managerPort = 162;
  std::string community;  // SNMPv1 and SNMPv2c
  std::string userName;   // SNMPv3: a user of the engine's USM table, sent at its level
  std::string contextName;
  // SNMPv1 form: the enterprise, generic-trap and specific-trap.
  std::string enterprise;
  std::int32_t genericTrap = 0;
  std::int32_t specificTrap = 0;
  // SNMPv2 form: snmpTrapOID.0.
  std::string trapOid;
  NotificationBindingTexts bindings;
  std::int32_t agentId = 0;
  std::string agentText;  // names the device in the log
  std::uint32_t timeout = 5;
  std::uint32_t retries = 0;
};

enum class NotifyResult {
  kSent,
  kBadArrays,   // the binding arrays are of different lengths
  kBadBinding,  // an OID or value text that does not convert
  kUnresolved,  // the manager host
  kNoDevice,    // no started device has that agent ID
  kNoForm,      // the notification has no form for the manager's version, or does not fit
  kRefused,     // SNMPv3: an unknown user or context, or the user's notify view excludes it
  kNotSent,     // the device's socket refused it (an inform is then reported dropped)
};

struct NotifyOutcome {
  NotifyResult result = NotifyResult::kSent;
  std::uint32_t informId = 0;  // an inform that was sent
};

NotifyOutcome SendNotification(const NotificationRequest& request);

// The manager's socket address and its numeric text in target; false when host does not resolve.
bool ResolveNotificationTarget(const std::string& host, std::uint16_t port,
                               NotificationTarget* target);
// Sends a built notification from device to one resolved manager, in the manager's version.
NotifyOutcome DeliverNotification(const SnmpPdu& pdu, const NotificationTarget& target,
                                  const AgentSession& device);

// Starts the inform timer and takes the Responses that reach agents.
void InitNotifications();
// Stops the inform timer and forgets every pending inform.
void StopNotifications();
std::size_t PendingInforms();

// Acknowledges the inform of informs that a Response reaching agent answers, and tells the host;
// false when it answers none. ReceiveResponse, the receiver installed for agents' Responses, does
// so with the engine's informs.
bool AcknowledgeInform(InformList& informs, const SnmpPdu& pdu, const AgentSession& agent);
bool ReceiveResponse(const SnmpPdu& pdu, const AgentSession& agent);

}  // namespace tessel
