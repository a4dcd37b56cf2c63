#include "notify/v3_notification.h"

#include "engine/log.h"
#include "notify/trap_pdu.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/usm_users.h"
#include "snmpv3/v3_message.h"
#include "snmpv3/vacm.h"

namespace tessel {

bool NotifyViewAllows(const SnmpPdu& notification, const std::string& contextName,
                      const std::string& securityName, int securityLevel) {
  const VarBindList& bindings = notification.requestVarBinds;
  if (bindings.size() < 2) return false;
  std::string view;
  auto allowed = [&](const Oid& oid) {
    return IsAccessAllowed(contextName, securityName, kVacmUsmSecurityModel, securityLevel,
                           notification.type, oid, &view) == kVacmAllowed;
  };
  if (!allowed(bindings[1].value.oid)) {
    LOG_ERROR("1. Access is not allowed to send v3 trap !!!\n");
    return false;
  }
  for (auto it = bindings.begin() + 2; it != bindings.end(); ++it) {
    if (!allowed(it->name)) {
      LOG_ERROR("2. Access is not allowed to send v3 trap !!!\n");
      return false;
    }
  }
  return true;
}

std::optional<UsmUser> V3Principal(const SnmpPdu& notification, const NotificationTarget& target,
                                   V3Refusal* refusal) {
  if (!IsValidContext(target.contextName)) {
    LOG_ERROR("The Context name is not valid !!!\n");
    *refusal = V3Refusal::kUnknownContext;
    return std::nullopt;
  }
  std::optional<UsmUser> user = GetUsmEntry(EngineId(), target.userName);
  if (!user) {
    LOG_ERROR("User %s is not configured in USM Table.!!!\n", target.userName.c_str());
    *refusal = V3Refusal::kUnknownUser;
    return std::nullopt;
  }
  if (!NotifyViewAllows(notification, target.contextName, user->securityName,
                        user->securityLevel)) {
    LOG_ERROR("User %s don't have the access to receive this trap !!!\n", target.userName.c_str());
    *refusal = V3Refusal::kNotInView;
    return std::nullopt;
  }
  return user;
}

std::vector<std::uint8_t> EncodeV3Trap(const SnmpPdu& notification,
                                       const NotificationTarget& target, const AgentSession& device,
                                       V3Refusal* refusal) {
  std::optional<UsmUser> user = V3Principal(notification, target, refusal);
  if (!user) return {};
  V3Envelope envelope;
  envelope.msgId = notification.requestId;
  envelope.msgMaxSize = static_cast<std::int32_t>(kMaxSnmpMessage);
  envelope.level = user->securityLevel;
  envelope.engineId = AgentEngineId(device);
  envelope.boots = device.agentInfo->engineBoots.load();
  envelope.time = AgentEngineTime(device);
  envelope.userName = user->userName;
  if (envelope.level != kNoAuthNoPriv) {
    envelope.auth = user->auth;
    envelope.authKey = GetLocalKeyValue(user->authPassword, user->auth, envelope.engineId);
  }
  if (envelope.level == kAuthPriv) {
    envelope.priv = user->priv;
    envelope.privKey = GetLocalKeyValue(user->privPassword, user->auth, envelope.engineId);
  }
  envelope.contextEngineId = envelope.engineId;
  envelope.contextName = target.contextName;
  std::vector<std::uint8_t> pdu = EncodeNotificationPdu(notification);
  std::vector<std::uint8_t> message(kMaxSnmpMessage);
  std::size_t length = message.size();
  if (pdu.empty() || !EncodeV3Message(envelope, pdu.data(), pdu.size(), message.data(), &length)) {
    LOG_ERROR("Error while sending v3 traps\n");
    *refusal = V3Refusal::kNotEncoded;
    return {};
  }
  message.resize(length);
  return message;
}

}  // namespace tessel
