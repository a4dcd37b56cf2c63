#include "snmp/pdu_processing.h"

#include <gtest/gtest.h>

#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

class PduProcessingTest : public SnmpAgentTest {
 protected:
  // Error status and index of a reply; {-1, -1} when there was none.
  static std::pair<std::int32_t, std::int32_t> Status(const std::optional<SnmpPdu>& reply) {
    return reply ? std::pair(reply->errorStatus, reply->errorIndex) : std::pair(-1, -1);
  }
  static std::vector<std::string> Names(const SnmpPdu& reply) {
    std::vector<std::string> names;
    for (const VarBind& binding : reply.requestVarBinds)
      names.push_back(OidToPlainText(binding.name));
    return names;
  }

  // One GetNext per step from `from`, as a manager's walk does; the names answered.
  std::vector<std::string> Walk(std::int32_t version, std::string from) {
    std::vector<std::string> names;
    for (int step = 0; step < 100; ++step) {
      auto reply = Send(GetOf({from}, kGetNextRequest, version));
      if (!reply || reply->errorStatus != 0) break;
      if (reply->requestVarBinds.at(0).value.type == kEndOfMibView) break;
      names.push_back(from = Names(*reply).at(0));
    }
    return names;
  }

  Request SetOf(std::int32_t version, std::vector<std::pair<Oid, VarValue>> bindings) {
    Request request;
    request.version = version;
    request.type = kSetRequest;
    request.community = "private";
    request.bindings = std::move(bindings);
    return request;
  }

  SnmpPdu Bulk(std::int32_t nonRepeaters, std::int32_t maxRepetitions,
               std::vector<std::string> oids) {
    Request request = GetOf(oids, kGetBulkRequest);
    request.field1 = nonRepeaters;
    request.field2 = maxRepetitions;
    auto reply = Send(request);
    EXPECT_TRUE(reply);
    return reply.value_or(SnmpPdu{});
  }
};

const std::vector<std::string> kWholeMib = {
    "1.3.6.1.2.1.1.1.0",        "1.3.6.1.2.1.1.2.0",        "1.3.6.1.2.1.1.3.0",
    "1.3.6.1.2.1.1.4.0",        "1.3.6.1.2.1.1.5.0",        "1.3.6.1.2.1.1.6.0",
    "1.3.6.1.2.1.1.7.0",        "1.3.6.1.2.1.2.2.1.1.1",    "1.3.6.1.2.1.2.2.1.1.2",
    "1.3.6.1.2.1.2.2.1.2.1",    "1.3.6.1.2.1.2.2.1.2.2",    "1.3.6.1.2.1.2.2.1.10.1",
    "1.3.6.1.2.1.2.2.1.10.2",   "1.3.6.1.2.1.31.1.1.1.1.1", "1.3.6.1.2.1.31.1.1.1.1.2",
    "1.3.6.1.2.1.31.1.1.1.6.1", "1.3.6.1.2.1.31.1.1.1.6.2"};

TEST_F(PduProcessingTest, WalkVisitsEveryObjectInOrderAcrossCellsAndColumns) {
  EXPECT_EQ(Walk(kSnmpV2c, "1.3"), kWholeMib);
  // SNMPv1 managers never see Counter64 instances.
  std::vector<std::string> v1(kWholeMib.begin(), kWholeMib.end() - 2);
  EXPECT_EQ(Walk(kSnmpV1, "1.3"), v1);
  // Starting points inside, between and below registered objects.
  EXPECT_EQ(Walk(kSnmpV2c, "1.3.6.1.2.1.1.1").front(), "1.3.6.1.2.1.1.1.0");
  EXPECT_EQ(Walk(kSnmpV2c, "1.3.6.1.2.1.1.4.0.7").front(), "1.3.6.1.2.1.1.5.0");
  EXPECT_EQ(Walk(kSnmpV2c, "1.3.6.1.2.1.2.2.1.3").front(), "1.3.6.1.2.1.2.2.1.10.1");
  EXPECT_EQ(Walk(kSnmpV2c, "1.3.6.1.2.1.2.2.1.2.2").front(), "1.3.6.1.2.1.2.2.1.10.1");
  EXPECT_EQ(Walk(kSnmpV2c, "1.3.6.1.2.1.2.3").front(), "1.3.6.1.2.1.31.1.1.1.1.1");
}

TEST_F(PduProcessingTest, EndOfTheMibPerVersion) {
  Request request = GetOf({"1.3.6.1.2.1.1.5.0", "1.3.6.1.2.1.31.1.1.1.6.2"}, kGetNextRequest);
  auto v2 = Send(request);
  ASSERT_TRUE(v2);
  EXPECT_EQ(v2->errorStatus, 0);
  EXPECT_EQ(v2->requestVarBinds[1].value.type, kEndOfMibView);
  EXPECT_EQ(v2->requestVarBinds[1].name, O("1.3.6.1.2.1.31.1.1.1.6.2"));
  request.version = kSnmpV1;
  request.bindings[1].first = O("1.3.6.1.2.1.31.1.1.1.1.2");  // only Counter64 follows
  EXPECT_EQ(Status(Send(request)), std::pair(kNoSuchName, 2));
}

TEST_F(PduProcessingTest, GetAnswersValuesAndExceptionsPerVersion) {
  Request request = GetOf({"1.3.6.1.2.1.1.3.0", "1.3.6.1.2.1.1.9.0", "1.3.6.1.2.1.2.2.1.2.7",
                           "1.3.6.1.2.1.31.1.1.1.6.1"});
  auto v2 = Send(request);
  ASSERT_TRUE(v2);
  ASSERT_EQ(v2->requestVarBinds.size(), 4u);
  EXPECT_EQ(v2->requestVarBinds[0].value, VarValue::Unsigned(kAsnTimeTicks, 12345));
  EXPECT_EQ(v2->requestVarBinds[1].value.type, kNoSuchObject);
  EXPECT_EQ(v2->requestVarBinds[2].value.type, kNoSuchInstance);
  EXPECT_EQ(v2->requestVarBinds[3].value, VarValue::Unsigned(kAsnCounter64, 4294967296ull));
  request.version = kSnmpV1;
  request.bindings.erase(request.bindings.begin() + 1, request.bindings.begin() + 3);
  EXPECT_EQ(Status(Send(request)), std::pair(kNoSuchName, 2));
}

TEST_F(PduProcessingTest, AccessRulesAndHostErrors) {
  RegisterCell("hidden", "1.3.6.1.4.1.5.1", false, {{"1", "2", "0"}, {"2", "2", "43706"}});
  StoreTreeCellsRefInArray();
  host_.SetValue("1.3.6.1.4.1.5.1.0", "1");
  host_.SetValue("1.3.6.1.4.1.5.2.0", "2");
  Request get = GetOf({"1.3.6.1.4.1.5.1.0"});
  EXPECT_EQ(Status(Send(get)), std::pair(kNoAccess, 1));
  get.version = kSnmpV1;
  EXPECT_EQ(Status(Send(get)), std::pair(kNoSuchName, 1));
  // A walk steps over the column that is not accessible.
  EXPECT_EQ(Walk(kSnmpV2c, "1.3.6.1.4.1.5").front(), "1.3.6.1.4.1.5.2.0");

  Request set = SetOf(kSnmpV2c, {{O("1.3.6.1.4.1.5.2.0"), VarValue::Integer(9)}});
  auto written = Send(set);
  ASSERT_TRUE(written);
  EXPECT_EQ(written->errorStatus, 0);
  EXPECT_EQ(written->requestVarBinds[0].value, VarValue::Integer(9));
  EXPECT_EQ(host_.ValueOf("1.3.6.1.4.1.5.2.0"), "9");
  set.bindings[0].first = O("1.3.6.1.4.1.5.3.0");
  EXPECT_EQ(Status(Send(set)), std::pair(kNotWritable, 1));
}

// A Set either changes every object it names or none of them.
TEST_F(PduProcessingTest, SetChangesNothingWhenABindingIsRefused) {
  const Oid contact = O("1.3.6.1.2.1.1.4.0"), location = O("1.3.6.1.2.1.1.6.0");
  const Oid descr = O("1.3.6.1.2.1.1.1.0");
  const VarValue text = VarValue::Octets(kAsnOctetString, "x");
  struct Case {
    std::int32_t version;
    std::pair<Oid, VarValue> second;
    std::int32_t status;
  };
  for (const Case& c : {Case{kSnmpV2c, {location, VarValue::Integer(5)}, kWrongType},
                        Case{kSnmpV2c, {descr, text}, kNotWritable},
                        Case{kSnmpV1, {location, VarValue::Integer(5)}, kBadValue},
                        Case{kSnmpV1, {descr, text}, kNoSuchName}}) {
    EXPECT_EQ(Status(Send(SetOf(c.version, {{contact, text}, c.second}))), std::pair(c.status, 2));
  }
  EXPECT_EQ(host_.ValueOf("1.3.6.1.2.1.1.4.0"), "ops");
  EXPECT_TRUE(host_.SetCalls().empty());  // refused before anything was written
}

TEST_F(PduProcessingTest, SetRestoresEarlierWritesWhenTheHostRefusesALaterOne) {
  host_.SetError("1.3.6.1.2.1.1.6.0", "4");
  Request set = SetOf(kSnmpV2c, {{O("1.3.6.1.2.1.1.4.0"), VarValue::Octets(kAsnOctetString, "x")},
                                 {O("1.3.6.1.2.1.1.5.0"), VarValue::Octets(kAsnOctetString, "y")},
                                 {O("1.3.6.1.2.1.1.6.0"), VarValue::Octets(kAsnOctetString, "z")}});
  EXPECT_EQ(Status(Send(set)), std::pair(kBadValue, 3));
  EXPECT_EQ(host_.ValueOf("1.3.6.1.2.1.1.4.0"), "ops");
  EXPECT_EQ(host_.ValueOf("1.3.6.1.2.1.1.5.0"), "r1");
  // When the earlier value cannot be written back either, the manager is told so.
  host_.RefuseWrite("1.3.6.1.2.1.1.4.0", "ops");
  EXPECT_EQ(Status(Send(set)), std::pair(kUndoFailed, 0));
  EXPECT_EQ(host_.ValueOf("1.3.6.1.2.1.1.4.0"), "x");
  EXPECT_EQ(host_.ValueOf("1.3.6.1.2.1.1.5.0"), "r1");
}

TEST_F(PduProcessingTest, GetBulkRepeatsTheRepeatersAfterTheNonRepeaters) {
  SnmpPdu reply = Bulk(1, 3, {"1.3.6.1.2.1.1.1", "1.3.6.1.2.1.2.2.1.1", "1.3.6.1.2.1.2.2.1.2"});
  EXPECT_EQ(Names(reply), (std::vector<std::string>{
                              "1.3.6.1.2.1.1.1.0", "1.3.6.1.2.1.2.2.1.1.1", "1.3.6.1.2.1.2.2.1.2.1",
                              "1.3.6.1.2.1.2.2.1.1.2", "1.3.6.1.2.1.2.2.1.2.2",
                              "1.3.6.1.2.1.2.2.1.2.1", "1.3.6.1.2.1.2.2.1.10.1"}));
  EXPECT_EQ(Bulk(1, 0, {"1.3.6.1.2.1.1.1", "1.3.6.1.2.1.2.2.1.1"}).requestVarBinds.size(), 1u);
  EXPECT_EQ(Bulk(-5, -1, {"1.3.6.1.2.1.1.1", "1.3.6.1.2.1.2.2.1.1"}).requestVarBinds.size(), 0u);
  EXPECT_EQ(Bulk(-5, 2, {"1.3.6.1.2.1.1.1"}).requestVarBinds.size(), 2u);
  EXPECT_EQ(Bulk(5, 100, {"1.3.6.1.2.1.1.1"}).requestVarBinds.size(), 1u);
  // Past the end every repeater stops at endOfMibView.
  SnmpPdu tail = Bulk(0, 50, {"1.3.6.1.2.1.31.1.1.1.6.1"});
  ASSERT_EQ(tail.requestVarBinds.size(), 2u);
  EXPECT_EQ(tail.requestVarBinds[1].value.type, kEndOfMibView);
}

TEST_F(PduProcessingTest, GetBulkReplyIsTrimmedOnlyAtItsEnd) {
  for (int row = 3; row <= 400; ++row) {
    host_.SetValue("1.3.6.1.2.1.2.2.1.2." + std::to_string(row), std::string(100, 'd'));
  }
  SnmpPdu reply = Bulk(0, 1000000, {"1.3.6.1.2.1.2.2.1.2"});
  ASSERT_GT(reply.requestVarBinds.size(), 100u);
  ASSERT_LT(reply.requestVarBinds.size(), 399u);
  EXPECT_LE(lastReply_.size(), kMaxSnmpMessage);
  EXPECT_GT(lastReply_.size(), kMaxSnmpMessage - 200);
  std::vector<std::string> rows = Names(reply);
  for (std::size_t i = 0; i < rows.size(); ++i)
    EXPECT_EQ(rows[i], "1.3.6.1.2.1.2.2.1.2." + std::to_string(i + 1));
}

}  // namespace
}  // namespace tessel
