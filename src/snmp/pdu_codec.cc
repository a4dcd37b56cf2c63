#include "snmp/pdu_codec.h"

#include <cstring>

#include "engine/log.h"
#include "snmp/ber.h"
#include "snmp/message.h"
#include "snmp/pdu_dump.h"
#include "snmp/statistics.h"

namespace tessel {
namespace {

constexpr std::size_t kReservedHeader = 4;  // AsnBuildSequence's fixed form

void CountIncoming(std::uint8_t type, std::int32_t version) {
  static constexpr SnmpCounter kAllVersions[] = {
      SnmpCounter::kInGetRequests, SnmpCounter::kInGetNexts, SnmpCounter::kCount,
      SnmpCounter::kInSetRequests, SnmpCounter::kCount,      SnmpCounter::kInGetBulks};
  static constexpr SnmpCounter kV1[] = {SnmpCounter::kV1GetRequests, SnmpCounter::kV1GetNexts,
                                        SnmpCounter::kCount,         SnmpCounter::kV1SetRequests,
                                        SnmpCounter::kCount,         SnmpCounter::kCount};
  static constexpr SnmpCounter kV2[] = {SnmpCounter::kV2GetRequests, SnmpCounter::kV2GetNexts,
                                        SnmpCounter::kCount,         SnmpCounter::kV2SetRequests,
                                        SnmpCounter::kCount,         SnmpCounter::kV2GetBulks};
  static constexpr SnmpCounter kV3[] = {SnmpCounter::kV3GetRequests, SnmpCounter::kV3GetNexts,
                                        SnmpCounter::kCount,         SnmpCounter::kV3SetRequests,
                                        SnmpCounter::kCount,         SnmpCounter::kV3GetBulks};
  if (type == kTrapV1 || type == kTrapV2) return;
  const SnmpCounter* byVersion = version == kSnmpV1 ? kV1 : version == kSnmpV2c ? kV2 : kV3;
  CountSnmp(version == kSnmpV1    ? SnmpCounter::kV1Requests
            : version == kSnmpV2c ? SnmpCounter::kV2Requests
                                  : SnmpCounter::kV3Requests);
  if (type < kGetRequest || type > kGetBulkRequest) return;
  std::size_t slot = type - kGetRequest;
  if (kAllVersions[slot] != SnmpCounter::kCount) CountSnmp(kAllVersions[slot]);
  if (byVersion[slot] != SnmpCounter::kCount) CountSnmp(byVersion[slot]);
}

// The binding list: a SEQUENCE that exactly fills the rest of the PDU.
ParseResult ParsePdu(SnmpPdu* pdu, const std::uint8_t* data, std::int32_t remaining,
                     PduLayout* layout) {
  std::int32_t listLength = remaining;
  std::uint8_t type = 0;
  const std::uint8_t* cursor = AsnParseHeader(data, &listLength, &type);
  if (cursor == nullptr || type != kAsnSequence || (cursor - data) + listLength != remaining) {
    LOG_ERROR("not enough space for varlist");
    return ParseResult::kMalformed;
  }
  layout->bindings = data;
  layout->bindingsLength = static_cast<std::size_t>(remaining);
  const std::uint8_t* listEnd = cursor + listLength;
  std::uint32_t index = 0;
  while (listLength > 0) {
    VarBind binding;
    std::uint32_t name[kMaxOidLength];
    std::size_t nameLength = kMaxOidLength;
    std::size_t valueLength = 0;
    const std::uint8_t* value = nullptr;
    cursor = ParseVarOp(cursor, name, &nameLength, &binding.value.type, &valueLength, &value,
                        &listLength);
    if (cursor == nullptr) {
      LOG_ERROR("Unable to parse the varbind #%u\n", index + 1);
      return ParseResult::kMalformed;
    }
    std::int32_t valueRemaining = static_cast<std::int32_t>(listEnd - value);
    std::uint8_t valueType = 0;
    const std::uint8_t* contents = AsnParseHeader(value, &valueRemaining, &valueType);
    if (contents == nullptr ||
        !DecodeAsnSyntaxValue(valueType, contents, valueLength, &binding.value)) {
      LOG_ERROR("Unable to parse the varbind #%u\n", index + 1);
      return ParseResult::kMalformed;
    }
    binding.name.assign(name, name + nameLength);
    binding.index = ++index;
    binding.state = kVarBindPending;
    pdu->requestVarBinds.push_back(std::move(binding));
  }
  pdu->varBindCount = static_cast<std::int32_t>(index);
  return ParseResult::kParsed;
}

// PDU header, request-id, error-status, error-index and the bindings.
}  // namespace

ParseResult ParseSnmpPdu(const std::uint8_t* start, const std::uint8_t* data,
                         std::int32_t remaining, SnmpPdu* pdu, PduLayout* layout,
                         bool countIncoming) {
  std::int32_t pduLength = remaining;
  const std::uint8_t* cursor = AsnParseHeader(data, &pduLength, &pdu->type);
  if (cursor == nullptr) {
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return ParseResult::kDropped;
  }
  layout->pduTypeOffset = static_cast<std::size_t>(data - start);
  pdu->requestType = pdu->type;
  if (countIncoming) CountIncoming(pdu->type, pdu->version);
  if (pdu->type == kTrapV1 || pdu->type == kTrapV2) {
    CountSnmp(SnmpCounter::kInTraps);
    LOG_ERROR("\n\nSince trap message has been received packet is dropped.\n");
    return ParseResult::kDropped;
  }
  std::uint8_t type = 0;
  struct Field {
    std::int32_t* target;
    const char* failure;
  } fields[] = {{&pdu->requestId, "Unable to decode reqid\n"},
                {&pdu->errorStatus, "Unable to decode errstatus\n"},
                {&pdu->errorIndex, "Unable to decode errindex\n"}};
  for (const Field& field : fields) {
    cursor = AsnParseInt(cursor, &pduLength, &type, field.target);
    if (cursor == nullptr || type != kAsnInteger) {
      LOG_ERROR("%s", field.failure);
      return ParseResult::kMalformed;
    }
  }
  return ParsePdu(pdu, cursor, pduLength, layout);
}

namespace {

void CountAnswered(const SnmpPdu& pdu) {
  auto answered = static_cast<std::uint32_t>(pdu.responseVarBinds.size());
  if (pdu.requestType == kSetRequest) {
    CountSnmp(SnmpCounter::kSetVarsAnswered, answered);
  } else {
    CountSnmp(SnmpCounter::kGetVarsAnswered, answered);
  }
}

// Runs the request through PDU processing; the reply's error status, or -1/99.
std::int32_t Dispatch(SnmpPdu* pdu, const AgentSession& agent, const SecurityAccess* access) {
  if (pdu->type == kGetBulkRequest) return ProcessGetBulkVarBinds(pdu, agent, access);
  return ProcessPDU(pdu, agent, access);
}

// The PDU header and its three integers, then the binding list header reserved.
std::uint8_t* BuildPduPrefix(std::uint8_t* cursor, std::int32_t* remaining, const SnmpPdu& pdu) {
  cursor = AsnBuildSequence(cursor, remaining, pdu.type, 0);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, pdu.requestId);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, pdu.errorStatus);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, pdu.errorIndex);
  if (cursor == nullptr) LOG_ERROR("Unable to encode response PDU with reqId\n");
  return cursor;
}

// The response bindings; nullptr when one does not fit (a bulk reply is trimmed at its end
// instead).
std::uint8_t* BuildAnswerPdu(std::uint8_t* cursor, std::int32_t* remaining, const SnmpPdu& pdu) {
  std::uint8_t* start = cursor;
  cursor = BuildPduPrefix(cursor, remaining, pdu);
  std::uint8_t* list = cursor;
  if (cursor) cursor = AsnBuildSequence(cursor, remaining, kAsnSequence, 0);
  const VarBindList& bindings =
      pdu.type == kGetResponse ? pdu.responseVarBinds : pdu.requestVarBinds;
  for (const VarBind& binding : bindings) {
    if (cursor == nullptr) break;
    std::uint8_t* next =
        BuildVarOp(cursor, binding.name.data(), binding.name.size(), binding.value, remaining);
    if (next == nullptr) {
      if (pdu.requestType == kGetBulkRequest) break;
      LOG_ERROR("\n 1. Too big respone PDU\n");
      return nullptr;
    }
    cursor = next;
  }
  if (cursor == nullptr || !FillHeader(list, kAsnSequence, cursor) ||
      !FillHeader(start, pdu.type, cursor)) {
    return nullptr;
  }
  return cursor;
}

// The reply to a request that failed: the request's bindings (or, for tooBig beyond SNMPv1, an
// empty list) under the final error status and index.
std::uint8_t* CreateIdenticalPDU(std::uint8_t* cursor, std::int32_t* remaining, const SnmpPdu& pdu,
                                 const PduLayout& request) {
  std::uint8_t* start = cursor;
  cursor = BuildPduPrefix(cursor, remaining, pdu);
  if (cursor == nullptr) return nullptr;
  bool emptyList =
      (pdu.errorStatus == kTooBig && pdu.version != kSnmpV1) || request.bindings == nullptr;
  if (emptyList) {
    cursor = AsnBuildSequence(cursor, remaining, kAsnSequence, 0);
  } else if (request.bindingsLength <= static_cast<std::size_t>(*remaining)) {
    std::memcpy(cursor, request.bindings, request.bindingsLength);
    cursor += request.bindingsLength;
    *remaining -= static_cast<std::int32_t>(request.bindingsLength);
  } else {
    cursor = nullptr;
  }
  if (cursor == nullptr || !FillHeader(start, pdu.type, cursor)) {
    LOG_ERROR("CreateIdenticalPDU is failed...\n");
    return nullptr;
  }
  return cursor;
}

}  // namespace

bool FillHeader(std::uint8_t* header, std::uint8_t type, const std::uint8_t* end) {
  std::int32_t space = static_cast<std::int32_t>(kReservedHeader);
  std::size_t contents = static_cast<std::size_t>(end - header) - kReservedHeader;
  return AsnBuildSequence(header, &space, type, contents) != nullptr;
}

void CountErrorStatus(std::int32_t status) {
  switch (status) {
    case kTooBig:
      CountSnmp(SnmpCounter::kOutTooBigs);
      break;
    case kNoSuchName:
      CountSnmp(SnmpCounter::kOutNoSuchNames);
      break;
    case kBadValue:
      CountSnmp(SnmpCounter::kOutBadValues);
      break;
    case kGenErr:
      CountSnmp(SnmpCounter::kOutGenErrs);
      break;
    default:
      break;
  }
}

RequestOutcome ProcessRequestPdu(SnmpPdu* pdu, const AgentSession& agent,
                                 const SecurityAccess* access) {
  switch (pdu->type) {
    case kInformRequest:
      DumpPdu(*pdu);
      return RequestOutcome::kEchoInform;
    case kGetResponse:
    case kReport:
      LOG_TRACE("No inform is outstanding: the response is dropped\n");
      return RequestOutcome::kDrop;
    case kGetBulkRequest:
      if (pdu->version == kSnmpV1) {
        LOG_ERROR("GetBulk in an SNMPv1 message, dropped\n");
        return RequestOutcome::kDrop;
      }
      break;
    case kGetRequest:
    case kGetNextRequest:
    case kSetRequest:
      break;
    default:
      LOG_ERROR("Unknown PDU type 0x%02x\n", pdu->type);
      CountSnmp(SnmpCounter::kAsnParseErrors);
      return RequestOutcome::kDrop;
  }
  DumpPdu(*pdu);
  std::int32_t status = Dispatch(pdu, agent, access);
  if (status == kResourceFailure) {
    LOG_ERROR("PACKET DROPPED !!! \n");
    return RequestOutcome::kResourceFailure;
  }
  if (status < 0) {
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return RequestOutcome::kDrop;
  }
  if (pdu->errorStatus != 0) {
    RecordErrorLog(pdu->requestId, pdu->requestType, pdu->version, pdu->errorStatus,
                   agent.transport.peerAddress);
  } else {
    CountAnswered(*pdu);
  }
  pdu->type = kGetResponse;
  DumpPdu(*pdu);
  return RequestOutcome::kReply;
}

std::uint8_t* BuildResponsePdu(std::uint8_t* cursor, std::int32_t* remaining, SnmpPdu* pdu,
                               const PduLayout& request) {
  std::int32_t available = *remaining;
  if (pdu->errorStatus == kNoError) {
    std::uint8_t* end = BuildAnswerPdu(cursor, remaining, *pdu);
    if (end) return end;
    pdu->errorStatus = kTooBig;
    pdu->errorIndex = 0;
    *remaining = available;
  }
  if (pdu->version == kSnmpV1) pdu->errorStatus = MapErrorStatusToV1(pdu->errorStatus);
  return CreateIdenticalPDU(cursor, remaining, *pdu, request);
}

}  // namespace tessel
