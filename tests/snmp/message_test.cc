#include "snmp/message.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <fstream>
#include <sstream>

#include "engine/engine_state.h"
#include "engine/log.h"
#include "snmp/statistics.h"
#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

class MessageTest : public SnmpAgentTest {};

TEST_F(MessageTest, GetIsAnsweredWithTheFixedHeaderForm) {
  ASSERT_TRUE(Send(GetOf({"1.3.6.1.2.1.1.5.0"})));
  // Response 42 with sysName.0 = "r1", every SEQUENCE length in four octets.
  const std::vector<std::uint8_t> expected = {
      0x30, 0x82, 0x00, 0x2E, 0x02, 0x01, 0x01, 0x04, 0x06, 'p',  'u',  'b',  'l',
      'i',  'c',  0xA2, 0x82, 0x00, 0x1F, 0x02, 0x01, 0x2A, 0x02, 0x01, 0x00, 0x02,
      0x01, 0x00, 0x30, 0x82, 0x00, 0x12, 0x30, 0x82, 0x00, 0x0E, 0x06, 0x08, 0x2B,
      0x06, 0x01, 0x02, 0x01, 0x01, 0x05, 0x00, 0x04, 0x02, 'r',  '1'};
  EXPECT_EQ(lastReply_, expected);
  EXPECT_EQ(SnmpCount(SnmpCounter::kInMessages), 1u);
  EXPECT_EQ(SnmpCount(SnmpCounter::kV2GetRequests), 1u);
  EXPECT_EQ(SnmpCount(SnmpCounter::kOutResponses), 1u);
}

TEST_F(MessageTest, TrafficLogDumpsRequestAndResponseFromLevelOne) {
  const std::string path = ::testing::TempDir() + "traffic.log";
  ASSERT_TRUE(OpenEngineLog({1, path, 0}));
  ASSERT_TRUE(Send(GetOf({"1.3.6.1.2.1.1.5.0"})));
  OpenEngineLog({0, "", 0});
  std::stringstream log;
  log << std::ifstream(path).rdbuf();
  std::remove(path.c_str());
  const std::string text = log.str();
  std::size_t request = text.find("Request Message Start");
  std::size_t response = text.find("Response Message Start");
  ASSERT_NE(request, std::string::npos);
  ASSERT_NE(response, std::string::npos);
  EXPECT_LT(request, response);
  EXPECT_NE(text.find("Command\t\t\t\t= GET REQUEST"), std::string::npos);
  EXPECT_NE(text.find("1.3.6.1.2.1.1.5.0\tOCTET STRING\tr1", response), std::string::npos);
}

TEST_F(MessageTest, RefusedMessagesAreDroppedAndCounted) {
  Request wrongCommunity = GetOf({"1.3.6.1.2.1.1.5.0"});
  wrongCommunity.community = "private";  // a write community is not a read community
  EXPECT_FALSE(Send(wrongCommunity));
  EXPECT_EQ(SnmpCount(SnmpCounter::kBadCommunityNames), 1u);

  Request trap = GetOf({"1.3.6.1.2.1.1.5.0"});
  trap.type = kTrapV2;
  EXPECT_FALSE(Send(trap));
  EXPECT_EQ(SnmpCount(SnmpCounter::kInTraps), 1u);

  Request bulkInV1 = GetOf({"1.3.6.1.2.1.1"});
  bulkInV1.version = kSnmpV1;
  bulkInV1.type = kGetBulkRequest;
  EXPECT_FALSE(Send(bulkInV1));
  Request strayResponse = GetOf({"1.3.6.1.2.1.1.5.0"});
  strayResponse.type = kGetResponse;
  EXPECT_FALSE(Send(strayResponse));

  Request v3 = GetOf({"1.3.6.1.2.1.1.5.0"});
  v3.version = kSnmpV3;
  EXPECT_FALSE(Send(v3));
  EXPECT_EQ(SnmpCount(SnmpCounter::kBadVersions), 1u);

  gv_processV2Only = 1;
  Request v1 = GetOf({"1.3.6.1.2.1.1.5.0"});
  v1.version = kSnmpV1;
  EXPECT_FALSE(Send(v1));
  gv_processV2Only = 0;
  EXPECT_TRUE(Send(v1));
  EXPECT_EQ(SnmpCount(SnmpCounter::kBadVersions), 2u);
  EXPECT_EQ(SnmpCount(SnmpCounter::kDroppedRequests), 6u);
  EXPECT_EQ(SnmpCount(SnmpCounter::kV1Requests), 2u);  // the GetBulk and the Get
}

TEST_F(MessageTest, SizeLimitAndMalformedInput) {
  Request big = GetOf({"1.3.6.1.2.1.1.5.0"});
  big.type = kSetRequest;
  big.community = "private";
  big.bindings[0].second = VarValue::Octets(kAsnOctetString, std::string(19989 - 50, 'x'));
  std::vector<std::uint8_t> datagram = EncodeRequest(big);
  std::size_t overhead = datagram.size() - (19989 - 50);
  big.bindings[0].second.octets.resize(19989 - overhead);
  datagram = EncodeRequest(big);
  ASSERT_EQ(datagram.size(), 19989u);
  EXPECT_TRUE(Exchange(datagram));
  big.bindings[0].second.octets.push_back('x');
  EXPECT_FALSE(Send(big));
  EXPECT_EQ(SnmpCount(SnmpCounter::kInTooBigs), 1u);

  // A name of 129 sub-identifiers: 1.3 then 127 times 1.
  std::vector<std::uint8_t> binding(3 + 131 + 2, 0x01);
  const std::uint8_t header[] = {0x30, 0x81, 133, 0x06, 0x81, 128, 0x2B};
  std::copy(std::begin(header), std::end(header), binding.begin());
  binding[binding.size() - 2] = 0x05;
  binding[binding.size() - 1] = 0x00;
  Request longName;
  longName.rawBindings = {binding};
  EXPECT_FALSE(Send(longName));
  EXPECT_EQ(SnmpCount(SnmpCounter::kAsnParseErrors), 1u);  // sub-identifier limits: ber_test.cc
  std::vector<std::uint8_t> valid = EncodeRequest(GetOf({"1.3.6.1.2.1.1.5.0"}));
  std::vector<std::uint8_t> truncated(valid.begin(), valid.end() - 3);
  EXPECT_FALSE(Exchange(truncated));
  EXPECT_EQ(SnmpCount(SnmpCounter::kAsnParseErrors), 2u);
}

TEST_F(MessageTest, InformIsAcknowledgedWithItsOwnOctets) {
  Request inform = GetOf({"1.3.6.1.2.1.1.3.0"});
  inform.type = kInformRequest;
  inform.bindings[0].second = VarValue::Unsigned(kAsnTimeTicks, 5);
  std::vector<std::uint8_t> datagram = EncodeRequest(inform);
  ASSERT_TRUE(Exchange(datagram));
  datagram[15] = kGetResponse;
  EXPECT_EQ(lastReply_, datagram);
}

TEST_F(MessageTest, ErrorRepliesFollowTheVersion) {
  Request set;
  set.type = kSetRequest;
  set.community = "private";
  set.bindings = {{O("1.3.6.1.2.1.1.4.0"), VarValue::Octets(kAsnOctetString, "x")},
                  {O("1.3.6.1.2.1.1.3.0"), VarValue::Unsigned(kAsnTimeTicks, 1)}};
  set.version = kSnmpV1;
  auto v1 = Send(set);  // noSuchName at 2: the request's bindings come back as they were sent
  ASSERT_TRUE(v1);
  ASSERT_EQ(v1->requestVarBinds.size(), 2u);
  EXPECT_EQ(v1->requestVarBinds[1].value, VarValue::Unsigned(kAsnTimeTicks, 1));
  EXPECT_EQ(GetErrorLogs(), (std::vector<std::int32_t>{42, kSnmpV1, kSetRequest, kNotWritable, 1}));
  EXPECT_EQ(GetIpAddrArr(1), (std::vector<std::string>{"127.0.0.9"}));
}

TEST_F(MessageTest, OversizedRepliesBecomeTooBig) {
  host_.SetValue("1.3.6.1.2.1.1.1.0", std::string(1200, 'd'));
  Request get;
  for (int i = 0; i < 20; ++i)
    get.bindings.push_back({O("1.3.6.1.2.1.1.1.0"), VarValue::Empty(kAsnNull)});
  auto v2 = Send(get);
  ASSERT_TRUE(v2);
  EXPECT_EQ(v2->errorStatus, kTooBig);
  EXPECT_TRUE(v2->requestVarBinds.empty());
  get.version = kSnmpV1;
  auto v1 = Send(get);
  ASSERT_TRUE(v1);
  EXPECT_EQ(v1->errorStatus, kTooBig);
  EXPECT_EQ(v1->requestVarBinds.size(), 20u);
}

}  // namespace
}  // namespace tessel
