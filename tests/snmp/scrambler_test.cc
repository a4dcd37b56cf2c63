#include "snmp/scrambler.h"

#include <gtest/gtest.h>

#include <tuple>

#include "snmp/message.h"
#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

class ScramblerTest : public SnmpAgentTest {
 protected:
  void TearDown() override {
    gv_scramblePdu = 0;
    SnmpAgentTest::TearDown();
  }
  // The reply's bytes to a Get of sysName.0 and sysContact.0, or nothing when it was dropped.
  std::optional<std::vector<std::uint8_t>> ReplyToGet() {
    if (!Send(GetOf({"1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.1.4.0"}))) return std::nullopt;
    return lastReply_;
  }
  // Scrambles only the replies, with changes.
  void ScrambleReplies(ScrambleChanges changes) {
    gv_scramblePdu = 1;
    host_.SetScrambler([changes](const ScrambleQuery& query) -> std::optional<ScrambleChanges> {
      if (!query.isResponse) return ScrambleChanges{};
      return changes;
    });
  }
};

// Off, the host is never asked; an empty or null answer, or one whose OID is no OID, leaves the
// whole reply as it was.
TEST_F(ScramblerTest, RepliesTheHostDoesNotChangeStayAsTheyWere) {
  std::optional<std::vector<std::uint8_t>> plain = ReplyToGet();
  ASSERT_TRUE(plain);
  EXPECT_TRUE(host_.ScrambleQueries().empty());
  ScrambleReplies(ScrambleChanges{});
  EXPECT_EQ(ReplyToGet(), plain);
  host_.SetScrambler(nullptr);  // the host answers null: the PDU goes on as it was
  EXPECT_EQ(ReplyToGet(), plain);
  EXPECT_EQ(host_.ScrambleQueries().size(), 4u);
  ScrambleChanges notAnOid;
  notAnOid.requestId = 5;
  notAnOid.oidField = "1.3.x";
  ScrambleReplies(notAnOid);
  EXPECT_EQ(ReplyToGet(), plain);
}

// The host sees the request, then the reply of its agent to the request as the host changed it.
TEST_F(ScramblerTest, TheHostSeesTheRequestThenTheReplyToWhatItMadeOfIt) {
  gv_scramblePdu = 1;
  host_.SetScrambler([](const ScrambleQuery& query) -> std::optional<ScrambleChanges> {
    ScrambleChanges changes;
    if (!query.isResponse) changes.requestId = 77;
    return changes;
  });
  std::optional<SnmpPdu> answer = Send(GetOf({"1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.1.4.0"}));
  ASSERT_TRUE(answer);
  EXPECT_EQ(answer->requestId, 77);
  std::vector<ScrambleQuery> queries = host_.ScrambleQueries();
  ASSERT_EQ(queries.size(), 2u);
  const ScrambleQuery& received = queries[0];
  EXPECT_FALSE(received.isResponse);
  EXPECT_EQ(received.pduType, kGetRequest);
  EXPECT_EQ(received.requestId, 42);
  EXPECT_EQ(received.version, kSnmpV2c);
  EXPECT_EQ(received.community, "public");
  EXPECT_EQ(received.oids, (std::vector<std::string>{".1.3.6.1.2.1.1.5.0", ".1.3.6.1.2.1.1.4.0"}));
  EXPECT_EQ(received.agentAddress, agent_.transport.localAddress);
  EXPECT_EQ(received.agentPort, 159);  // configured 161
  const ScrambleQuery& reply = queries[1];
  EXPECT_TRUE(reply.isResponse);
  EXPECT_EQ(reply.pduType, kGetResponse);
  EXPECT_EQ(reply.requestId, 77);
  ASSERT_EQ(reply.values.size(), 2u);
  EXPECT_EQ(reply.values[0], "r1");
}

// Changed header fields reach the wire; with only the request-id changed the bindings stay.
TEST_F(ScramblerTest, ReplacedHeaderFieldsReachTheWireAndTheBindingsStay) {
  ScrambleChanges changes;
  changes.requestId = 5;
  ScrambleReplies(changes);
  std::optional<SnmpPdu> reply = Send(GetOf({"1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.1.4.0"}));
  ASSERT_TRUE(reply);
  EXPECT_EQ(std::tie(reply->type, reply->requestId), std::tuple(kGetResponse, 5));
  ASSERT_EQ(reply->requestVarBinds.size(), 2u);
  EXPECT_EQ(reply->requestVarBinds[0].name, O("1.3.6.1.2.1.1.5.0"));
  EXPECT_EQ(reply->requestVarBinds[0].value, VarValue::Octets(kAsnOctetString, "r1"));
  EXPECT_EQ(reply->requestVarBinds[1].name, O("1.3.6.1.2.1.1.4.0"));
  EXPECT_EQ(reply->requestVarBinds[1].value, VarValue::Octets(kAsnOctetString, "ops"));

  changes.community = "x";
  changes.errorStatus = 5;
  changes.errorIndex = 1;
  ScrambleReplies(changes);
  reply = Send(GetOf({"1.3.6.1.2.1.1.5.0"}));
  ASSERT_TRUE(reply);
  EXPECT_EQ(std::tie(reply->community, reply->errorStatus, reply->errorIndex),
            std::tuple("x", 5, 1));
}

}  // namespace
}  // namespace tessel
