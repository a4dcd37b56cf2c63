#include "snmpv3/v3_message.h"

#include <gtest/gtest.h>

#include <functional>

#include "base/clock.h"
#include "engine/engine_state.h"
#include "snmp/ber.h"
#include "snmp/message.h"
#include "snmp/pdu_codec.h"
#include "snmp/statistics.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/engine_objects.h"
#include "snmpv3/usm_crypto.h"
#include "snmpv3/usm_users.h"
#include "snmpv3/v3_config.h"
#include "snmpv3/vacm.h"
#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

using Bytes = std::vector<std::uint8_t>;

// A field with the four-octet header form every container of the engine's replies has too.
Bytes Container(std::uint8_t type, std::initializer_list<Bytes> parts) {
  Bytes out = {type, 0x82, 0, 0};
  for (const Bytes& part : parts) out.insert(out.end(), part.begin(), part.end());
  out[2] = static_cast<std::uint8_t>((out.size() - 4) >> 8);
  out[3] = static_cast<std::uint8_t>(out.size() - 4);
  return out;
}
Bytes Int(std::int32_t value) {
  Bytes out(8);
  std::int32_t room = 8;
  return Bytes(out.data(), AsnBuildInt(out.data(), &room, kAsnInteger, value));
}
Bytes Str(const std::string& value) {
  Bytes out(value.size() + 2, static_cast<std::uint8_t>(value.size()));
  out[0] = kAsnOctetString;
  std::copy(value.begin(), value.end(), out.begin() + 2);
  return out;
}

struct V3Request {
  std::int32_t maxSize = 1500;
  std::uint8_t flags = 0x04;
  std::int32_t securityModel = 3;
  std::string engineId;
  std::int32_t boots = 0;
  std::int32_t time = 0;
  std::string user;
  std::string authKey;  // set: authenticate with it
  std::string context;
  Oid name;
};

// Where the contents of the field at `at` begin and where the field ends; both at the end of the
// bytes when no field can be read there.
struct Tlv {
  std::size_t contents, end;
};
Tlv Field(const std::vector<std::uint8_t>& bytes, std::size_t at) {
  std::int32_t length = static_cast<std::int32_t>(bytes.size() - std::min(at, bytes.size()));
  std::uint8_t type = 0;
  const std::uint8_t* contents = AsnParseHeader(bytes.data() + at, &length, &type);
  if (contents == nullptr) return {bytes.size(), bytes.size()};
  std::size_t offset = static_cast<std::size_t>(contents - bytes.data());
  return {offset, offset + static_cast<std::size_t>(length)};
}

// An SNMPv3 GetRequest for one name, authenticated when the request says so.
std::vector<std::uint8_t> Encode(const V3Request& r) {
  Request get;  // its PDU, behind the header, version and community of a v2c message
  get.requestId = 4242;
  get.bindings = {{r.name, VarValue::Empty(kAsnNull)}};
  Bytes v2c = EncodeRequest(get);
  Bytes pdu(v2c.begin() + 4 + 3 + 2 + static_cast<std::ptrdiff_t>(get.community.size()), v2c.end());

  const Bytes digest = Str(std::string(r.authKey.empty() ? 0 : 12, '\0'));
  Bytes m = Container(
      kAsnSequence,
      {Int(3),
       Container(kAsnSequence,
                 {Int(77), Int(r.maxSize), Str(std::string(1, static_cast<char>(r.flags))),
                  Int(r.securityModel)}),
       Container(
           kAsnOctetString,
           {Container(kAsnSequence, {Str(r.engineId), Int(r.boots), Int(r.time), Str(r.user),
                                     digest, Str((r.flags & 0x02) ? std::string(8, '\0') : "")})}),
       Container(kAsnSequence, {Str(r.engineId), Str(r.context), pdu})});
  if (!r.authKey.empty()) {  // the placeholder is the only run of twelve zero octets
    auto at = std::search(m.begin(), m.end(), digest.begin(), digest.end()) + 2;
    EXPECT_TRUE(CalculateDigest(AuthProtocol::kMd5, r.authKey, m.data(), m.size(), &*at));
  }
  return m;
}

// The message with one octet more at the end of the innermost of the given containers (each a
// four-octet header, outermost first), or behind the message when none is given.
std::vector<std::uint8_t> WithOctetAtEnd(std::vector<std::uint8_t> bytes,
                                         const std::vector<std::size_t>& containers) {
  std::size_t end =
      containers.empty() ? bytes.size() : containers.back() + 4 + bytes[containers.back() + 3];
  bytes.insert(bytes.begin() + static_cast<std::ptrdiff_t>(end), 0);
  for (std::size_t at : containers) ++bytes[at + 3];
  return bytes;
}

class V3MessageTest : public SnmpAgentTest {
 protected:
  void SetUp() override {
    SnmpAgentTest::SetUp();
    ResetV3Statistics();
    ClearEngineId();
    ASSERT_EQ(AddUsmUserFromHost("alice", "MD5_AUTH", "alicepassword", "NO_PRIV", "", 1), 1);
    CreateAndAddSnmpVacmContextTableEntry("");
    CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, "alice", "staff", 3);
    CreateAndAddNewSnmpVacmAccessTableEntry("staff", "", 3, 1, 1, "system", "system", "", 3);
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("system", "1.3.6.1.2.1.1", "", 1, 3);
    CreateLCDVacmAccessTable();
    CreateLCDVacmViewTreeFamilyTable();
    agent_.agentInfo->engineBoots = 3;
    engineTime_ = std::min(1000u, GetCurrentSeconds());  // the monotonic clock may be young
    agent_.agentInfo->startTime = GetCurrentSeconds() - engineTime_;
    engineId_ = AgentEngineId(agent_);
  }
  void TearDown() override {
    FreeSnmpV3Resources();
    gv_dropV1V2Requests = 0;
    SnmpAgentTest::TearDown();
  }

  V3Request Authenticated() {
    V3Request r;
    r.flags = 0x05;
    r.engineId = engineId_;
    r.boots = 3;
    r.time = static_cast<std::int32_t>(engineTime_);
    r.user = "alice";
    r.authKey = GetLocalKeyValue("alicepassword", AuthProtocol::kMd5, engineId_);
    r.name = O("1.3.6.1.2.1.1.5.0");
    return r;
  }

  // Processes a v3 message; the reply's scoped PDU parsed (only for unencrypted replies).
  std::optional<SnmpPdu> Exchange3(const std::vector<std::uint8_t>& datagram) {
    reply_.assign(kMaxSnmpMessage, 0);
    std::size_t length = reply_.size();
    if (ProcessSnmpMessage(datagram.data(), datagram.size(), reply_.data(), &length, agent_) !=
        kMessageReply) {
      return std::nullopt;
    }
    reply_.resize(length);
    const Bytes& reply = reply_;
    std::size_t global = Field(reply, Field(reply, 0).contents).end;  // behind msgVersion
    replyFlags_ = reply[Field(reply, global).end - 4];  // msgGlobalData ends: flags, 02 01 03
    Tlv scoped = Field(reply, Field(reply, Field(reply, global).end).end);
    std::size_t pdu = Field(reply, Field(reply, scoped.contents).end).end;  // behind the context
    SnmpPdu parsed;
    PduLayout layout;
    if (ParseSnmpPdu(reply.data(), reply.data() + pdu, static_cast<std::int32_t>(scoped.end - pdu),
                     &parsed, &layout, false) != ParseResult::kParsed)
      return std::nullopt;
    return parsed;
  }

  std::string engineId_;
  std::uint32_t engineTime_ = 0;
  std::vector<std::uint8_t> reply_;
  std::uint8_t replyFlags_ = 0xFF;
};

TEST_F(V3MessageTest, SecurityErrorsGetTheirReports) {
  const std::string wrongKey = GetLocalKeyValue("wrongpassword", AuthProtocol::kMd5, engineId_);
  const struct {
    const char* what;
    std::function<void(V3Request&)> change;
    std::uint32_t statsColumn, count;  // usmStats.<column>.0 and its value
  } cases[] = {
      {"discovery", [](V3Request& r) { r.engineId = r.user = r.authKey = "", r.flags = 4; }, 4, 1},
      {"unknown user", [](V3Request& r) { r.user = "mallory"; }, 3, 1},
      {"wrong digest", [&](V3Request& r) { r.authKey = wrongKey; }, 5, 1},
      {"level above the user's", [](V3Request& r) { r.flags = 0x07; }, 1, 1},
      {"time outside the window", [](V3Request& r) { r.time += 152; }, 2, 1},
      {"other boots", [](V3Request& r) { r.boots = 4; }, 2, 2},
      {"latched boots", [&](V3Request& r) { r.boots = agent_.agentInfo->engineBoots = 2147483647; },
       2, 3},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    V3Request request = Authenticated();
    c.change(request);
    auto report = Exchange3(Encode(request));
    ASSERT_TRUE(report && report->type == kReport && report->requestVarBinds.size() == 1);
    EXPECT_EQ(report->requestId, 4242);
    EXPECT_EQ(report->requestVarBinds[0].name, (Oid{1, 3, 6, 1, 6, 3, 15, 1, 1, c.statsColumn, 0}));
    EXPECT_EQ(report->requestVarBinds[0].value, VarValue::Unsigned(kAsnCounter, c.count));
    EXPECT_NE(std::string(reply_.begin(), reply_.end()).find(engineId_), std::string::npos);
  }
  // The last Report is authenticated and tells this engine's boots, so that the manager can resync.
  EXPECT_EQ(replyFlags_ & 0x03, 0x01);
  std::string text(reply_.begin(), reply_.end());
  EXPECT_EQ(text.substr(text.find(engineId_) + engineId_.size(), 6), "\x02\x04\x7f\xff\xff\xff");
}

TEST_F(V3MessageTest, AuthenticatedRequestsAreAnsweredWithinTheirView) {
  V3Request request = Authenticated();
  request.time -= 149;  // still within the time window
  auto reply = Exchange3(Encode(request));
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->type, kGetResponse);
  EXPECT_EQ(reply->requestVarBinds.at(0).value, VarValue::Octets(kAsnOctetString, "r1"));
  request.name = O("1.3.6.1.2.1.2.2.1.2.1");
  EXPECT_EQ(Exchange3(Encode(request)).value().errorStatus, kAuthorizationError);
  request = Authenticated();
  request.context = "other";
  EXPECT_EQ(Exchange3(Encode(request)).value().errorStatus, kAuthorizationError);
}

TEST_F(V3MessageTest, InvalidMessagesAreDroppedAndCounted) {
  V3Request small = Authenticated();
  small.maxSize = 483;
  EXPECT_FALSE(Exchange3(Encode(small)));
  EXPECT_EQ(V3Count(V3Counter::kInvalidMsgs), 1u);
  V3Request model = Authenticated();
  model.securityModel = 2;
  EXPECT_FALSE(Exchange3(Encode(model)));
  EXPECT_EQ(V3Count(V3Counter::kUnknownSecurityModels), 1u);
  V3Request privWithoutAuth = Authenticated();
  privWithoutAuth.flags = 0x06;
  EXPECT_FALSE(Exchange3(Encode(privWithoutAuth)));
  EXPECT_EQ(V3Count(V3Counter::kInvalidMsgs), 2u);
  // Every field ends within its container, and a container holds its fields and nothing else.
  V3Request plain = Authenticated();
  plain.flags = 0x04, plain.authKey.clear();  // no digest: every field is read before an answer
  const std::vector<std::uint8_t> good = Encode(plain);
  const std::size_t global = 7;  // behind the outer header and msgVersion
  const std::size_t wrapper = global + 4 + good[global + 3];
  const std::size_t usm = wrapper + 4;
  const std::size_t scoped = wrapper + 4 + good[wrapper + 3];
  std::vector<std::vector<std::uint8_t>> malformed(2, good);
  --malformed[0][global + 3];  // msgSecurityModel runs past msgGlobalData
  --malformed[1][usm + 3];     // msgPrivacyParameters runs past the USM SEQUENCE
  for (std::vector<std::size_t> around : std::vector<std::vector<std::size_t>>{
           {0, global}, {0, wrapper}, {0, wrapper, usm}, {0, scoped}})
    malformed.push_back(WithOctetAtEnd(good, around));
  // Behind the scoped PDU or behind the message: refused before the digest is checked.
  malformed.push_back(WithOctetAtEnd(Encode(Authenticated()), {0}));
  malformed.push_back(WithOctetAtEnd(Encode(Authenticated()), {}));
  for (std::size_t i = 0; i < malformed.size(); ++i) {
    EXPECT_FALSE(Exchange3(malformed[i])) << i;
    EXPECT_EQ(SnmpCount(SnmpCounter::kAsnParseErrors), i + 1);
  }
  EXPECT_TRUE(Exchange3(good));
  // A v3 engine still answers v2c unless told to drop it.
  Request v2c = GetOf({"1.3.6.1.2.1.1.5.0"});
  EXPECT_TRUE(Send(v2c));
  gv_dropV1V2Requests = 1;
  EXPECT_FALSE(Send(v2c));
}

TEST_F(V3MessageTest, EngineObjectsAreServedByTheEngineAndReadOnly) {
  RegisterEngineObjects();
  StoreTreeCellsRefInArray();
  V3Request unknown = Authenticated();
  unknown.user = "mallory";
  ASSERT_TRUE(Exchange3(Encode(unknown)));
  Request next;  // a walk of the engine's objects, in order
  next.type = kGetNextRequest;
  next.bindings = {{O("1.3.6.1.6.3"), VarValue::Empty(kAsnNull)}};
  std::vector<std::string> names;
  std::vector<VarValue> values;
  for (auto reply = Send(next); reply && reply->requestVarBinds.at(0).value.type != kEndOfMibView;
       reply = Send(next)) {
    next.bindings[0].first = reply->requestVarBinds[0].name;
    names.push_back(OidToPlainText(next.bindings[0].first).substr(12));
    values.push_back(reply->requestVarBinds[0].value);
  }
  std::vector<std::string> expected;
  for (auto [group, count] : {std::pair{"10.2.1.", 4}, {"11.2.1.", 3}, {"15.1.1.", 6}})
    for (int i = 1; i <= count; ++i) expected.push_back(group + std::to_string(i) + ".0");
  ASSERT_EQ(names, expected);
  EXPECT_EQ(values[0], VarValue::Octets(kAsnOctetString, engineId_));
  EXPECT_EQ(values[1], VarValue::Integer(3));
  EXPECT_NEAR(values[2].AsInt32(), engineTime_, 1);
  EXPECT_EQ(values[3], VarValue::Integer(19989));
  EXPECT_EQ(values[9], VarValue::Unsigned(kAsnCounter, 1));  // usmStatsUnknownUserNames
  next.type = kSetRequest, next.community = "private";
  next.bindings = {{O("1.3.6.1.6.3.10.2.1.2.0"), VarValue::Integer(9)}};
  EXPECT_EQ(Send(next).value().errorStatus, kNotWritable);
}

}  // namespace
}  // namespace tessel
