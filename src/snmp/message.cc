#include "snmp/message.h"

#include <cstring>
#include <new>

#include "engine/engine_state.h"
#include "engine/log.h"
#include "snmp/ber.h"
#include "snmp/pdu_processing.h"
#include "snmp/statistics.h"

namespace tessel {
namespace {

constexpr std::size_t kMaxCommunity = 256;
constexpr std::size_t kReservedHeader = 4;  // AsnBuildSequence's fixed form

// Where the parts of a received message lie, for replies that repeat them.
struct MessageLayout {
  std::size_t pduTypeOffset = 0;
  const std::uint8_t* bindings = nullptr;  // the binding list TLV as received
  std::size_t bindingsLength = 0;
};

// Outcome of parsing: the drop reasons are counted where they are found.
enum class ParseResult { kParsed, kDropped, kMalformed };

void CountIncoming(std::uint8_t type, std::int32_t version) {
  static constexpr SnmpCounter kAllVersions[] = {SnmpCounter::kInGetRequests, SnmpCounter::kInGetNexts,
                                                 SnmpCounter::kCount, SnmpCounter::kInSetRequests,
                                                 SnmpCounter::kCount, SnmpCounter::kInGetBulks};
  static constexpr SnmpCounter kV1[] = {SnmpCounter::kV1GetRequests, SnmpCounter::kV1GetNexts,
                                        SnmpCounter::kCount, SnmpCounter::kV1SetRequests,
                                        SnmpCounter::kCount, SnmpCounter::kCount};
  static constexpr SnmpCounter kV2[] = {SnmpCounter::kV2GetRequests, SnmpCounter::kV2GetNexts,
                                        SnmpCounter::kCount, SnmpCounter::kV2SetRequests,
                                        SnmpCounter::kCount, SnmpCounter::kV2GetBulks};
  static constexpr SnmpCounter kV3[] = {SnmpCounter::kV3GetRequests, SnmpCounter::kV3GetNexts,
                                        SnmpCounter::kCount, SnmpCounter::kV3SetRequests,
                                        SnmpCounter::kCount, SnmpCounter::kV3GetBulks};
  if (type == kTrapV1 || type == kTrapV2) return;
  const SnmpCounter* byVersion = version == kSnmpV1 ? kV1 : version == kSnmpV2c ? kV2 : kV3;
  CountSnmp(version == kSnmpV1 ? SnmpCounter::kV1Requests
            : version == kSnmpV2c ? SnmpCounter::kV2Requests
                                  : SnmpCounter::kV3Requests);
  if (type < kGetRequest || type > kGetBulkRequest) return;
  std::size_t slot = type - kGetRequest;
  if (kAllVersions[slot] != SnmpCounter::kCount) CountSnmp(kAllVersions[slot]);
  if (byVersion[slot] != SnmpCounter::kCount) CountSnmp(byVersion[slot]);
}

// The binding list: a SEQUENCE that exactly fills the rest of the PDU.
ParseResult ParsePdu(SnmpPdu* pdu, const std::uint8_t* data, std::int32_t remaining, MessageLayout* layout) {
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
    cursor = ParseVarOp(cursor, name, &nameLength, &binding.value.type, &valueLength, &value, &listLength);
    if (cursor == nullptr) {
      LOG_ERROR("Unable to parse the varbind #%u\n", index + 1);
      return ParseResult::kMalformed;
    }
    std::int32_t valueRemaining = static_cast<std::int32_t>(listEnd - value);
    std::uint8_t valueType = 0;
    const std::uint8_t* contents = AsnParseHeader(value, &valueRemaining, &valueType);
    if (contents == nullptr || !DecodeAsnSyntaxValue(valueType, contents, valueLength, &binding.value)) {
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
ParseResult ParseSnmpPdu(const std::uint8_t* start, const std::uint8_t* data, std::int32_t remaining,
                         SnmpPdu* pdu, MessageLayout* layout, bool countIncoming) {
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

// Version, then (v1/v2c) the community. Refusals count a bad version.
ParseResult ParseVersionAndCommunity(const std::uint8_t** cursor, std::int32_t* remaining, SnmpPdu* pdu) {
  std::uint8_t type = 0;
  *cursor = AsnParseInt(*cursor, remaining, &type, &pdu->version);
  if (*cursor == nullptr || type != kAsnInteger) {
    LOG_ERROR("Unable to decode version\n");
    CountSnmp(SnmpCounter::kBadVersions);
    return ParseResult::kDropped;
  }
  bool v3Configured = gv_snmpv3Configured.load();
  const char* refusal = nullptr;
  if (pdu->version == kSnmpV3 && !v3Configured) {
    refusal = "Since agent is not v3, dropping v3 packet \n";
  } else if (v3Configured && gv_dropV1V2Requests.load() && pdu->version <= kSnmpV2c) {
    refusal = "Since agent is v3, drop v1 or v2c packet \n";
  } else if (!v3Configured && gv_processV1Only.load() && pdu->version >= kSnmpV2c) {
    refusal = "Since agent is v1, drop v3 or v2c packet \n";
  } else if (!v3Configured && gv_processV2Only.load() && pdu->version != kSnmpV2c) {
    refusal = "Since agent is supporting v2 alone, drop v1 or v3 packets \n";
  } else if (pdu->version != kSnmpV1 && pdu->version != kSnmpV2c) {
    refusal = "Version is not a SNMP_V1 or SNMP_V2C\n";
  }
  if (refusal) {
    LOG_ERROR("%s", refusal);
    CountSnmp(SnmpCounter::kBadVersions);
    return ParseResult::kDropped;
  }
  std::uint8_t community[kMaxCommunity];
  std::size_t communityLength = sizeof community;
  *cursor = AsnParseString(*cursor, remaining, &type, community, &communityLength);
  if (*cursor == nullptr || type != kAsnOctetString) {
    LOG_ERROR("Unable to decode community \n");
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return ParseResult::kDropped;
  }
  pdu->community.assign(reinterpret_cast<const char*>(community), communityLength);
  return ParseResult::kParsed;
}

// countIncoming: a received request updates the incoming statistics; a message the engine only
// inspects does not.
ParseResult ParseMessage(const std::uint8_t* message, std::size_t length, SnmpPdu* pdu, MessageLayout* layout,
                         bool countIncoming) {
  std::int32_t remaining = static_cast<std::int32_t>(length);
  std::uint8_t type = 0;
  const std::uint8_t* cursor = length > 0 ? AsnParseHeader(message, &remaining, &type) : nullptr;
  if (cursor == nullptr) {
    LOG_ERROR("Unable to decode header\n");
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return ParseResult::kDropped;
  }
  if (type != kAsnSequence) {
    LOG_ERROR("Unable to decode auth header type\n");
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return ParseResult::kDropped;
  }
  ParseResult result = ParseVersionAndCommunity(&cursor, &remaining, pdu);
  if (result != ParseResult::kParsed) return result;
  return ParseSnmpPdu(message, cursor, remaining, pdu, layout, countIncoming);
}

bool IsValidAuthentication(const SnmpPdu& pdu, const AgentInfo& agent) {
  const CommunityList& allowed = pdu.type == kSetRequest ? agent.writeCommunities : agent.readCommunities;
  if (allowed.Contains(pdu.community)) {
    LOG_TRACE("The community string matches");
    return true;
  }
  const CommunityList& other = pdu.type == kSetRequest ? agent.readCommunities : agent.writeCommunities;
  if (other.Contains(pdu.community)) CountSnmp(SnmpCounter::kBadCommunityUses);
  CountSnmp(SnmpCounter::kBadCommunityNames);
  LOG_ERROR("Authentication failed !!!!\n");
  return false;
}

void CountErrorStatus(std::int32_t status) {
  switch (status) {
    case kTooBig: CountSnmp(SnmpCounter::kOutTooBigs); break;
    case kNoSuchName: CountSnmp(SnmpCounter::kOutNoSuchNames); break;
    case kBadValue: CountSnmp(SnmpCounter::kOutBadValues); break;
    case kGenErr: CountSnmp(SnmpCounter::kOutGenErrs); break;
    default: break;
  }
}

void CountAnswered(const SnmpPdu& pdu) {
  auto answered = static_cast<std::uint32_t>(pdu.responseVarBinds.size());
  if (pdu.requestType == kSetRequest) {
    CountSnmp(SnmpCounter::kSetVarsAnswered, answered);
  } else {
    CountSnmp(SnmpCounter::kGetVarsAnswered, answered);
  }
}

// An InformRequest is acknowledged by the same message as a Response.
int AnswerInform(const std::uint8_t* message, std::size_t length, const MessageLayout& layout,
                 std::uint8_t* reply, std::size_t* replyLength) {
  if (length > *replyLength) return kMessageDrop;
  std::memcpy(reply, message, length);
  reply[layout.pduTypeOffset] = kGetResponse;
  *replyLength = length;
  return kMessageReply;
}

// Runs the request through PDU processing; the reply's error status, or -1/99.
std::int32_t Dispatch(SnmpPdu* pdu, const AgentSession& agent) {
  if (pdu->type == kGetBulkRequest) return ProcessGetBulkVarBinds(pdu, agent);
  return ProcessPDU(pdu, agent);
}

int ProcessParsedRequest(const std::uint8_t* message, std::size_t length, const MessageLayout& layout,
                         SnmpPdu* pdu, std::uint8_t* reply, std::size_t* replyLength,
                         const AgentSession& agent) {
  if (!IsValidAuthentication(*pdu, *agent.agentInfo)) return kMessageDrop;
  switch (pdu->type) {
    case kInformRequest:
      return AnswerInform(message, length, layout, reply, replyLength);
    case kGetResponse:
    case kReport:
      LOG_TRACE("No inform is outstanding: the response is dropped\n");
      return kMessageDrop;
    case kGetBulkRequest:
      if (pdu->version == kSnmpV1) {
        LOG_ERROR("GetBulk in an SNMPv1 message, dropped\n");
        return kMessageDrop;
      }
      break;
    case kGetRequest:
    case kGetNextRequest:
    case kSetRequest:
      break;
    default:
      LOG_ERROR("Unknown PDU type 0x%02x\n", pdu->type);
      CountSnmp(SnmpCounter::kAsnParseErrors);
      return kMessageDrop;
  }
  std::int32_t status = Dispatch(pdu, agent);
  if (status == kResourceFailure) {
    LOG_ERROR("PACKET DROPPED !!! \n");
    return kResourceFailure;
  }
  if (status < 0) {
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return kMessageDrop;
  }
  if (pdu->errorStatus != 0) {
    RecordErrorLog(pdu->requestId, pdu->requestType, pdu->version, pdu->errorStatus,
                   agent.transport.peerAddress);
  } else {
    CountAnswered(*pdu);
  }
  pdu->type = kGetResponse;
  if (!CreateSnmpMessage(layout.bindings, layout.bindingsLength, reply, replyLength, pdu)) {
    return kMessageDrop;
  }
  CountErrorStatus(pdu->errorStatus);
  return kMessageReply;
}

// Writes the message, PDU and binding list headers around the built contents.
struct BuildLayout {
  std::uint8_t* message = nullptr;
  std::uint8_t* pdu = nullptr;
  std::uint8_t* bindings = nullptr;
};

bool FillHeader(std::uint8_t* header, std::uint8_t type, const std::uint8_t* end) {
  std::int32_t space = static_cast<std::int32_t>(kReservedHeader);
  std::size_t contents = static_cast<std::size_t>(end - header) - kReservedHeader;
  return AsnBuildSequence(header, &space, type, contents) != nullptr;
}

// Version, community and the PDU fields up to the binding list header.
std::uint8_t* BuildPrefix(std::uint8_t* buffer, std::int32_t* remaining, const SnmpPdu& pdu,
                          std::int32_t errorStatus, std::int32_t errorIndex, BuildLayout* layout) {
  std::uint8_t* cursor = buffer;
  layout->message = cursor;
  cursor = AsnBuildSequence(cursor, remaining, kAsnSequence, 0);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, pdu.version);
  if (cursor) {
    cursor = AsnBuildString(cursor, remaining, kAsnOctetString,
                            reinterpret_cast<const std::uint8_t*>(pdu.community.data()), pdu.community.size());
  }
  if (cursor == nullptr) {
    LOG_ERROR("Unable to encode SNMP message length and sequnce type. !!!\n");
    return nullptr;
  }
  layout->pdu = cursor;
  cursor = AsnBuildSequence(cursor, remaining, pdu.type, 0);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, pdu.requestId);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, errorStatus);
  if (cursor) cursor = AsnBuildInt(cursor, remaining, kAsnInteger, errorIndex);
  if (cursor == nullptr) {
    LOG_ERROR("Unable to encode response PDU with reqId\n");
    return nullptr;
  }
  layout->bindings = cursor;
  return cursor;
}

bool FinishMessage(const BuildLayout& layout, const std::uint8_t* end, std::size_t* replyLength) {
  if (!FillHeader(layout.bindings, kAsnSequence, end) || !FillHeader(layout.pdu, layout.pdu[0], end) ||
      !FillHeader(layout.message, kAsnSequence, end)) {
    LOG_ERROR("Unable to encode message header.\n");
    return false;
  }
  *replyLength = static_cast<std::size_t>(end - layout.message);
  return true;
}

// The reply to a request that failed: the request's bindings (or, for tooBig beyond SNMPv1, an
// empty list) under the final error status and index.
bool CreateIdenticalPDU(const std::uint8_t* requestBindings, std::size_t requestBindingsLength,
                        std::uint8_t* reply, std::size_t* replyLength, const SnmpPdu& pdu) {
  std::int32_t remaining = static_cast<std::int32_t>(*replyLength);
  BuildLayout layout;
  std::int32_t status = pdu.version == kSnmpV1 ? MapErrorStatusToV1(pdu.errorStatus) : pdu.errorStatus;
  std::uint8_t* cursor = BuildPrefix(reply, &remaining, pdu, status, pdu.errorIndex, &layout);
  if (cursor == nullptr) return false;
  bool emptyList = pdu.errorStatus == kTooBig && pdu.version != kSnmpV1;
  if (emptyList || requestBindings == nullptr) {
    cursor = AsnBuildSequence(cursor, &remaining, kAsnSequence, 0);
  } else if (requestBindingsLength <= static_cast<std::size_t>(remaining)) {
    std::memcpy(cursor, requestBindings, requestBindingsLength);
    cursor += requestBindingsLength;
    remaining -= static_cast<std::int32_t>(requestBindingsLength);
    *replyLength = static_cast<std::size_t>(cursor - reply);
    return FillHeader(layout.pdu, layout.pdu[0], cursor) && FillHeader(layout.message, kAsnSequence, cursor);
  } else {
    cursor = nullptr;
  }
  if (cursor == nullptr) {
    LOG_ERROR("CreateIdenticalPDU is failed...\n");
    return false;
  }
  return FinishMessage(layout, cursor, replyLength);
}

}  // namespace

std::int32_t MapErrorStatusToV1(std::int32_t status) {
  switch (status) {
    case 0: case 1: case 2: case 3: case 4: case 5:
      return status;
    case 6: case 11: case 14: case 15: case 16: case 17: case 18:
      return kNoSuchName;
    case 7: case 8: case 9: case 10: case 12:
      return kBadValue;
    default:
      return kGenErr;
  }
}

int ParseSnmpMessage(const std::uint8_t* message, std::size_t length, SnmpPdu* pdu) {
  MessageLayout layout;
  switch (ParseMessage(message, length, pdu, &layout, false)) {
    case ParseResult::kParsed: return 1;
    case ParseResult::kDropped: return 0;
    case ParseResult::kMalformed: return -1;
  }
  return 0;
}

bool CreateSnmpMessage(const std::uint8_t* requestBindings, std::size_t requestBindingsLength,
                       std::uint8_t* reply, std::size_t* replyLength, SnmpPdu* pdu) {
  if (pdu->version != kSnmpV1 && pdu->version != kSnmpV2c) {
    LOG_ERROR("Supported SNMP versions are V1, V2c and V3.\n");
    CountSnmp(SnmpCounter::kBadVersions);
    return false;
  }
  if (pdu->errorStatus == 0) {
    std::int32_t remaining = static_cast<std::int32_t>(*replyLength);
    BuildLayout layout;
    std::uint8_t* cursor = BuildPrefix(reply, &remaining, *pdu, 0, 0, &layout);
    if (cursor == nullptr) return false;
    cursor = AsnBuildSequence(cursor, &remaining, kAsnSequence, 0);
    const VarBindList& bindings =
        pdu->type == kGetResponse ? pdu->responseVarBinds : pdu->requestVarBinds;
    for (const VarBind& binding : bindings) {
      std::uint8_t* next = cursor ? BuildVarOp(cursor, binding.name.data(), binding.name.size(), binding.value,
                                               &remaining)
                                  : nullptr;
      if (next == nullptr) {
        if (pdu->requestType == kGetBulkRequest) break;  // a bulk reply is trimmed at its end
        LOG_ERROR("\n 1. Too big respone PDU\n");
        pdu->errorStatus = kTooBig;
        pdu->errorIndex = 0;
        break;
      }
      cursor = next;
    }
    if (pdu->errorStatus == 0) return FinishMessage(layout, cursor, replyLength);
  }
  return CreateIdenticalPDU(requestBindings, requestBindingsLength, reply, replyLength, *pdu);
}

namespace {

int ProcessDatagram(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                    std::size_t* replyLength, const AgentSession& agent) {
  if (length >= kMaxRequestSize) {
    LOG_ERROR("Received too big snmp message ...\n");
    CountSnmp(SnmpCounter::kInTooBigs);
    CountSnmp(SnmpCounter::kDroppedRequests);
    return kMessageDrop;
  }
  CountSnmp(SnmpCounter::kInMessages);
  SnmpPdu pdu;
  MessageLayout layout;
  int result = kMessageDrop;
  switch (ParseMessage(message, length, &pdu, &layout, true)) {
    case ParseResult::kParsed:
      result = ProcessParsedRequest(message, length, layout, &pdu, reply, replyLength, agent);
      break;
    case ParseResult::kMalformed:
      CountSnmp(SnmpCounter::kAsnParseErrors);
      break;
    case ParseResult::kDropped:
      break;
  }
  if (result == kMessageDrop) {
    LOG_ERROR("PACKET DROPPED !!! \n");
    CountSnmp(SnmpCounter::kDroppedRequests);
    *replyLength = 0;
  } else if (result == kMessageReply) {
    CountSnmp(SnmpCounter::kOutMessages);
    CountSnmp(SnmpCounter::kOutResponses);
  }
  return result;
}

}  // namespace

int ProcessSnmpMessage(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                       std::size_t* replyLength, const AgentSession& agent) {
  try {
    return ProcessDatagram(message, length, reply, replyLength, agent);
  } catch (const std::bad_alloc&) {
    LOG_ERROR("Unable to allocate buffer !!! \n");
    *replyLength = 0;
    return kResourceFailure;
  }
}

}  // namespace tessel
