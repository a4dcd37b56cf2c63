#include "snmp/handlers.h"

#include <gtest/gtest.h>

#include <tuple>

#include "snmp/pdu.h"
#include "support/memory_host.h"

namespace tessel {
namespace {

using namespace std::string_literals;

// Can answer a table GetNext with a fixed answer in place of its stored objects.
class FixedNextHost : public MemoryHost {
 public:
  HostAnswer TableGetNextOidVal(const HostValueQuery& query) override {
    HostAnswer stored = MemoryHost::TableGetNextOidVal(query);
    return fixedNext ? *fixedNext : stored;
  }
  std::optional<HostAnswer> fixedNext;
};

const Oid kEntry = {1, 3, 6, 1, 2, 1, 2, 2, 1};

Oid Column(std::uint32_t column, const Oid& instance = {}) {
  Oid oid = kEntry;
  oid.push_back(column);
  oid.insert(oid.end(), instance.begin(), instance.end());
  return oid;
}

class HandlersTest : public ::testing::Test {
 protected:
  void SetUp() override {
    host_.RecordReads();
    InstallHost(&host_);
    system_.label = "system";
    system_.oid = {1, 3, 6, 1, 2, 1, 1, 1};
    system_.subIds = {1, 3, 5};
    system_.dataTypes = {kAsnOctetString, kAsnTimeTicks, kAsnOctetString};

    table_.label = "ifTable";
    table_.isTable = true;
    table_.oid = {1, 3, 6, 1, 2, 1, 2, 2};
    table_.subIds = {1, 2, 3, 4, 5, 6};
    table_.dataTypes = {kAsnOctetString, kAsnInteger,     kAsnCounter64,
                        kAsnOctetString, kAsnOctetString, kAsnIpAddress};
    table_.syntaxes = {"", "", "", "DateAndTime", "MacAddress", ""};
    table_.hasSyntaxes = true;
  }
  void TearDown() override { InstallHost(nullptr); }

  std::optional<VarValue> ScalarRead(std::uint8_t type, Oid oid) {
    return ScalarProcessReadReq(type, &oid, &errorCode_, {&agent_, &system_});
  }
  std::optional<VarValue> TableRead(std::uint8_t type, Oid* oid) {
    return TableProcessReadReq(type, oid, &errorCode_, {&agent_, &table_});
  }
  std::optional<VarValue> Set(const Oid& oid, const VarValue& value) {
    return TableProcessWriteReq(oid, value, &errorCode_, {&agent_, &table_});
  }
  std::string SentText() const { return host_.SetCalls().back().valueText; }

  FixedNextHost host_;
  AgentSession agent_ = LocalAgent(7);
  TreeCell system_;
  TreeCell table_;
  std::uint8_t errorCode_ = 0xEE;
};

TEST_F(HandlersTest, ScalarGetAsksForTheGroupAndInstanceZero) {
  host_.SetValue("1.3.6.1.2.1.1.3.0", "12345");
  EXPECT_EQ(ScalarRead(kGetRequest, {1, 3, 6, 1, 2, 1, 1, 3, 0}),
            VarValue::Unsigned(kAsnTimeTicks, 12345));
  EXPECT_EQ(errorCode_, 0);
  const HostValueQuery q = host_.LastRead();
  EXPECT_EQ(std::tie(q.label, q.objectOid, q.subId, q.instance, q.dataType, q.syntax),
            std::tuple("system", ".1.3.6.1.2.1.1", "3", ".0", kAsnTimeTicks, std::nullopt));
  // The configured port is the stored one plus one.
  EXPECT_EQ(std::tie(q.agentPort, q.agentAddress, q.databaseName, q.tableName, q.agentId),
            std::tuple(161, "127.0.0.1", "db", "agent1", 7));
}

TEST_F(HandlersTest, ScalarMissingValues) {
  const Oid oid = {1, 3, 6, 1, 2, 1, 1, 5, 0};
  EXPECT_EQ(ScalarRead(kGetNextRequest, oid), std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  EXPECT_EQ(host_.LastRead().previousSubId, "3");
  host_.SetError("1.3.6.1.2.1.1.5.0", "5");
  EXPECT_EQ(ScalarRead(kGetRequest, oid), std::nullopt);
  EXPECT_EQ(errorCode_, kReadOnly);  // a Get keeps the host's code
  EXPECT_EQ(ScalarRead(kGetNextRequest, oid), std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  // An error is a plain number in the host's list; any other text is genErr.
  const std::pair<const char*, int> errors[] = {
      {"1", kNoSuchObject}, {"6", kGenErr}, {"abc", kGenErr}, {"017", kGenErr}};
  for (auto [text, code] : errors) {
    host_.SetError("1.3.6.1.2.1.1.5.0", text);
    EXPECT_EQ(ScalarRead(kGetRequest, oid), std::nullopt);
    EXPECT_EQ(errorCode_, code) << text;
  }
  // A null value, or no host at all, is no such instance.
  host_.SetValue("1.3.6.1.2.1.1.5.0", std::nullopt);
  for (HostBridge* host : {static_cast<HostBridge*>(&host_), static_cast<HostBridge*>(nullptr)}) {
    InstallHost(host);
    errorCode_ = 0;
    EXPECT_EQ(ScalarRead(kGetRequest, oid), std::nullopt);
    EXPECT_EQ(errorCode_, kNoSuchInstance);
  }
}

// What a scalar Set writes is pinned by the PDU tests; here, the port it tells the host.
TEST_F(HandlersTest, ScalarSetTellsTheStoredPort) {
  const VarValue name = VarValue::Octets(kAsnOctetString, "AB");
  EXPECT_EQ(
      ScalarProcessWriteReq({1, 3, 6, 1, 2, 1, 1, 5, 0}, name, &errorCode_, {&agent_, &system_}),
      name);
  EXPECT_EQ(host_.SetCalls().back().agentPort, 160);
}

// Conversions by column type are pinned in value_text_test.cc; here, what the host is asked.
TEST_F(HandlersTest, TableGetAsksForTheEntryColumnAndInstance) {
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.10.0.0.1.161", "-5");
  Oid oid = Column(2, {10, 0, 0, 1, 161});
  EXPECT_EQ(TableRead(kGetRequest, &oid), VarValue::Integer(-5));
  EXPECT_EQ(errorCode_, 0);
  const HostValueQuery q = host_.LastRead();
  EXPECT_EQ(std::tie(q.instance, q.objectOid, q.subId),
            std::tuple(".10.0.0.1.161", ".1.3.6.1.2.1.2.2.1", "2"));
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.10.0.0.1.161", "3000000000");  // does not convert
  EXPECT_EQ(TableRead(kGetRequest, &oid), std::nullopt);
  EXPECT_EQ(errorCode_, kGenErr);
}

TEST_F(HandlersTest, TableGetNextFollowsTheHostAnswer) {
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.3", "7");
  Oid oid = Column(2);
  EXPECT_EQ(TableRead(kGetNextRequest, &oid), VarValue::Integer(7));
  EXPECT_EQ(errorCode_, 0);
  EXPECT_EQ(oid, Column(2, {3}));
  HostValueQuery q = host_.LastRead();
  EXPECT_EQ(std::tie(q.instance, q.column, q.nextColumn, q.nextDataType, q.agentPort),
            std::tuple(std::nullopt, 2, 3, kAsnCounter64, 161));

  oid = Column(6, {1});  // last column: nothing after it, and the host has nothing
  EXPECT_EQ(TableRead(kGetNextRequest, &oid), std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  q = host_.LastRead();
  EXPECT_EQ(std::tie(q.nextColumn, q.nextDataType), std::tuple(-1, 0));
}

TEST_F(HandlersTest, TableGetNextRefusesUnusableAnswers) {
  const HostAnswer answers[] = {
      std::nullopt,
      std::vector<std::optional<std::string>>{std::nullopt, "2.4"s, "-1"s},
      std::vector<std::optional<std::string>>{"7"s, "2.3"s, "-1"s},  // not after the request
      std::vector<std::optional<std::string>>{"7"s, "2..4"s, "-1"s},
      std::vector<std::optional<std::string>>{"7"s, std::nullopt, "-1"s},
  };
  for (const HostAnswer& answer : answers) {
    host_.fixedNext = answer;
    Oid oid = Column(2, {3});
    EXPECT_EQ(TableRead(kGetNextRequest, &oid), std::nullopt);
    EXPECT_EQ(errorCode_, kNoSuchInstance);
    EXPECT_EQ(oid, Column(2, {3}));
  }
}

TEST_F(HandlersTest, TableSetSendsTheColumnTextAndRepeatsTheValue) {
  const VarValue mac = VarValue::Octets(kAsnOctetString, "\x00\x1A\x2B\x3C\x4D\x5E"s);
  EXPECT_EQ(Set(Column(5, {5}), mac), mac);  // by the column's syntax
  EXPECT_EQ(errorCode_, 0);
  EXPECT_EQ(SentText(), "00:1a:2b:3c:4d:5e");
  const HostValueQuery sent = host_.SetCalls().back();
  EXPECT_EQ(std::tie(sent.instance, sent.subId, sent.agentPort), std::tuple(".5", "5", 160));
  EXPECT_EQ(Set(Column(2, {5}), VarValue::Octets(kAsnOctetString, "A")), std::nullopt);
  EXPECT_EQ(errorCode_, kWrongType);
  EXPECT_EQ(Set(Column(2), VarValue::Integer(1)), std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  EXPECT_EQ(host_.SetCalls().size(), 1u);
  host_.SetError("1.3.6.1.2.1.2.2.1.2.5", "17");
  EXPECT_EQ(Set(Column(2, {5}), VarValue::Integer(1)), std::nullopt);
  EXPECT_EQ(errorCode_, kNotWritable);
}

}  // namespace
}  // namespace tessel
