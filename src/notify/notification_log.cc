#include "notify/notification_log.h"

#include "engine/log.h"
#include "snmp/pdu_dump.h"
#include "snmp/value_text.h"

namespace tessel {

void DumpNotification(const NotificationTarget& target, const SnmpPdu& pdu) {
  if (!LogEnabled(kLogInfo)) return;
  LogWrite("\t\t\t\tTrap Message Start \t\t\n");
  LogWrite("%s", kDumpDashes);
  LogWrite("User Name\t\t\t= %s\n", target.userName.c_str());
  LogWrite("Security Model\t\t= %d\n", target.version == kSnmpV3 ? 3 : target.version + 1);
  LogWrite("Context Name\t\t\t= %s\n", target.contextName.c_str());
  LogWrite("Manager Address\t\t= %s\n", target.managerAddress.c_str());
  LogWrite("Manager Port Num\t\t= %d\n", target.managerPort);
  DumpPdu(pdu);
}

void BindingsToHostTexts(const VarBindList& bindings, InformReport* report) {
  for (const VarBind& binding : bindings) {
    report->oids.push_back(OidToText(binding.name));
    report->types.push_back(VarBindTypeName(binding.value.type));
    report->values.push_back(VarBindValueText(binding.value));
  }
}

}  // namespace tessel
