#include "snmp/message.h"

#include <atomic>
#include <cstring>
#include <new>

#include "engine/engine_state.h"
#include "engine/log.h"
#include "notify/standard_traps.h"
#include "notify/trap_pdu.h"
#include "snmp/ber.h"
#include "snmp/pdu_codec.h"
#include "snmp/scrambler.h"
#include "snmp/statistics.h"
#include "snmpv3/v3_message.h"

namespace tessel {
namespace {

constexpr std::size_t kMaxCommunity = 256;

// Version, then (v1/v2c) the community. Refusals count a bad version.
ParseResult ParseVersionAndCommunity(const std::uint8_t** cursor, std::int32_t* remaining,
                                     SnmpPdu* pdu) {
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
ParseResult ParseMessage(const std::uint8_t* message, std::size_t length, SnmpPdu* pdu,
                         PduLayout* layout, bool countIncoming) {
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
  const CommunityList& allowed =
      pdu.type == kSetRequest ? agent.writeCommunities : agent.readCommunities;
  if (allowed.Contains(pdu.community)) {
    LOG_TRACE("The community string matches");
    return true;
  }
  const CommunityList& other =
      pdu.type == kSetRequest ? agent.readCommunities : agent.writeCommunities;
  if (other.Contains(pdu.community)) CountSnmp(SnmpCounter::kBadCommunityUses);
  CountSnmp(SnmpCounter::kBadCommunityNames);
  LOG_ERROR("Authentication failed !!!!\n");
  return false;
}

// An InformRequest is acknowledged by the same message as a Response.
int AnswerInform(const std::uint8_t* message, std::size_t length, const PduLayout& layout,
                 std::uint8_t* reply, std::size_t* replyLength) {
  if (length > *replyLength) return kMessageDrop;
  std::memcpy(reply, message, length);
  reply[layout.pduTypeOffset] = kGetResponse;
  *replyLength = length;
  return kMessageReply;
}

std::atomic<ResponseReceiver> responseReceiver{nullptr};

int ProcessParsedRequest(const std::uint8_t* message, std::size_t length, const PduLayout& layout,
                         SnmpPdu* pdu, std::uint8_t* reply, std::size_t* replyLength,
                         const AgentSession& agent) {
  if (pdu->type == kGetResponse) {
    ScrambleIfOn(pdu, agent, false);
    ResponseReceiver receiver = responseReceiver.load();
    return receiver != nullptr && receiver(*pdu, agent) ? kMessageConsumed : kMessageDrop;
  }
  if (!IsValidAuthentication(*pdu, *agent.agentInfo)) {
    RaiseStandardTrap(agent, kAuthenticationFailure);
    return kMessageDrop;
  }
  switch (ProcessRequestPdu(pdu, agent, nullptr)) {
    case RequestOutcome::kEchoInform:
      return AnswerInform(message, length, layout, reply, replyLength);
    case RequestOutcome::kDrop:
      return kMessageDrop;
    case RequestOutcome::kResourceFailure:
      return kResourceFailure;
    case RequestOutcome::kReply:
      break;
  }
  ScrambleIfOn(pdu, agent, true);
  if (!CreateSnmpMessage(layout.bindings, layout.bindingsLength, reply, replyLength, pdu))
    return kMessageDrop;
  CountErrorStatus(pdu->errorStatus);
  return kMessageReply;
}

}  // namespace

void InstallResponseReceiver(ResponseReceiver receiver) { responseReceiver = receiver; }

std::int32_t MapErrorStatusToV1(std::int32_t status) {
  switch (status) {
    case 0:
    case 1:
    case 2:
    case 3:
    case 4:
    case 5:
      return status;
    case 6:
    case 11:
    case 14:
    case 15:
    case 16:
    case 17:
    case 18:
      return kNoSuchName;
    case 7:
    case 8:
    case 9:
    case 10:
    case 12:
      return kBadValue;
    default:
      return kGenErr;
  }
}

int ParseSnmpMessage(const std::uint8_t* message, std::size_t length, SnmpPdu* pdu) {
  PduLayout layout;
  switch (ParseMessage(message, length, pdu, &layout, false)) {
    case ParseResult::kParsed:
      return 1;
    case ParseResult::kDropped:
      return 0;
    case ParseResult::kMalformed:
      return -1;
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
  std::int32_t remaining = static_cast<std::int32_t>(*replyLength);
  std::uint8_t* cursor = AsnBuildSequence(reply, &remaining, kAsnSequence, 0);
  if (cursor) cursor = AsnBuildInt(cursor, &remaining, kAsnInteger, pdu->version);
  if (cursor) {
    cursor = AsnBuildString(cursor, &remaining, kAsnOctetString,
                            reinterpret_cast<const std::uint8_t*>(pdu->community.data()),
                            pdu->community.size());
  }
  if (cursor == nullptr) {
    LOG_ERROR("Unable to encode SNMP message length and sequnce type. !!!\n");
    return false;
  }
  PduLayout request;
  request.bindings = requestBindings;
  request.bindingsLength = requestBindingsLength;
  cursor = BuildResponsePdu(cursor, &remaining, pdu, request);
  if (cursor == nullptr || !FillHeader(reply, kAsnSequence, cursor)) {
    LOG_ERROR("Unable to encode message header.\n");
    return false;
  }
  *replyLength = static_cast<std::size_t>(cursor - reply);
  return true;
}

namespace {

// The version of a message, or -1 when it cannot be read.
std::int32_t MessageVersion(const std::uint8_t* message, std::size_t length) {
  std::int32_t remaining = static_cast<std::int32_t>(length);
  std::uint8_t type = 0;
  const std::uint8_t* cursor = length > 0 ? AsnParseHeader(message, &remaining, &type) : nullptr;
  std::int32_t version = -1;
  if (cursor == nullptr || type != kAsnSequence) return -1;
  if (AsnParseInt(cursor, &remaining, &type, &version) == nullptr || type != kAsnInteger) return -1;
  return version;
}

// An SNMPv1 or SNMPv2c message.
int ProcessCommunityMessage(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                            std::size_t* replyLength, const AgentSession& agent) {
  SnmpPdu pdu;
  PduLayout layout;
  switch (ParseMessage(message, length, &pdu, &layout, true)) {
    case ParseResult::kParsed:
      return ProcessParsedRequest(message, length, layout, &pdu, reply, replyLength, agent);
    case ParseResult::kMalformed:
      CountSnmp(SnmpCounter::kAsnParseErrors);
      return kMessageDrop;
    case ParseResult::kDropped:
      return kMessageDrop;
  }
  return kMessageDrop;
}

int ProcessDatagram(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                    std::size_t* replyLength, const AgentSession& agent) {
  if (length >= kMaxRequestSize) {
    LOG_ERROR("Received too big snmp message ...\n");
    CountSnmp(SnmpCounter::kInTooBigs);
    CountSnmp(SnmpCounter::kDroppedRequests);
    return kMessageDrop;
  }
  CountSnmp(SnmpCounter::kInMessages);
  bool v3 = gv_snmpv3Configured.load() && MessageVersion(message, length) == kSnmpV3;
  int result = v3 ? ProcessSnmpV3Message(message, length, reply, replyLength, agent)
                  : ProcessCommunityMessage(message, length, reply, replyLength, agent);
  if (result == kMessageDrop) {
    LOG_ERROR("PACKET DROPPED !!! \n");
    CountSnmp(SnmpCounter::kDroppedRequests);
    *replyLength = 0;
  } else if (result == kMessageConsumed) {
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
