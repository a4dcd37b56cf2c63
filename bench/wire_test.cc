// Checks the load generator's own codec against the engine's parser (so a wrong request-id
// offset or length shows up here, not as "all lost" in a benchmark) and its latency histogram.
#include <gtest/gtest.h>

#include "latency_histogram.h"
#include "options.h"
#include "snmp/message.h"
#include "snmp/pdu.h"
#include "snmp_wire.h"

namespace tessel::bench {
namespace {

SnmpPdu ParseWithEngine(const std::vector<std::uint8_t>& datagram) {
  SnmpPdu pdu;
  EXPECT_EQ(ParseSnmpMessage(datagram.data(), datagram.size(), &pdu), 1);
  return pdu;
}

TEST(LoadgenWire, PatchedGetBulkParsesAsSent) {
  std::vector<std::uint32_t> oid;
  ASSERT_TRUE(ParseOid(".1.3.6.1.2.1.2.2", &oid));
  RequestTemplate request;
  // A long community pushes the message length into the long form.
  const std::string community(200, 'c');
  ASSERT_TRUE(EncodeRequestTemplate(1, community, kPduGetBulk, oid, 1, 25, &request));
  PatchRequestId(request.bytes.data(), request, 0x7654321F);
  SnmpPdu pdu = ParseWithEngine(request.bytes);
  EXPECT_EQ(pdu.version, kSnmpV2c);
  EXPECT_EQ(pdu.community, community);
  EXPECT_EQ(pdu.type, kGetBulkRequest);
  EXPECT_EQ(pdu.requestId, 0x7654321F);
  EXPECT_EQ(pdu.errorStatus, 1);
  EXPECT_EQ(pdu.errorIndex, 25);
  ASSERT_EQ(pdu.requestVarBinds.size(), 1u);
  EXPECT_EQ(pdu.requestVarBinds[0].name, Oid({1, 3, 6, 1, 2, 1, 2, 2}));
}

TEST(LoadgenWire, DecodesTheEngineReply) {
  std::vector<std::uint32_t> oid{1, 3, 6, 1, 2, 1, 1, 5, 0};
  RequestTemplate request;
  ASSERT_TRUE(EncodeRequestTemplate(0, "public", kPduGet, oid, 0, 0, &request));
  PatchRequestId(request.bytes.data(), request, 1u << 24);
  SnmpPdu pdu = ParseWithEngine(request.bytes);
  pdu.type = kGetResponse;
  pdu.errorStatus = kNoSuchName;
  pdu.errorIndex = 1;
  pdu.responseVarBinds = pdu.requestVarBinds;
  std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  std::size_t length = reply.size();
  ASSERT_TRUE(CreateSnmpMessage(nullptr, 0, reply.data(), &length, &pdu));
  ReplySummary summary;
  ASSERT_TRUE(DecodeReply(reply.data(), length, &summary));
  EXPECT_EQ(summary.pduType, kPduResponse);
  EXPECT_EQ(summary.requestId, 1u << 24);
  EXPECT_EQ(summary.errorStatus, kNoSuchName);
  EXPECT_FALSE(DecodeReply(reply.data(), length - 1, &summary));
}

TEST(LoadgenWire, RejectsBadOidsAndTargets) {
  std::vector<std::uint32_t> oid;
  EXPECT_FALSE(ParseOid("1", &oid));
  EXPECT_FALSE(ParseOid("1.3.", &oid));
  EXPECT_FALSE(ParseOid("1.x.3", &oid));
  std::vector<sockaddr_in> targets;
  EXPECT_TRUE(ParseTargets("127.0.1.1+3,127.0.0.9", 161, &targets));
  EXPECT_EQ(targets.size(), 4u);
  EXPECT_FALSE(ParseTargets("127.255.255.255+2", 161, &targets));  // leaves 127/8
  EXPECT_FALSE(ParseTargets("192.168.0.1", 161, &targets));
}

TEST(LatencyHistogram, PercentilesWithinOneBucket) {
  Histogram histogram;
  for (std::uint64_t value = 1; value <= 100000; ++value) histogram.Record(value * 1000);
  EXPECT_NEAR(static_cast<double>(histogram.Percentile(0.5)), 50e6, 50e6 * 0.016);
  EXPECT_NEAR(static_cast<double>(histogram.Percentile(0.99)), 99e6, 99e6 * 0.016);
  EXPECT_EQ(histogram.Percentile(1.0), 100000000u);
  EXPECT_EQ(histogram.Count(), 100000u);
  Histogram small;
  small.Record(7);
  EXPECT_EQ(small.Percentile(0.5), 7u);
}

}  // namespace
}  // namespace tessel::bench
