#include "snmp/handlers.h"

#include <gtest/gtest.h>

#include <memory>

#include "engine/agent.h"
#include "snmp/pdu.h"
#include "support/memory_host.h"

namespace tessel {
namespace {

using namespace std::string_literals;

// Keeps the last read query, and can answer a table GetNext with a fixed answer.
class RecordingHost : public MemoryHost {
 public:
  HostAnswer ScalarGetOidVal(const HostValueQuery& query) override {
    last = query;
    return MemoryHost::ScalarGetOidVal(query);
  }
  HostAnswer ScalarGetNextOidVal(const HostValueQuery& query) override {
    last = query;
    return MemoryHost::ScalarGetNextOidVal(query);
  }
  HostAnswer TableGetOidVal(const HostValueQuery& query) override {
    last = query;
    return MemoryHost::TableGetOidVal(query);
  }
  HostAnswer TableGetNextOidVal(const HostValueQuery& query) override {
    last = query;
    return fixedNext ? *fixedNext : MemoryHost::TableGetNextOidVal(query);
  }

  HostValueQuery last;
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
    InstallHost(&host_);
    agent_.transport.localAddress = "127.0.0.1";
    agent_.transport.configuredPortMinusOne = 160;
    agent_.agentInfo = std::make_shared<AgentInfo>();
    agent_.agentInfo->databaseName = "db";
    agent_.agentInfo->tableName = "devices";
    agent_.agentInfo->agentId = 7;

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

  std::optional<VarValue> Set(const Oid& oid, const VarValue& value) {
    return TableProcessWriteReq(oid, value, &errorCode_, {&agent_, &table_});
  }
  std::string SentText() const { return host_.SetCalls().back().valueText; }

  RecordingHost host_;
  AgentSession agent_;
  TreeCell system_;
  TreeCell table_;
  std::uint8_t errorCode_ = 0xEE;
};

TEST_F(HandlersTest, ScalarGetAsksForTheGroupAndInstanceZero) {
  host_.SetValue("1.3.6.1.2.1.1.3.0", "12345");
  Oid oid = {1, 3, 6, 1, 2, 1, 1, 3, 0};
  EXPECT_EQ(ScalarProcessReadReq(kGetRequest, &oid, &errorCode_, {&agent_, &system_}),
            VarValue::Unsigned(kAsnTimeTicks, 12345));
  EXPECT_EQ(errorCode_, 0);
  const HostValueQuery& query = host_.last;
  EXPECT_EQ(query.label, "system");
  EXPECT_EQ(query.objectOid, ".1.3.6.1.2.1.1");
  EXPECT_EQ(query.subId, "3");
  EXPECT_EQ(query.instance, ".0");
  EXPECT_EQ(query.dataType, kAsnTimeTicks);
  EXPECT_EQ(query.syntax, std::nullopt);
  EXPECT_EQ(query.agentPort, 161);  // the configured port
  EXPECT_EQ(query.agentAddress, "127.0.0.1");
  EXPECT_EQ(query.databaseName, "db");
  EXPECT_EQ(query.tableName, "devices");
  EXPECT_EQ(query.agentId, 7);
}

TEST_F(HandlersTest, ScalarMissingValues) {
  Oid oid = {1, 3, 6, 1, 2, 1, 1, 5, 0};
  EXPECT_EQ(ScalarProcessReadReq(kGetNextRequest, &oid, &errorCode_, {&agent_, &system_}),
            std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  EXPECT_EQ(host_.last.previousSubId, "3");
  host_.SetError("1.3.6.1.2.1.1.5.0", "5");
  EXPECT_EQ(ScalarProcessReadReq(kGetRequest, &oid, &errorCode_, {&agent_, &system_}),
            std::nullopt);
  EXPECT_EQ(errorCode_, kReadOnly);  // a Get keeps the host's code
  EXPECT_EQ(ScalarProcessReadReq(kGetNextRequest, &oid, &errorCode_, {&agent_, &system_}),
            std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
}

TEST_F(HandlersTest, ScalarSetTellsTheStoredPortAndRepeatsTheValue) {
  Oid oid = {1, 3, 6, 1, 2, 1, 1, 5, 0};
  VarValue name = VarValue::Octets(kAsnOctetString, "AB");
  EXPECT_EQ(ScalarProcessWriteReq(oid, name, &errorCode_, {&agent_, &system_}), name);
  EXPECT_EQ(errorCode_, 0);
  EXPECT_EQ(host_.SetCalls().back().agentPort, 160);
  EXPECT_EQ(host_.SetCalls().back().instance, ".0");
  EXPECT_EQ(host_.ValueOf("1.3.6.1.2.1.1.5.0"), "AB");
}

// Conversions by column type are pinned in value_text_test.cc; here, what the host is asked.
TEST_F(HandlersTest, TableGetAsksForTheEntryColumnAndInstance) {
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.10.0.0.1.161", "-5");
  Oid oid = Column(2, {10, 0, 0, 1, 161});
  EXPECT_EQ(TableProcessReadReq(kGetRequest, &oid, &errorCode_, {&agent_, &table_}),
            VarValue::Integer(-5));
  EXPECT_EQ(errorCode_, 0);
  EXPECT_EQ(host_.last.instance, ".10.0.0.1.161");
  EXPECT_EQ(host_.last.objectOid, ".1.3.6.1.2.1.2.2.1");
  EXPECT_EQ(host_.last.subId, "2");
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.10.0.0.1.161", "3000000000");  // does not convert
  EXPECT_EQ(TableProcessReadReq(kGetRequest, &oid, &errorCode_, {&agent_, &table_}), std::nullopt);
  EXPECT_EQ(errorCode_, kGenErr);
}

TEST_F(HandlersTest, TableGetNextFollowsTheHostAnswer) {
  host_.SetValue("1.3.6.1.2.1.2.2.1.2.3", "7");
  Oid oid = Column(2);
  EXPECT_EQ(TableProcessReadReq(kGetNextRequest, &oid, &errorCode_, {&agent_, &table_}),
            VarValue::Integer(7));
  EXPECT_EQ(errorCode_, 0);
  EXPECT_EQ(oid, Column(2, {3}));
  EXPECT_EQ(host_.last.instance, std::nullopt);
  EXPECT_EQ(host_.last.column, 2);
  EXPECT_EQ(host_.last.nextColumn, 3);
  EXPECT_EQ(host_.last.nextDataType, kAsnCounter64);
  EXPECT_EQ(host_.last.agentPort, 161);

  oid = Column(6, {1});  // last column: nothing after it, and the host has nothing
  EXPECT_EQ(TableProcessReadReq(kGetNextRequest, &oid, &errorCode_, {&agent_, &table_}),
            std::nullopt);
  EXPECT_EQ(errorCode_, kNoSuchInstance);
  EXPECT_EQ(host_.last.nextColumn, -1);
  EXPECT_EQ(host_.last.nextDataType, 0);
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
    EXPECT_EQ(TableProcessReadReq(kGetNextRequest, &oid, &errorCode_, {&agent_, &table_}),
              std::nullopt);
    EXPECT_EQ(errorCode_, kNoSuchInstance);
    EXPECT_EQ(oid, Column(2, {3}));
  }
}

TEST_F(HandlersTest, TableSetSendsTheColumnTextAndRepeatsTheValue) {
  const VarValue mac = VarValue::Octets(kAsnOctetString, "\x00\x1A\x2B\x3C\x4D\x5E"s);
  EXPECT_EQ(Set(Column(5, {5}), mac), mac);  // by the column's syntax
  EXPECT_EQ(errorCode_, 0);
  EXPECT_EQ(SentText(), "00:1a:2b:3c:4d:5e");
  EXPECT_EQ(host_.SetCalls().back().instance, ".5");
  EXPECT_EQ(host_.SetCalls().back().subId, "5");
  EXPECT_EQ(host_.SetCalls().back().agentPort, 160);
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
