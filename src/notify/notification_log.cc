#include "notify/notification_log.h"

#include "engine/log.h"
#include "snmp/value_text.h"

namespace tessel {
namespace {

const char* const kDashes =
    "-----------------------------------------------------------------------------------------\n";

const char* CommandName(std::uint8_t type) {
  switch (type) {
    case kGetResponse:
      return "GET RESPONSE";
    case kTrapV1:
      return "TRAP";
    case kInformRequest:
      return "INFORM REQUEST";
    case kTrapV2:
      return "SNMPv2 TRAP";
    default:
      return "REQUEST";
  }
}

const char* VersionName(std::int32_t version) {
  return version == kSnmpV1 ? "v1" : version == kSnmpV2c ? "v2c" : "v3";
}

bool IsTrap(std::uint8_t type) { return type == kTrapV1 || type == kTrapV2; }

const char* TypeName(std::uint8_t type) {
  switch (type) {
    case kAsnInteger:
      return "Integer";
    case kAsnObjectId:
      return "ObjectId";
    case kAsnIpAddress:
      return "IpAddress";
    case kAsnCounter:
      return "Counter";
    case kAsnGauge:
      return "Gauge";
    case kAsnTimeTicks:
      return "TimeTicks";
    case kAsnUInteger32:
      return "UInteger";
    default:
      return "OCTET STRING";
  }
}

std::string ValueText(const VarValue& value) {
  if (value.type == kAsnNull || IsExceptionType(value.type)) return "";
  return VarValueToText(value.type, value).value_or("");
}

}  // namespace

void DumpPdu(const SnmpPdu& pdu) {
  if (!LogEnabled(kLogInfo)) return;
  LogWrite("%s", kDashes);
  if (pdu.type == kGetResponse) {
    LogWrite("\t\t\t\tResponse Message Start \t\t\n");
  } else if (!IsTrap(pdu.type)) {
    LogWrite("\t\t\t\tRequest Message Start\t\t\n");
  }
  LogWrite("%s", kDashes);
  LogWrite("Request Id\t\t\t= %d\n", pdu.requestId);
  LogWrite("Version \t\t\t= %s\n", VersionName(pdu.version));
  if (!pdu.community.empty()) LogWrite("Community\t\t\t= %s\n", pdu.community.c_str());
  LogWrite("Command\t\t\t\t= %s\n", CommandName(pdu.type));
  LogWrite("Error Index\t\t\t= %d\n", pdu.errorIndex);
  LogWrite("Error Status\t\t\t= %d\n", pdu.errorStatus);
  if (IsTrap(pdu.type)) {
    LogWrite("Generic Trap Type\t= %d\n", pdu.genericTrap);
    LogWrite("Specific Trap Type\t= %d\n", pdu.specificTrap);
    LogWrite("Enterprise OID\t= %s\n", OidToText(pdu.enterprise).c_str());
  }
  for (const VarBind& binding : pdu.requestVarBinds) {
    LogWrite("%s\t%s\t%s\n", OidToText(binding.name).c_str(), TypeName(binding.value.type),
             ValueText(binding.value).c_str());
  }
  LogWrite("%s", kDashes);
  LogWrite(pdu.type == kGetResponse ? "\t\t\t\tResponse Message End \t\t\n"
           : IsTrap(pdu.type)       ? "\t\t\t\tTrap Message End\t\t\n"
                                    : "\t\t\t\tRequest Message End\t\t\n");
  LogWrite("%s\n\n", kDashes);
}

void DumpNotification(const NotificationTarget& target, const SnmpPdu& pdu) {
  if (!LogEnabled(kLogInfo)) return;
  LogWrite("\t\t\t\tTrap Message Start \t\t\n");
  LogWrite("%s", kDashes);
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
    report->types.push_back(TypeName(binding.value.type));
    report->values.push_back(ValueText(binding.value));
  }
}

}  // namespace tessel
