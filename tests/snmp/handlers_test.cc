#include "snmp/handlers.h"

#include <gtest/gtest.h>

#include <memory>

#include "engine/agent.h"
#include "snmp/pdu.h"
#include "snmp/value_text.h"
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
    agent_.transport.localPort = 160;
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

TEST_F(HandlersTest, TableGetConvertsByColumnType) {
  struct Case {
    std::uint32_t column;
    std::string text;
    std::optional<VarValue> value;
  } cases[] = {
      {2, "-5", VarValue::Integer(-5)},
      {2, "abc", VarValue::Integer(-1)},
      {2, "3000000000", std::nullopt},
      {3, "4294967296", VarValue::Unsigned(kAsnCounter64, 1ull << 32)},
      {3, "18446744073709551616", std::nullopt},
      {1, "'c0a80001'h", VarValue::Octets(kAsnOctetString, "\xC0\xA8\x00\x01"s)},
      {1, "'abc'H", VarValue::Octets(kAsnOctetString, "\xAB\x0C"s)},
      {1, "00:1a:2b:3c:4d:5e", VarValue::Octets(kAsnOctetString, "\x00\x1A\x2B\x3C\x4D\x5E"s)},
      {1, "'xy'h", VarValue::Octets(kAsnOctetString, "'xy'h")},
      {6, "10.0.0.1", VarValue::Octets(kAsnIpAddress, "\x0A\x00\x00\x01"s)},
      {6, "10.0.0.256", std::nullopt},
      {4, "2024-5-6,7:8:9.1,+2:0",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01+\x02\x00"s)},
      {4, "2024-5-6,7:8:9.1",
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01"s)},
      {4, "2024-5-6,7:8", std::nullopt},
  };
  for (const Case& c : cases) {
    host_.SetValue("1.3.6.1.2.1.2.2.1." + std::to_string(c.column) + ".10.0.0.1.161", c.text);
    Oid oid = Column(c.column, {10, 0, 0, 1, 161});
    EXPECT_EQ(TableProcessReadReq(kGetRequest, &oid, &errorCode_, {&agent_, &table_}), c.value)
        << c.text;
    EXPECT_EQ(errorCode_, c.value ? 0 : kGenErr) << c.text;
    EXPECT_EQ(host_.last.instance, ".10.0.0.1.161");
    EXPECT_EQ(host_.last.objectOid, ".1.3.6.1.2.1.2.2.1");
  }
}

TEST(TextToVarValueTest, OtherTypes) {
  EXPECT_EQ(TextToVarValue(kAsnObjectId, "", "1.3.6"), VarValue::ObjectId({1, 3, 6}));
  EXPECT_EQ(TextToVarValue(kAsnObjectId, "", ".1.3.6"), VarValue::ObjectId({1, 3, 6}));
  EXPECT_EQ(TextToVarValue(kAsnGauge, "", "4294967295"),
            VarValue::Unsigned(kAsnGauge, 0xFFFFFFFFu));
  EXPECT_EQ(TextToVarValue(kAsnOpaque, "", "00:1a:2b:3c:4d:5e"),
            VarValue::Octets(kAsnOpaque, "00:1a:2b:3c:4d:5e"));
  EXPECT_EQ(TextToVarValue(kAsnNull, "", "anything"), VarValue::Empty(kAsnNull));
  EXPECT_EQ(TextToVarValue(0x99, "", "2024-5-6,7:8:9.1"),
            VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01"s));
  // A BIT STRING's contents start with its count of unused bits, 0 to 7.
  EXPECT_EQ(TextToVarValue(kAsnBitString, "", "'0380'h"),
            VarValue::Octets(kAsnBitString, "\x03\x80"s));
  EXPECT_EQ(TextToVarValue(kAsnBitString, "", "'08ff'h"), std::nullopt);
  EXPECT_EQ(TextToVarValue(kAsnBitString, "", ""), std::nullopt);
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

TEST_F(HandlersTest, TableSetRendersTheValueForTheColumn) {
  struct Case {
    std::uint32_t column;
    VarValue value;
    std::string text;
  } cases[] = {
      {1, VarValue::Octets(kAsnOctetString, "AB"), "AB"},
      {1, VarValue::Octets(kAsnOctetString, "\x00\xFF"s), "'00ff'h"},
      {1, VarValue::Octets(kAsnOctetString, "'41'h"), "'2734312768'h"},
      {1, VarValue::Octets(kAsnOctetString, ""), ""},
      {2, VarValue::Integer(-12), "-12"},
      {3, VarValue::Unsigned(kAsnCounter64, (1ull << 32) + 5), "4294967301"},
      {4, VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01+\x02\x00"s),
       "2024-5-6,7:8:9.1,+2:0"},
      {5, VarValue::Octets(kAsnOctetString, "\x00\x1A\x2B\x3C\x4D\x5E"s), "00:1a:2b:3c:4d:5e"},
      {6, VarValue::Octets(kAsnIpAddress, "\x0A\x00\x00\x01"s), "10.0.0.1"},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Set(Column(c.column, {5}), c.value), c.value) << c.text;
    EXPECT_EQ(errorCode_, 0);
    EXPECT_EQ(SentText(), c.text);
  }
  EXPECT_EQ(host_.SetCalls().back().instance, ".5");
  EXPECT_EQ(host_.SetCalls().back().subId, "6");
  EXPECT_EQ(host_.SetCalls().back().agentPort, 160);
}

TEST_F(HandlersTest, TableSetRefusals) {
  struct Case {
    Oid oid;
    VarValue value;
    std::uint8_t errorCode;
  } cases[] = {
      {Column(4, {5}), VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01+"s),
       kBadValue},
      {Column(4, {5}), VarValue::Octets(kAsnOctetString, "\x07\xE8\x0D\x06\x07\x08\x09\x01"s),
       kBadValue},
      {Column(4, {5}),
       VarValue::Octets(kAsnOctetString, "\x07\xE8\x05\x06\x07\x08\x09\x01*\x02\x00"s), kBadValue},
      {Column(2, {5}), VarValue::Octets(kAsnOctetString, "A"), 7},  // wrongType
      {Column(1, {5}), VarValue::Integer(1), 7},
      {Column(2), VarValue::Integer(1), kNoSuchInstance},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(Set(c.oid, c.value), std::nullopt);
    EXPECT_EQ(errorCode_, c.errorCode);
  }
  EXPECT_TRUE(host_.SetCalls().empty());
  host_.SetError("1.3.6.1.2.1.2.2.1.2.5", "17");
  EXPECT_EQ(Set(Column(2, {5}), VarValue::Integer(1)), std::nullopt);
  EXPECT_EQ(errorCode_, kNotWritable);
}

}  // namespace
}  // namespace tessel
