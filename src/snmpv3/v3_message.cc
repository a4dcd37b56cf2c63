#include "snmpv3/v3_message.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "engine/engine_state.h"
#include "engine/log.h"
#include "notify/standard_traps.h"
#include "notify/trap_pdu.h"
#include "snmp/ber.h"
#include "snmp/message.h"
#include "snmp/pdu_codec.h"
#include "snmp/scrambler.h"
#include "snmp/statistics.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/usm_crypto.h"
#include "snmpv3/usm_users.h"
#include "snmpv3/vacm.h"

namespace tessel {
namespace {

constexpr std::int32_t kUsmSecurityModel = 3;
constexpr std::int32_t kMinimumMessageSize = 484;  // RFC 3412: smaller msgMaxSize is invalid
constexpr std::uint32_t kTimeWindow = 150;
constexpr std::uint32_t kMaxEngineBoots = 2147483647;
constexpr std::size_t kDigestLength = kUsmDigestLength;
constexpr std::size_t kSaltLength = kUsmSaltLength;
constexpr std::uint8_t kAuthFlag = 0x01;
constexpr std::uint8_t kPrivFlag = 0x02;

std::array<std::atomic<std::uint32_t>, static_cast<std::size_t>(V3Counter::kCount)> v3Counters{};

std::uint32_t CountV3(V3Counter counter) {
  return v3Counters[static_cast<std::size_t>(counter)].fetch_add(1) + 1;
}

// The USM errors that are answered with a Report: which counter, and at which level.
struct UsmError {
  V3Counter counter;
  std::uint32_t statsColumn;  // usmStats.<column>.0
  std::uint8_t reportLevel;
};
constexpr UsmError kUnknownEngineId{V3Counter::kUnknownEngineIds, 4, kNoAuthNoPriv};
constexpr UsmError kNotInTimeWindow{V3Counter::kNotInTimeWindows, 2, kAuthNoPriv};
constexpr UsmError kUnknownUserName{V3Counter::kUnknownUserNames, 3, kNoAuthNoPriv};
constexpr UsmError kUnsupportedSecLevel{V3Counter::kUnsupportedSecLevels, 1, kNoAuthNoPriv};
constexpr UsmError kWrongDigest{V3Counter::kWrongDigests, 5, kNoAuthNoPriv};
constexpr UsmError kDecryptionError{V3Counter::kDecryptionErrors, 6, kAuthNoPriv};

// Appends TLVs to a buffer of fixed capacity; constructed headers take AsnBuildSequence's fixed
// four-octet form and are closed once their contents are written.
class Builder {
 public:
  explicit Builder(std::size_t capacity)
      : buffer_(capacity), remaining_(static_cast<std::int32_t>(capacity)) {}

  std::size_t Open(std::uint8_t type) {
    std::size_t at = Offset();
    Advance(AsnBuildSequence(Cursor(), &remaining_, type, 0));
    return at;
  }
  void Close(std::size_t header) {
    if (ok_) ok_ = FillHeader(buffer_.data() + header, buffer_[header], Cursor());
  }
  void Integer(std::int32_t value) {
    Advance(AsnBuildInt(Cursor(), &remaining_, kAsnInteger, value));
  }
  std::size_t Octets(std::string_view octets) {
    Advance(AsnBuildString(Cursor(), &remaining_, kAsnOctetString,
                           reinterpret_cast<const std::uint8_t*>(octets.data()), octets.size()));
    return Offset() - octets.size();
  }
  void Raw(const std::uint8_t* data, std::size_t length) {
    if (!ok_ || length > static_cast<std::size_t>(remaining_)) {
      ok_ = false;
      return;
    }
    std::copy(data, data + length, Cursor());
    remaining_ -= static_cast<std::int32_t>(length);
    used_ += length;
  }
  // Lets a primitive write at the cursor with the remaining room.
  template <typename Write>
  void Append(Write write) {
    if (ok_) Advance(write(Cursor(), &remaining_));
  }

  bool ok() const { return ok_; }
  std::size_t Offset() const { return used_; }
  std::uint8_t* Data() { return buffer_.data(); }

 private:
  std::uint8_t* Cursor() { return buffer_.data() + used_; }
  void Advance(std::uint8_t* end) {
    if (!ok_ || end == nullptr) {
      ok_ = false;
      return;
    }
    used_ = static_cast<std::size_t>(end - buffer_.data());
  }

  std::vector<std::uint8_t> buffer_;
  std::int32_t remaining_;
  std::size_t used_ = 0;
  bool ok_ = true;
};

// ---- Parsing ----

// Reads the fields of one container: every field must end within it, and Enter gives a nested
// container a reader of its own, bounded by that container's length.
struct Reader {
  const std::uint8_t* cursor;
  std::int32_t remaining;

  // Reads a header of the expected type; *inner covers exactly its contents and this reader
  // moves behind the whole field.
  bool Enter(std::uint8_t expected, Reader* inner) {
    std::int32_t length = remaining;
    std::uint8_t type = 0;
    const std::uint8_t* contents = AsnParseHeader(cursor, &length, &type);
    if (contents == nullptr || type != expected) return false;
    *inner = Reader{contents, length};
    remaining -= static_cast<std::int32_t>(contents - cursor) + length;
    cursor = contents + length;
    return true;
  }
  bool Integer(std::int32_t* value) {
    std::uint8_t type = 0;
    const std::uint8_t* next = AsnParseInt(cursor, &remaining, &type, value);
    if (next == nullptr || type != kAsnInteger) return false;
    cursor = next;
    return true;
  }
  bool Octets(std::string* out, std::size_t capacity) {
    std::vector<std::uint8_t> buffer(capacity);
    std::size_t length = capacity;
    std::uint8_t type = 0;
    const std::uint8_t* next = AsnParseString(cursor, &remaining, &type, buffer.data(), &length);
    if (next == nullptr || type != kAsnOctetString) return false;
    out->assign(reinterpret_cast<const char*>(buffer.data()), length);
    cursor = next;
    return true;
  }
  bool AtEnd() const { return remaining == 0; }
  // What is left is exactly one field, of any type.
  bool HoldsOneField() const {
    std::int32_t length = remaining;
    std::uint8_t type = 0;
    const std::uint8_t* contents = AsnParseHeader(cursor, &length, &type);
    return contents != nullptr && contents + length == cursor + remaining;
  }
};

struct MessageHeader {
  std::int32_t msgId = 0;
  std::int32_t msgMaxSize = 0;
  std::uint8_t flags = 0;
  std::int32_t securityModel = 0;
};

struct SecurityParameters {
  std::string engineId;
  std::int32_t boots = 0;
  std::int32_t time = 0;
  std::string userName;
  std::string authParameters;
  std::size_t authOffset = 0;  // where the digest lies in the message
  std::string privParameters;
};

// The scoped PDU: its context and the PDU, parsed from plaintext that this record keeps alive.
struct ScopedPdu {
  std::vector<std::uint8_t> plaintext;
  std::string contextEngineId;
  std::string contextName;
  SnmpPdu pdu;
  PduLayout layout;
};

// One received v3 message while it is checked.
struct V3Request {
  std::vector<std::uint8_t> message;  // a copy: the digest is zeroed in it before it is checked
  MessageHeader header;
  std::uint8_t level = kNoAuthNoPriv;
  SecurityParameters security;
  std::size_t scopedOffset = 0;
  std::optional<UsmUser> user;
  std::string agentEngineId;
  std::uint32_t agentBoots = 0;
  std::uint32_t agentTime = 0;
};

// msgVersion and msgGlobalData, which holds its four fields and nothing else.
bool ParseHeader(Reader* message, MessageHeader* header) {
  Reader global{};
  std::int32_t version = 0;
  std::string flags;
  if (!message->Integer(&version) || version != 3 || !message->Enter(kAsnSequence, &global) ||
      !global.Integer(&header->msgId) || !global.Integer(&header->msgMaxSize) ||
      !global.Octets(&flags, 10) || flags.size() != 1 || !global.Integer(&header->securityModel) ||
      !global.AtEnd()) {
    LOG_ERROR("Unable to parse SNMPV3 Message header...\n");
    return false;
  }
  header->flags = static_cast<std::uint8_t>(flags[0]);
  return true;
}

// msgFlags to a level; false for a combination that no message may carry.
bool LevelFromFlags(std::uint8_t flags, std::uint8_t* level) {
  if (flags >= 8 || ((flags & kPrivFlag) && !(flags & kAuthFlag))) {
    LOG_ERROR("Invalid Security Level !!!\n");
    return false;
  }
  *level = (flags & kPrivFlag) ? kAuthPriv : (flags & kAuthFlag) ? kAuthNoPriv : kNoAuthNoPriv;
  return true;
}

// msgSecurityParameters: an OCTET STRING that holds exactly the USM SEQUENCE, which holds its six
// fields and nothing else.
bool ParseSecurityParameters(Reader* message, const std::uint8_t* start, std::uint8_t level,
                             SecurityParameters* security) {
  Reader wrapper{};
  Reader usm{};
  if (!message->Enter(kAsnOctetString, &wrapper) || !wrapper.Enter(kAsnSequence, &usm) ||
      !wrapper.AtEnd() || !usm.Octets(&security->engineId, 255) || !usm.Integer(&security->boots) ||
      !usm.Integer(&security->time) || !usm.Octets(&security->userName, 255)) {
    LOG_ERROR("Parsing failed in Security parameters. \n");
    return false;
  }
  if (!usm.Octets(&security->authParameters, kDigestLength)) {
    LOG_ERROR("Unable to decode authParams (digest) !!!\n");
    return false;
  }
  // The contents of an OCTET STRING end at the cursor.
  security->authOffset =
      static_cast<std::size_t>(usm.cursor - start) - security->authParameters.size();
  if (!usm.Octets(&security->privParameters, kSaltLength) || !usm.AtEnd()) {
    LOG_ERROR("Unable to parse the priv params %d .\n", 0);
    return false;
  }
  if (level != kNoAuthNoPriv && security->authParameters.size() != kDigestLength) {
    LOG_ERROR("Invalid authParamLen is received !!!\n");
    return false;
  }
  if (level == kAuthPriv && security->privParameters.size() != kSaltLength) {
    LOG_ERROR("Invalid privParamLen is received !!!\n");
    return false;
  }
  return true;
}

// The scoped PDU from its plaintext: a SEQUENCE of contextEngineID, contextName and the PDU,
// nothing else. Decrypted plaintext may run on behind it (the cipher's padding); ParseRequest has
// made sure that an unencrypted one fills the rest of the message.
bool ParseScopedPdu(ScopedPdu* scoped, bool countIncoming) {
  Reader plaintext{scoped->plaintext.data(), static_cast<std::int32_t>(scoped->plaintext.size())};
  Reader reader{};
  if (!plaintext.Enter(kAsnSequence, &reader) || !reader.Octets(&scoped->contextEngineId, 255) ||
      !reader.Octets(&scoped->contextName, 255) || !reader.HoldsOneField()) {
    LOG_ERROR("Error in Parsing  Scoped pdu\n");
    return false;
  }
  scoped->pdu.version = kSnmpV3;
  return ParseSnmpPdu(scoped->plaintext.data(), reader.cursor, reader.remaining, &scoped->pdu,
                      &scoped->layout, countIncoming) == ParseResult::kParsed;
}

// ---- Building ----

std::string AuthKey(const V3Request& request) {
  return GetLocalKeyValue(request.user->authPassword, request.user->auth, request.agentEngineId);
}

std::string PrivKey(const V3Request& request) {
  return GetLocalKeyValue(request.user->privPassword, request.user->auth, request.agentEngineId);
}

std::vector<std::uint8_t> EncodeScoped(std::string_view contextEngineId,
                                       std::string_view contextName, const std::uint8_t* pdu,
                                       std::size_t pduLength) {
  Builder scoped(pduLength + 16 + contextEngineId.size() + contextName.size() + 8);
  std::size_t header = scoped.Open(kAsnSequence);
  scoped.Octets(contextEngineId);
  scoped.Octets(contextName);
  scoped.Raw(pdu, pduLength);
  scoped.Close(header);
  if (!scoped.ok()) return {};
  return {scoped.Data(), scoped.Data() + scoped.Offset()};
}

// The scoped PDU as msgData carries it: the plaintext SEQUENCE, or at authPriv its encryption
// as an OCTET STRING (with the salt to send). Empty when encryption fails.
std::vector<std::uint8_t> ScopedField(const V3Envelope& envelope,
                                      const std::vector<std::uint8_t>& scoped, std::string* salt) {
  if (envelope.level != kAuthPriv) return scoped;
  std::vector<std::uint8_t> cipher;
  std::uint8_t saltOctets[kSaltLength];
  if (!EncryptScopedPdu(envelope.priv, envelope.privKey, envelope.boots, envelope.time,
                        scoped.data(), scoped.size(), &cipher, saltOctets)) {
    LOG_ERROR("Encryption Failed  !!!\n");
    return {};
  }
  salt->assign(reinterpret_cast<const char*>(saltOctets), kSaltLength);
  Builder encrypted(cipher.size() + 8);
  encrypted.Append([&](std::uint8_t* cursor, std::int32_t* room) {
    return AsnBuildString(cursor, room, kAsnOctetString, cipher.data(), cipher.size());
  });
  return {encrypted.Data(), encrypted.Data() + encrypted.Offset()};
}

// The envelope of a reply at level to request: the agent is the authoritative engine, and the
// request's user signs and encrypts.
V3Envelope ReplyEnvelope(const V3Request& request, std::uint8_t level) {
  V3Envelope envelope;
  envelope.msgId = request.header.msgId;
  envelope.msgMaxSize = request.header.msgMaxSize;
  envelope.level = level;
  envelope.engineId = request.agentEngineId;
  envelope.userName = request.security.userName;
  if (request.user && level != kNoAuthNoPriv) {
    envelope.auth = request.user->auth;
    envelope.authKey = AuthKey(request);
  }
  if (request.user && level == kAuthPriv) {
    envelope.priv = request.user->priv;
    envelope.privKey = PrivKey(request);
  }
  return envelope;
}

// A Report PDU with one usmStats counter: identifier 0xA8 and a one-octet length.
std::vector<std::uint8_t> EncodeReportPdu(std::int32_t requestId, const UsmError& error) {
  Builder pdu(128);
  pdu.Raw(std::array<std::uint8_t, 2>{kReport, 0}.data(), 2);
  pdu.Integer(requestId);
  pdu.Integer(0);
  pdu.Integer(0);
  std::size_t list = pdu.Open(kAsnSequence);
  Oid name = {1, 3, 6, 1, 6, 3, 15, 1, 1, error.statsColumn, 0};
  VarValue value = VarValue::Unsigned(kAsnCounter, CountV3(error.counter));
  pdu.Append([&](std::uint8_t* cursor, std::int32_t* remaining) {
    return BuildVarOp(cursor, name.data(), name.size(), value, remaining);
  });
  pdu.Close(list);
  if (!pdu.ok()) return {};
  pdu.Data()[1] = static_cast<std::uint8_t>(pdu.Offset() - 2);
  return {pdu.Data(), pdu.Data() + pdu.Offset()};
}

// Answers a security error. The request-id and context come from the scoped PDU when it can be
// read as plaintext; a manager matches Reports by msgID in any case.
int SendReport(V3Request& request, const UsmError& error, std::uint8_t* reply,
               std::size_t* replyLength) {
  ScopedPdu scoped;
  scoped.plaintext.assign(
      request.message.begin() + static_cast<std::ptrdiff_t>(request.scopedOffset),
      request.message.end());
  std::int32_t requestId = ParseScopedPdu(&scoped, false) ? scoped.pdu.requestId : 0;
  std::vector<std::uint8_t> pdu = EncodeReportPdu(requestId, error);
  V3Envelope envelope = ReplyEnvelope(
      request, request.user && error.reportLevel == kAuthNoPriv ? kAuthNoPriv : kNoAuthNoPriv);
  if (envelope.level != kNoAuthNoPriv || gv_discoveryTimeFlag.load()) {
    envelope.boots = request.agentBoots;
    envelope.time = request.agentTime;
  }
  envelope.contextEngineId = request.agentEngineId;
  envelope.contextName = scoped.contextName;
  CountSnmp(SnmpCounter::kV3SecurityErrors);
  LOG_TRACE("Returning Snmpv3 error like unknown engine Id, etc.\n");
  if (pdu.empty()) return kMessageDrop;
  return EncodeV3Message(envelope, pdu.data(), pdu.size(), reply, replyLength) ? kMessageReply
                                                                               : kMessageDrop;
}

// ---- Checking ----

enum class Verdict { kAccepted, kReport, kDrop };

struct Check {
  Verdict verdict;
  UsmError error{};
};

bool IsForDiscovery(const V3Request& request) {
  const std::string& user = request.security.userName;
  return request.security.engineId.empty() || request.security.engineId != request.agentEngineId ||
         user.empty() || user == "initial";
}

bool Authentic(V3Request& request) {
  std::uint8_t* digestAt = request.message.data() + request.security.authOffset;
  std::fill(digestAt, digestAt + kDigestLength, 0);
  std::uint8_t digest[kDigestLength];
  if (!CalculateDigest(request.user->auth, AuthKey(request), request.message.data(),
                       request.message.size(), digest)) {
    return false;
  }
  return DigestsEqual(
      digest, reinterpret_cast<const std::uint8_t*>(request.security.authParameters.data()));
}

// A message is timely when it names the agent's current boots (never the latched maximum) and a
// time within the window of the agent's.
bool InTimeWindow(const V3Request& request) {
  if (request.security.boots == 0 && request.security.time == 0) return false;
  auto boots = static_cast<std::uint32_t>(request.security.boots);
  if (boots == kMaxEngineBoots || boots != request.agentBoots) return false;
  std::int64_t difference = static_cast<std::int64_t>(request.agentTime) - request.security.time;
  return (difference < 0 ? -difference : difference) <= kTimeWindow;
}

Check CheckSecurity(V3Request& request) {
  if (IsForDiscovery(request)) {
    LOG_TRACE("Request for Discovery !!!\n");
    return {Verdict::kReport, kUnknownEngineId};
  }
  request.user = GetUsmEntry(EngineId(), request.security.userName);
  if (!request.user) {
    LOG_ERROR("User is  not configured in the USM table\n");
    return {Verdict::kReport, kUnknownUserName};
  }
  if (request.level > request.user->securityLevel) {
    LOG_ERROR("Unsupported Security Level. !!!\n");
    return {Verdict::kReport, kUnsupportedSecLevel};
  }
  if (request.level == kNoAuthNoPriv) return {Verdict::kAccepted};
  if (!Authentic(request)) {
    LOG_ERROR("Authentication is failed. \n");
    request.user.reset();  // a Report for a wrong digest is not authenticated
    return {Verdict::kReport, kWrongDigest};
  }
  if (!InTimeWindow(request)) {
    LOG_ERROR("Received msg not in time window\n");
    return {Verdict::kReport, kNotInTimeWindow};
  }
  return {Verdict::kAccepted};
}

// The scoped PDU's plaintext: as received, or decrypted for authPriv.
bool ScopedPlaintext(const V3Request& request, std::vector<std::uint8_t>* plaintext) {
  const std::uint8_t* at = request.message.data() + request.scopedOffset;
  std::size_t length = request.message.size() - request.scopedOffset;
  if (request.level != kAuthPriv) {
    plaintext->assign(at, at + length);
    return true;
  }
  Reader msgData{at, static_cast<std::int32_t>(length)};
  Reader encrypted{};
  if (!msgData.Enter(kAsnOctetString, &encrypted)) return false;
  return DecryptScopedPdu(
      request.user->priv, PrivKey(request), static_cast<std::uint32_t>(request.security.boots),
      static_cast<std::uint32_t>(request.security.time),
      reinterpret_cast<const std::uint8_t*>(request.security.privParameters.data()),
      encrypted.cursor, static_cast<std::size_t>(encrypted.remaining), plaintext);
}

// ---- The request ----

int VacmCheck(const SecurityAccess& access, std::uint8_t pduType,
              std::span<const std::uint32_t> oid, std::string* viewCache) {
  return IsAccessAllowed(access.contextName, access.securityName, access.securityModel,
                         access.securityLevel, pduType, oid, viewCache);
}

// Room the wrapper, the security parameters, the scoped PDU header and the cipher padding take.
std::size_t WrapperOverhead(const V3Request& request, const ScopedPdu& scoped) {
  return 64 + request.agentEngineId.size() + request.security.userName.size() +
         scoped.contextEngineId.size() + scoped.contextName.size();
}

int Respond(V3Request& request, ScopedPdu& scoped, std::uint8_t* reply, std::size_t* replyLength,
            const AgentSession& agent) {
  ScrambleIfOn(&scoped.pdu, agent, true);
  std::size_t limit = std::min(
      {static_cast<std::size_t>(request.header.msgMaxSize), kMaxSnmpMessage, *replyLength});
  std::size_t overhead = WrapperOverhead(request, scoped);
  if (limit <= overhead) return kMessageDrop;
  std::vector<std::uint8_t> pdu(limit - overhead);
  std::int32_t remaining = static_cast<std::int32_t>(pdu.size());
  std::uint8_t* end = BuildResponsePdu(pdu.data(), &remaining, &scoped.pdu, scoped.layout);
  if (end == nullptr) return kMessageDrop;
  V3Envelope envelope = ReplyEnvelope(request, request.level);
  envelope.boots = request.agentBoots;
  envelope.time = request.agentTime;
  envelope.contextEngineId = scoped.contextEngineId;
  envelope.contextName = scoped.contextName;
  *replyLength = limit;
  if (!EncodeV3Message(envelope, pdu.data(), static_cast<std::size_t>(end - pdu.data()), reply,
                       replyLength))
    return kMessageDrop;
  CountErrorStatus(scoped.pdu.errorStatus);
  return kMessageReply;
}

int ProcessScopedPdu(V3Request& request, std::uint8_t* reply, std::size_t* replyLength,
                     const AgentSession& agent) {
  ScopedPdu scoped;
  if (!ScopedPlaintext(request, &scoped.plaintext) || !ParseScopedPdu(&scoped, true)) {
    if (request.level == kAuthPriv)
      return SendReport(request, kDecryptionError, reply, replyLength);
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return kMessageDrop;
  }
  SecurityAccess access;
  access.contextName = scoped.contextName;
  access.securityName = request.user->securityName;
  access.securityModel = kUsmSecurityModel;
  access.securityLevel = request.level;
  access.isAccessAllowed = VacmCheck;
  switch (ProcessRequestPdu(&scoped.pdu, agent, &access)) {
    case RequestOutcome::kEchoInform:
      scoped.pdu.responseVarBinds = scoped.pdu.requestVarBinds;
      scoped.pdu.type = kGetResponse;
      break;
    case RequestOutcome::kDrop:
      return kMessageDrop;
    case RequestOutcome::kResourceFailure:
      return kResourceFailure;
    case RequestOutcome::kReply:
      break;
  }
  return Respond(request, scoped, reply, replyLength, agent);
}

// Header and security parameters; false when the message is dropped (counted). The message is
// the whole datagram; what follows the security parameters in it is the scoped PDU field.
bool ParseRequest(V3Request& request) {
  Reader datagram{request.message.data(), static_cast<std::int32_t>(request.message.size())};
  Reader reader{};
  if (!datagram.Enter(kAsnSequence, &reader) || !datagram.AtEnd() ||
      !ParseHeader(&reader, &request.header)) {
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return false;
  }
  if (request.header.msgMaxSize < kMinimumMessageSize ||
      !LevelFromFlags(request.header.flags, &request.level)) {
    CountV3(V3Counter::kInvalidMsgs);
    return false;
  }
  if (request.header.securityModel != kUsmSecurityModel) {
    LOG_ERROR("Unsupported Security Model. !!!\n");
    CountV3(V3Counter::kUnknownSecurityModels);
    return false;
  }
  if (!ParseSecurityParameters(&reader, request.message.data(), request.level, &request.security)) {
    CountV3(V3Counter::kInvalidMsgs);
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return false;
  }
  if (!reader.HoldsOneField()) {  // msgData: the scoped PDU, plaintext or encrypted, alone
    LOG_ERROR("Error in Parsing  Scoped pdu\n");
    CountSnmp(SnmpCounter::kAsnParseErrors);
    return false;
  }
  request.scopedOffset = static_cast<std::size_t>(reader.cursor - request.message.data());
  return true;
}

}  // namespace

std::uint32_t V3Count(V3Counter counter) {
  return v3Counters[static_cast<std::size_t>(counter)].load();
}

void ResetV3Statistics() {
  for (auto& counter : v3Counters) counter.store(0);
}

bool EncodeV3Message(const V3Envelope& envelope, const std::uint8_t* pdu, std::size_t pduLength,
                     std::uint8_t* out, std::size_t* length) {
  std::vector<std::uint8_t> scoped =
      EncodeScoped(envelope.contextEngineId, envelope.contextName, pdu, pduLength);
  std::string salt;
  std::vector<std::uint8_t> field = scoped.empty() ? scoped : ScopedField(envelope, scoped, &salt);
  if (field.empty()) return false;
  Builder message(*length);
  std::size_t outer = message.Open(kAsnSequence);
  message.Integer(3);
  std::size_t global = message.Open(kAsnSequence);
  message.Integer(envelope.msgId);
  message.Integer(envelope.msgMaxSize);
  auto flags = static_cast<std::uint8_t>(envelope.level | (envelope.reportable ? 0x04 : 0));
  message.Octets(std::string(1, static_cast<char>(flags)));
  message.Integer(kUsmSecurityModel);
  message.Close(global);
  std::size_t wrapper = message.Open(kAsnOctetString);
  std::size_t parameters = message.Open(kAsnSequence);
  message.Octets(envelope.engineId);
  message.Integer(static_cast<std::int32_t>(envelope.boots));
  message.Integer(static_cast<std::int32_t>(envelope.time));
  message.Octets(envelope.userName);
  bool authenticated = envelope.level != kNoAuthNoPriv;
  std::size_t digestAt =
      message.Octets(authenticated ? std::string(kDigestLength, '\0') : std::string());
  message.Octets(salt);
  message.Close(parameters);
  message.Close(wrapper);
  message.Raw(field.data(), field.size());
  message.Close(outer);
  if (!message.ok()) {
    LOG_ERROR("Unable to encode message header.\n");
    return false;
  }
  if (authenticated) {
    std::uint8_t digest[kDigestLength];
    if (!CalculateDigest(envelope.auth, envelope.authKey, message.Data(), message.Offset(),
                         digest)) {
      LOG_ERROR("Digest failed, when creating respons message.\n");
      return false;
    }
    std::copy(digest, digest + kDigestLength, message.Data() + digestAt);
  }
  std::copy(message.Data(), message.Data() + message.Offset(), out);
  *length = message.Offset();
  return true;
}

namespace {
std::atomic<V3MessageReceiver> v3Receiver{nullptr};
}  // namespace

void InstallV3MessageReceiver(V3MessageReceiver receiver) { v3Receiver = receiver; }

bool ParseV3Message(const std::uint8_t* message, std::size_t length, const UsmUser* user,
                    V3Received* received) {
  V3Request request;
  request.message.assign(message, message + length);
  if (!ParseRequest(request)) return false;
  received->msgId = request.header.msgId;
  received->level = request.level;
  received->engineId = request.security.engineId;
  received->boots = static_cast<std::uint32_t>(request.security.boots);
  received->time = static_cast<std::uint32_t>(request.security.time);
  received->userName = request.security.userName;
  if (request.level != kNoAuthNoPriv) {
    if (user == nullptr) return false;  // the header is read: the caller finds the user by it
    request.user = *user;
    request.agentEngineId = request.security.engineId;  // the keys of the sending engine
    if (!Authentic(request)) {
      LOG_ERROR("Authentication is failed. \n");
      return false;
    }
  }
  ScopedPdu scoped;
  if (!ScopedPlaintext(request, &scoped.plaintext) || !ParseScopedPdu(&scoped, false)) return false;
  received->contextEngineId = std::move(scoped.contextEngineId);
  received->contextName = std::move(scoped.contextName);
  received->pdu = std::move(scoped.pdu);
  return true;
}

int ProcessSnmpV3Message(const std::uint8_t* message, std::size_t length, std::uint8_t* reply,
                         std::size_t* replyLength, const AgentSession& agent) {
  V3Request request;
  request.message.assign(message, message + length);
  if (!ParseRequest(request)) return kMessageDrop;
  request.agentEngineId = AgentEngineId(agent);
  // A message of another authoritative engine may answer what the agent sent.
  V3MessageReceiver receiver = v3Receiver.load();
  if (receiver != nullptr && !request.security.engineId.empty() &&
      request.security.engineId != request.agentEngineId && receiver(message, length, agent))
    return kMessageConsumed;
  request.agentBoots = agent.agentInfo ? agent.agentInfo->engineBoots.load() : 0;
  request.agentTime = AgentEngineTime(agent);
  Check check = CheckSecurity(request);
  // Discovery and time synchronisation are part of the protocol; only a wrong digest is a
  // failed authentication.
  if (check.verdict == Verdict::kReport && check.error.counter == kWrongDigest.counter)
    RaiseStandardTrap(agent, kAuthenticationFailure);
  if (check.verdict == Verdict::kReport)
    return SendReport(request, check.error, reply, replyLength);
  if (check.verdict == Verdict::kDrop) return kMessageDrop;
  return ProcessScopedPdu(request, reply, replyLength, agent);
}

}  // namespace tessel
