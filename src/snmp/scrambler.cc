#include "snmp/scrambler.h"

#include <new>

#include "base/conversions.h"
#include "engine/host_bridge.h"
#include "engine/log.h"
#include "snmp/value_text.h"

namespace tessel {
namespace {

// The enterprise OID as the scrambler is shown it: without its last two sub-identifiers.
std::string OidFieldText(const Oid& enterprise) {
  if (enterprise.size() <= 2) return {};
  return OidToText(std::span<const std::uint32_t>(enterprise.data(), enterprise.size() - 2));
}

ScrambleQuery QueryFor(const SnmpPdu& pdu, const AgentSession& agent, bool isResponse) {
  LOG_TRACE("Setting the vector for %s message\n", isResponse ? "Response" : "Received");
  ScrambleQuery query;
  query.version = pdu.version;
  query.community = pdu.community;
  for (const VarBind& binding : isResponse ? pdu.responseVarBinds : pdu.requestVarBinds) {
    query.oids.push_back(OidToText(binding.name));
    query.values.push_back(VarValueToText(binding.value.type, binding.value));
  }
  query.requestId = pdu.requestId;
  query.pduType = pdu.type;
  query.errorStatus = pdu.errorStatus;
  query.errorIndex = pdu.errorIndex;
  query.oidField = OidFieldText(pdu.enterprise);
  query.timeout = pdu.timeout;
  query.retries = pdu.retries;
  query.agentAddress = agent.transport.localAddress;
  query.agentPort = static_cast<std::int32_t>(agent.transport.configuredPortMinusOne) - 1;
  query.managerAddress = agent.transport.peerAddress;
  query.isResponse = isResponse;
  return query;
}

// Applies changes to pdu; false (pdu untouched) when the OID the host gave is not an OID.
bool Apply(const ScrambleChanges& changes, SnmpPdu* pdu) {
  Oid enterprise = pdu->enterprise;
  if (changes.oidField) {
    std::string dotted = changes.oidField->empty() || changes.oidField->front() != '.'
                             ? "." + *changes.oidField
                             : *changes.oidField;
    if (ParseDottedText(&enterprise, dotted, false) <= 0) {
      LOG_ERROR("Converting OID to String failed ");
      return false;
    }
  }
  pdu->enterprise = std::move(enterprise);
  if (changes.errorStatus) pdu->errorStatus = *changes.errorStatus;
  if (changes.errorIndex) pdu->errorIndex = *changes.errorIndex;
  if (changes.requestId) pdu->requestId = *changes.requestId;
  if (changes.pduType) pdu->type = *changes.pduType;
  if (changes.community) pdu->community = *changes.community;
  if (changes.timeout) pdu->timeout = *changes.timeout;
  if (changes.retries) pdu->retries = *changes.retries;
  return true;
}

}  // namespace

void ScrambleThePdu(SnmpPdu* pdu, const AgentSession& agent, bool isResponse) {
  HostBridge* host = InstalledHost();
  if (host == nullptr) return;
  try {
    std::optional<ScrambleChanges> changes = host->ScramblePDU(QueryFor(*pdu, agent, isResponse));
    if (!changes) {
      LOG_ERROR("Return PDU from scrambler is NULL!!\n");
      return;
    }
    Apply(*changes, pdu);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("unable to alloc memory \n");
  }
}

}  // namespace tessel
