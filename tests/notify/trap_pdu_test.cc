#include "notify/trap_pdu.h"

#include <gtest/gtest.h>

#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

const AgentAddress kDevice = {127, 0, 1, 7};

std::vector<std::uint8_t> Hex(const std::string& text) {
  std::vector<std::uint8_t> bytes;
  for (std::size_t i = 0; i + 1 < text.size();) {
    if (text[i] == ' ') {
      ++i;
      continue;
    }
    bytes.push_back(static_cast<std::uint8_t>(std::stoi(text.substr(i, 2), nullptr, 16)));
    i += 2;
  }
  return bytes;
}

VarBind Bind(const std::string& oid, VarValue value) {
  VarBind binding;
  binding.name = O(oid);
  binding.value = std::move(value);
  return binding;
}

VarBind IfIndex2() { return Bind("1.3.6.1.2.1.2.2.1.1.2", VarValue::Integer(2)); }

SnmpPdu V2Trap(const std::string& trapOid, VarBindList extra = {}) {
  return BuildV2Notification(kTrapV2, 100, O(trapOid), std::move(extra));
}

// Every encoding below was worked out octet by octet: headers of constructed types take the
// four-octet form 0x82 LL LL.
TEST(TrapPduTest, EncodesV2TrapAndV1TrapByteForByte) {
  SnmpPdu v2 = V2Trap("1.3.6.1.4.1.99.0.7", {IfIndex2()});
  v2.community = "public";
  v2.requestId = 1;
  EXPECT_EQ(EncodeNotification(v2),
            Hex("30 82 00 5a 02 01 01 04 06 70 75 62 6c 69 63"
                " a7 82 00 4b 02 01 01 02 01 00 02 01 00 30 82 00 3e"
                " 30 82 00 0d 06 08 2b 06 01 02 01 01 03 00 43 01 64"
                " 30 82 00 16 06 0a 2b 06 01 06 03 01 01 04 01 00 06 08 2b 06 01 04 01 63 00 07"
                " 30 82 00 0f 06 0a 2b 06 01 02 01 02 02 01 01 02 02 01 02"));

  SnmpPdu v1 = BuildV1Trap(O("1.3.6.1.4.1.99"), kDevice, 6, 7, 100, {IfIndex2()});
  v1.community = "public";
  EXPECT_EQ(EncodeNotification(v1),
            Hex("30 82 00 3d 02 01 00 04 06 70 75 62 6c 69 63"
                " a4 82 00 2e 06 06 2b 06 01 04 01 63 40 04 7f 00 01 07 02 01 06 02 01 07 43 01 64"
                " 30 82 00 13 30 82 00 0f 06 0a 2b 06 01 02 01 02 02 01 01 02 02 01 02"));

  SnmpPdu inform = BuildV2Notification(kInformRequest, 0, O("1.3.6.1.6.3.1.1.5.1"), {});
  inform.community = "c";
  std::vector<std::uint8_t> encoded = EncodeNotification(inform);
  ASSERT_GT(encoded.size(), 10u);
  EXPECT_EQ(encoded[10], kInformRequest);  // behind 30 82 LL LL, 02 01 01, 04 01 63
}

TEST(TrapPduTest, V1ToV2NamesTheTrapInSecondBinding) {
  SnmpPdu enterprise = BuildV1Trap(O("1.3.6.1.4.1.99"), kDevice, 6, 7, 321, {IfIndex2()});
  SnmpPdu v2 = ConvertV1TrapToV2(enterprise);
  EXPECT_EQ(v2.type, kTrapV2);
  ASSERT_EQ(v2.requestVarBinds.size(), 3u);
  EXPECT_EQ(v2.requestVarBinds[0].name, kSysUpTimeOid);
  EXPECT_EQ(v2.requestVarBinds[0].value, VarValue::Unsigned(kAsnTimeTicks, 321));
  EXPECT_EQ(v2.requestVarBinds[1].name, kSnmpTrapOid);
  EXPECT_EQ(v2.requestVarBinds[1].value.oid, O("1.3.6.1.4.1.99.0.7"));
  EXPECT_EQ(v2.requestVarBinds[2].name, IfIndex2().name);

  SnmpPdu linkDown = ConvertV1TrapToV2(BuildV1Trap(O("1.3.6.1.4.1.99"), kDevice, 2, 0, 0, {}));
  EXPECT_EQ(linkDown.requestVarBinds[1].value.oid, O("1.3.6.1.6.3.1.1.5.3"));
}

TEST(TrapPduTest, V2ToV1SplitsEnterpriseTraps) {
  std::optional<SnmpPdu> v1 =
      ConvertV2TrapToV1(V2Trap("1.3.6.1.4.1.99.0.7", {IfIndex2()}), kDevice);
  ASSERT_TRUE(v1);
  EXPECT_EQ(v1->type, kTrapV1);
  EXPECT_EQ(v1->enterprise, O("1.3.6.1.4.1.99"));
  EXPECT_EQ(std::make_pair(v1->genericTrap, v1->specificTrap), std::make_pair(6, 7));
  EXPECT_EQ(v1->timeStamp, 100u);
  ASSERT_EQ(v1->requestVarBinds.size(), 1u);
  EXPECT_EQ(v1->requestVarBinds[0].name, IfIndex2().name);

  // Without the 0 before the last sub-identifier, only the last goes.
  v1 = ConvertV2TrapToV1(V2Trap("1.3.6.1.4.1.99.5"), kDevice);
  ASSERT_TRUE(v1);
  EXPECT_EQ(v1->enterprise, O("1.3.6.1.4.1.99"));
  EXPECT_EQ(v1->specificTrap, 5);
}

TEST(TrapPduTest, V2ToV1StandardTrapsTakeSnmpTrapsAndTheDevice) {
  VarBind counter64 = Bind("1.3.6.1.2.1.31.1.1.1.6.2", VarValue::Unsigned(kAsnCounter64, 1));
  std::optional<SnmpPdu> v1 =
      ConvertV2TrapToV1(V2Trap("1.3.6.1.6.3.1.1.5.3", {IfIndex2(), counter64}), kDevice);
  ASSERT_TRUE(v1);
  EXPECT_EQ(std::make_pair(v1->genericTrap, v1->specificTrap), std::make_pair(kLinkDown, 0));
  EXPECT_EQ(v1->enterprise, kSnmpTrapsOid);
  EXPECT_EQ(AgentAddress(std::to_array(v1->agentAddress)), kDevice);
  ASSERT_EQ(v1->requestVarBinds.size(), 1u);  // the Counter64 binding has no SNMPv1 form
  EXPECT_EQ(v1->requestVarBinds[0].name, IfIndex2().name);

  VarBind enterprise = Bind("1.3.6.1.6.3.1.1.4.3.0", VarValue::ObjectId(O("1.3.6.1.4.1.99")));
  VarBind address = Bind("1.3.6.1.6.3.18.1.3.0",
                         VarValue::Octets(kAsnIpAddress, std::string("\x0a\x00\x00\x01", 4)));
  v1 = ConvertV2TrapToV1(V2Trap("1.3.6.1.6.3.1.1.5.5", {enterprise, address}), kDevice);
  ASSERT_TRUE(v1);
  EXPECT_EQ(v1->genericTrap, kAuthenticationFailure);
  EXPECT_EQ(v1->enterprise, O("1.3.6.1.4.1.99"));
  EXPECT_EQ(AgentAddress(std::to_array(v1->agentAddress)), (AgentAddress{10, 0, 0, 1}));
}

TEST(TrapPduTest, StandardV1TrapReachesV2ManagersAsItsStandardOid) {
  SnmpPdu coldStart = BuildStandardV1Trap(kColdStart, kDevice, 5);
  EXPECT_EQ(coldStart.enterprise, kSnmpTrapsOid);
  EXPECT_EQ(AgentAddress(std::to_array(coldStart.agentAddress)), kDevice);
  std::optional<SnmpPdu> v2 = NotificationForVersion(coldStart, kSnmpV2c, kDevice);
  ASSERT_TRUE(v2);
  EXPECT_EQ(v2->version, kSnmpV2c);
  EXPECT_EQ(v2->requestVarBinds[1].value.oid, O("1.3.6.1.6.3.1.1.5.1"));
  // And back: the same standard trap, not an enterprise-specific one.
  std::optional<SnmpPdu> back = NotificationForVersion(*v2, kSnmpV1, kDevice);
  ASSERT_TRUE(back);
  EXPECT_EQ(std::make_pair(back->genericTrap, back->enterprise),
            std::make_pair(kColdStart, kSnmpTrapsOid));
}

TEST(TrapPduTest, NotificationsWithoutAnSnmpV1FormAreRefused) {
  SnmpPdu noTrapOid = V2Trap("1.3.6.1.4.1.99.0.7");
  noTrapOid.requestVarBinds.erase(noTrapOid.requestVarBinds.begin() + 1);
  EXPECT_FALSE(ConvertV2TrapToV1(noTrapOid, kDevice));
  SnmpPdu inform = BuildV2Notification(kInformRequest, 0, O("1.3.6.1.4.1.99.0.7"), {});
  EXPECT_FALSE(NotificationForVersion(inform, kSnmpV1, kDevice));
  EXPECT_TRUE(NotificationForVersion(inform, kSnmpV2c, kDevice));
}

}  // namespace
}  // namespace tessel
