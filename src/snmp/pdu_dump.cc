#include "snmp/pdu_dump.h"

#include "engine/log.h"
#include "snmp/value_text.h"

namespace tessel {

const char* const kDumpDashes =
    "-----------------------------------------------------------------------------------------\n";

namespace {

const char* CommandName(std::uint8_t type) {
  switch (type) {
    case kGetRequest:
      return "GET REQUEST";
    case kGetNextRequest:
      return "GETNEXT REQUEST";
    case kGetBulkRequest:
      return "GETBULK REQUEST";
    case kSetRequest:
      return "SET REQUEST";
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

// A Response built by the agent carries its answers apart from the request's bindings, unless
// the request failed and the reply echoes them.
const VarBindList& ShownBindings(const SnmpPdu& pdu) {
  bool answers = pdu.type == kGetResponse && pdu.requestType != kGetResponse &&
                 pdu.errorStatus == kNoError && !pdu.responseVarBinds.empty();
  return answers ? pdu.responseVarBinds : pdu.requestVarBinds;
}

}  // namespace

const char* VarBindTypeName(std::uint8_t type) {
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

std::string VarBindValueText(const VarValue& value) {
  if (value.type == kAsnNull || IsExceptionType(value.type)) return "";
  return VarValueToText(value.type, value).value_or("");
}

void DumpPdu(const SnmpPdu& pdu) {
  if (!LogEnabled(kLogInfo)) return;
  LogWrite("%s", kDumpDashes);
  if (pdu.type == kGetResponse) {
    LogWrite("\t\t\t\tResponse Message Start \t\t\n");
  } else if (!IsTrap(pdu.type)) {
    LogWrite("\t\t\t\tRequest Message Start\t\t\n");
  }
  LogWrite("%s", kDumpDashes);
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
  for (const VarBind& binding : ShownBindings(pdu)) {
    LogWrite("%s\t%s\t%s\n", OidToText(binding.name).c_str(), VarBindTypeName(binding.value.type),
             VarBindValueText(binding.value).c_str());
  }
  LogWrite("%s", kDumpDashes);
  LogWrite(pdu.type == kGetResponse ? "\t\t\t\tResponse Message End \t\t\n"
           : IsTrap(pdu.type)       ? "\t\t\t\tTrap Message End\t\t\n"
                                    : "\t\t\t\tRequest Message End\t\t\n");
  LogWrite("%s\n\n", kDumpDashes);
}

}  // namespace tessel
