// Checks the load generator's own codec against the engine's parser (so a wrong request-id
// offset or length shows up here, not as "all lost" in a benchmark), its SNMPv3 keys and
// messages against published key values and libcrypto directly, and its latency histogram; the
// trap sink's answer to the engine's informs, and the inform load's books.
#include <gtest/gtest.h>
#include <openssl/evp.h>

#include <algorithm>

#include "inform_tally.h"
#include "latency_histogram.h"
#include "notify/trap_pdu.h"
#include "options.h"
#include "snmp/message.h"
#include "snmp/pdu.h"
#include "snmp_wire.h"
#include "snmpv3_wire.h"

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

v3::Bytes Hex(const char* text) {
  v3::Bytes out;
  for (const char* p = text; p[0] != '\0' && p[1] != '\0'; p += 2) {
    out.push_back(static_cast<std::uint8_t>(std::stoi(std::string(p, 2), nullptr, 16)));
  }
  return out;
}

// The position just past the first occurrence of pattern, or 0.
std::size_t After(const v3::Bytes& data, const v3::Bytes& pattern) {
  auto found = std::search(data.begin(), data.end(), pattern.begin(), pattern.end());
  return found == data.end() ? 0 : static_cast<std::size_t>(found - data.begin()) + pattern.size();
}

TEST(LoadgenV3, KeysMatchThePublishedShaValues) {
  const v3::Bytes key = v3::PasswordToKey("maplesyrup");
  EXPECT_EQ(key, Hex("9fb5cc0381497b3793528939ff788d5d79145211"));
  EXPECT_EQ(v3::LocalizeKey(key, Hex("000000000000000000000002")),
            Hex("6695febc9288e36282235fc7151f128497b38f3f"));
}

class LoadgenV3Message : public ::testing::Test {
 protected:
  void SetUp() override {
    engine_ = {Hex("80001f8880aabbccdd"), 7, 1000};
    user_ = {"bench", v3::Level::kAuthPriv, v3::PasswordToKey("shapassword"),
             v3::PasswordToKey("aespassword")};
    ASSERT_TRUE(ParseOid("1.3.6.1.2.1.1.5.0", &oid_));
    ASSERT_TRUE(EncodePduTemplate(kPduGet, oid_, 0, 0, &pdu_));
    ASSERT_TRUE(peer_.Init(user_, engine_, pdu_, 0));
    // 2.5 s after discovery: the engine time sent is 1002.
    message_.resize(kMaxRequestSize);
    message_.resize(
        peer_.Encode(0x01234567, 2500000000, 0x1122334455667788, message_.data(), message_.size()));
    ASSERT_GT(message_.size(), 0u);
  }

  v3::Engine engine_;
  v3::User user_;
  std::vector<std::uint32_t> oid_;
  RequestTemplate pdu_;
  v3::Peer peer_;
  v3::Bytes message_;
};

TEST_F(LoadgenV3Message, RoundTripsAndRejectsTampering) {
  std::uint32_t messageId = 0;
  v3::Engine engine;
  ASSERT_TRUE(v3::DecodeEngine(message_.data(), message_.size(), &messageId, &engine));
  EXPECT_EQ(messageId, 0x01234567u);
  EXPECT_EQ(engine.id, engine_.id);
  EXPECT_EQ(engine.boots, 7);
  EXPECT_EQ(engine.time, 1002);
  ReplySummary summary;
  ASSERT_TRUE(peer_.Decode(message_.data(), message_.size(), &summary));
  EXPECT_EQ(summary.pduType, kPduGet);
  EXPECT_EQ(summary.requestId, 0x01234567u);
  for (std::size_t position : {message_.size() - 1, message_.size() / 2}) {
    v3::Bytes tampered = message_;
    tampered[position] ^= 0x01;
    EXPECT_FALSE(peer_.Decode(tampered.data(), tampered.size(), &summary)) << position;
  }
  // Another user's keys do not check.
  v3::Peer other;
  user_.authKey = v3::PasswordToKey("otherpassword");
  ASSERT_TRUE(other.Init(user_, engine_, pdu_, 0));
  EXPECT_FALSE(other.Decode(message_.data(), message_.size(), &summary));
}

// The digest and the cipher text recomputed with libcrypto alone from the message's fields.
TEST_F(LoadgenV3Message, DigestAndCipherTextRecomputedWithLibcrypto) {
  const v3::Bytes header = {0x04, 0x05, 'b', 'e', 'n', 'c', 'h', 0x04, 0x0c};
  const std::size_t digestAt = After(message_, header);
  ASSERT_GT(digestAt, 0u);
  ASSERT_EQ(After(message_, {0x02, 0x01, 0x07, 0x02, 0x02, 0x03, 0xea}),
            digestAt - header.size());  // boots, time
  v3::Bytes zeroed = message_;
  std::fill_n(zeroed.begin() + static_cast<std::ptrdiff_t>(digestAt), v3::kDigestSize, 0);
  const v3::Bytes authKey = v3::LocalizeKey(user_.authKey, engine_.id);
  std::uint8_t mac[20];
  std::size_t macSize = 0;
  ASSERT_NE(EVP_Q_mac(nullptr, "HMAC", nullptr, "SHA1", nullptr, authKey.data(), authKey.size(),
                      zeroed.data(), zeroed.size(), mac, sizeof mac, &macSize),
            nullptr);
  EXPECT_TRUE(std::equal(mac, mac + v3::kDigestSize,
                         message_.begin() + static_cast<std::ptrdiff_t>(digestAt)));

  const std::size_t saltAt =
      After(message_, {0x04, 0x08, 0x11, 0x22, 0x33, 0x44, 0x55, 0x66, 0x77, 0x88});
  ASSERT_EQ(saltAt, digestAt + v3::kDigestSize + 10);
  ASSERT_EQ(message_[saltAt], 0x04);  // the encrypted scoped PDU, to the end of the message
  const std::size_t cipherAt = saltAt + 2;
  ASSERT_EQ(static_cast<std::size_t>(message_[saltAt + 1]), message_.size() - cipherAt);
  const v3::Bytes privKey = v3::LocalizeKey(user_.privKey, engine_.id);
  const v3::Bytes iv = Hex("00000007000003ea1122334455667788");
  v3::Bytes plain(message_.size() - cipherAt);
  int written = 0;
  std::unique_ptr<EVP_CIPHER_CTX, decltype(&EVP_CIPHER_CTX_free)> context(EVP_CIPHER_CTX_new(),
                                                                          EVP_CIPHER_CTX_free);
  ASSERT_EQ(
      EVP_DecryptInit_ex2(context.get(), EVP_aes_128_cfb128(), privKey.data(), iv.data(), nullptr),
      1);
  ASSERT_EQ(EVP_DecryptUpdate(context.get(), plain.data(), &written, message_.data() + cipherAt,
                              static_cast<int>(plain.size())),
            1);
  // SEQUENCE { contextEngineID, contextName "", GetRequest { request-id 0x01234567, ... } }
  v3::Bytes expected = {0x30, static_cast<std::uint8_t>(plain.size() - 2), 0x04, 0x09};
  expected.insert(expected.end(), engine_.id.begin(), engine_.id.end());
  expected.insert(expected.end(),
                  {0x04, 0x00, 0xa0, static_cast<std::uint8_t>(pdu_.bytes.size() - 2), 0x02, 0x04,
                   0x01, 0x23, 0x45, 0x67});
  EXPECT_TRUE(std::equal(expected.begin(), expected.end(), plain.begin()));
  EXPECT_TRUE(
      std::equal(pdu_.bytes.begin() + 8, pdu_.bytes.end(), plain.end() - (pdu_.bytes.size() - 8)));
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

// The sink acknowledges the engine's own InformRequest (a community long enough for the long
// length form) with a Response the engine takes for its answer; anything else it leaves alone.
TEST(TrapSinkWire, AnswersOnlyInforms) {
  SnmpPdu inform =
      BuildV2Notification(kInformRequest, 1234, Oid({1, 3, 6, 1, 6, 3, 1, 1, 5, 3}), {});
  inform.version = kSnmpV2c;
  inform.community = std::string(150, 'p');
  inform.requestId = 0x12345;
  std::vector<std::uint8_t> message = EncodeNotification(inform);
  ASSERT_FALSE(message.empty());
  ASSERT_TRUE(AnswerInform(message.data(), message.size()));
  SnmpPdu response = ParseWithEngine(message);
  EXPECT_EQ(response.type, kGetResponse);
  EXPECT_EQ(response.requestId, 0x12345);
  EXPECT_EQ(response.community, inform.community);
  EXPECT_EQ(response.requestVarBinds.size(), 2u);

  SnmpPdu trap = inform;
  trap.type = kTrapV2;
  std::vector<std::uint8_t> trapMessage = EncodeNotification(trap);
  const std::vector<std::uint8_t> original = trapMessage;
  EXPECT_FALSE(AnswerInform(trapMessage.data(), trapMessage.size()));
  EXPECT_EQ(trapMessage, original);
  EXPECT_FALSE(AnswerInform(message.data(), 3));  // cut short
}

// Reports are judged only at the end, whatever order they came in: one arriving before its send
// was recorded is no stranger.
TEST(InformTally, CountsEachInformOnce) {
  InformTally tally;
  tally.Acknowledged(1);
  for (std::uint32_t id : {1, 2, 3, 4, 5}) tally.Sent(id);
  tally.Acknowledged(2);
  tally.Acknowledged(2);
  tally.Dropped(3);
  tally.Acknowledged(4);
  tally.Dropped(4);
  tally.Acknowledged(9);
  InformSummary summary = tally.Summary();
  EXPECT_EQ(summary.sent, 5u);
  EXPECT_EQ(summary.acknowledged, 2u);
  EXPECT_EQ(summary.duplicates, 1u);
  EXPECT_EQ(summary.dropped, 1u);
  EXPECT_EQ(summary.both, 1u);
  EXPECT_EQ(summary.unanswered, 1u);
  EXPECT_EQ(summary.unknown, 1u);
  EXPECT_FALSE(summary.Clean());

  InformTally clean;
  clean.Sent(7);
  clean.Acknowledged(7);
  EXPECT_TRUE(clean.Summary().Clean());
}

}  // namespace
}  // namespace tessel::bench
