#include "snmp/scrambler.h"

#include <gtest/gtest.h>

#include "snmp/message.h"
#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

Request GetOf(std::vector<std::string> oids) {
  Request request;
  for (const std::string& oid : oids)
    request.bindings.push_back({O(oid), VarValue::Empty(kAsnNull)});
  return request;
}

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

TEST_F(ScramblerTest, OffMeansNoHostCallAndAnEmptyAnswerChangesNothing) {
  std::optional<std::vector<std::uint8_t>> plain = ReplyToGet();
  ASSERT_TRUE(plain);
  EXPECT_TRUE(host_.ScrambleQueries().empty());

  ScrambleReplies(ScrambleChanges{});
  EXPECT_EQ(ReplyToGet(), plain);
  host_.SetScrambler(nullptr);  // the host answers null: the PDU goes on as it was
  EXPECT_EQ(ReplyToGet(), plain);
  EXPECT_EQ(host_.ScrambleQueries().size(), 4u);
}

TEST_F(ScramblerTest, TheHostSeesTheRequestThenTheReplyOfItsAgent) {
  ScrambleReplies(ScrambleChanges{});
  ASSERT_TRUE(ReplyToGet());
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
  ASSERT_EQ(reply.values.size(), 2u);
  EXPECT_EQ(reply.values[0], "r1");
}

TEST_F(ScramblerTest, ReplacedHeaderFieldsReachTheWireAndTheBindingsStay) {
  std::optional<std::vector<std::uint8_t>> plain = ReplyToGet();
  ASSERT_TRUE(plain);
  SnmpPdu expected;
  ASSERT_EQ(ParseSnmpMessage(plain->data(), plain->size(), &expected), 1);

  ScrambleChanges changes;
  changes.requestId = 5;
  ScrambleReplies(changes);
  std::optional<SnmpPdu> reply = Send(GetOf({"1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.1.4.0"}));
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->requestId, 5);
  EXPECT_EQ(reply->type, kGetResponse);
  ASSERT_EQ(reply->requestVarBinds.size(), expected.requestVarBinds.size());
  for (std::size_t i = 0; i < expected.requestVarBinds.size(); ++i) {
    EXPECT_EQ(reply->requestVarBinds[i].name, expected.requestVarBinds[i].name);
    EXPECT_EQ(reply->requestVarBinds[i].value.octets, expected.requestVarBinds[i].value.octets);
  }

  changes.community = "x";
  changes.errorStatus = 5;
  changes.errorIndex = 1;
  ScrambleReplies(changes);
  reply = Send(GetOf({"1.3.6.1.2.1.1.5.0"}));
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->community, "x");
  EXPECT_EQ(reply->errorStatus, 5);
  EXPECT_EQ(reply->errorIndex, 1);
}

TEST_F(ScramblerTest, AnOidThatIsNoOidLeavesTheWholePduAsItWas) {
  std::optional<std::vector<std::uint8_t>> plain = ReplyToGet();
  ScrambleChanges changes;
  changes.requestId = 5;
  changes.oidField = "1.3.x";
  ScrambleReplies(changes);
  EXPECT_EQ(ReplyToGet(), plain);
}

TEST_F(ScramblerTest, AChangedRequestIsWhatTheAgentAnswers) {
  gv_scramblePdu = 1;
  host_.SetScrambler([](const ScrambleQuery& query) -> std::optional<ScrambleChanges> {
    ScrambleChanges changes;
    if (!query.isResponse) changes.requestId = 77;
    return changes;
  });
  std::optional<SnmpPdu> reply = Send(GetOf({"1.3.6.1.2.1.1.5.0"}));
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->requestId, 77);
  EXPECT_EQ(host_.ScrambleQueries().back().requestId, 77);  // the reply shows the changed id
}

}  // namespace
}  // namespace tessel
