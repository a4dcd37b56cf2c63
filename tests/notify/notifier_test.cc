#include "notify/notifier.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <thread>

#include "engine/agent_registry.h"
#include "notify/standard_traps.h"
#include "notify/trap_pdu.h"
#include "snmp/message.h"
#include "snmp/service.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/usm_crypto.h"
#include "snmpv3/usm_users.h"
#include "snmpv3/v3_config.h"
#include "snmpv3/v3_message.h"
#include "snmpv3/vacm.h"
#include "support/snmp_agent_fixture.h"

namespace tessel {
namespace {

const std::uint16_t kDevicePort = static_cast<std::uint16_t>(20005 + (::getpid() % 300) * 40);
const std::string kDevice = "127.78.1.1";
constexpr std::int32_t kAgentId = 41;

// A manager's UDP socket on loopback.
class ManagerSocket {
 public:
  ManagerSocket() {
    sockaddr_in address{AF_INET, 0, {}, {}};
    inet_pton(AF_INET, "127.0.0.1", &address.sin_addr);
    bind(socket_, reinterpret_cast<sockaddr*>(&address), sizeof address);
    socklen_t length = sizeof address;
    getsockname(socket_, reinterpret_cast<sockaddr*>(&address), &length);
    port_ = ntohs(address.sin_port);
  }
  ~ManagerSocket() { close(socket_); }
  std::uint16_t Port() const { return port_; }

  // The next datagram within the wait and where it came from ("address:port").
  std::optional<std::pair<std::vector<std::uint8_t>, std::string>> Receive(int waitMs = 2000) {
    pollfd ready{socket_, POLLIN, 0};
    if (poll(&ready, 1, waitMs) != 1) return std::nullopt;
    std::vector<std::uint8_t> datagram(kMaxSnmpMessage);
    sockaddr_in source{};
    socklen_t length = sizeof source;
    ssize_t size = recvfrom(socket_, datagram.data(), datagram.size(), 0,
                            reinterpret_cast<sockaddr*>(&source), &length);
    if (size <= 0) return std::nullopt;
    datagram.resize(static_cast<std::size_t>(size));
    char text[INET_ADDRSTRLEN] = {};
    inet_ntop(AF_INET, &source.sin_addr, text, sizeof text);
    return std::make_pair(datagram,
                          std::string(text) + ":" + std::to_string(ntohs(source.sin_port)));
  }
  void SendToDevice(const std::vector<std::uint8_t>& datagram, std::uint16_t port = kDevicePort,
                    const std::string& device = kDevice) {
    sockaddr_in to{AF_INET, htons(port), {}, {}};
    inet_pton(AF_INET, device.c_str(), &to.sin_addr);
    sendto(socket_, datagram.data(), datagram.size(), 0, reinterpret_cast<sockaddr*>(&to),
           sizeof to);
  }

 private:
  int socket_ = ::socket(AF_INET, SOCK_DGRAM, 0);
  std::uint16_t port_ = 0;
};

// Where the PDU of a community message starts: behind 30 82 LL LL, the version and community.
std::size_t PduOffset(const std::vector<std::uint8_t>& message) { return 4 + 3 + 2 + message[8]; }

bool Contains(const std::vector<std::uint8_t>& bytes, const std::vector<std::uint8_t>& part) {
  return std::search(bytes.begin(), bytes.end(), part.begin(), part.end()) != bytes.end();
}

class NotifierTest : public SnmpAgentTest {
 protected:
  void SetUp() override {
    SnmpAgentTest::SetUp();
    InitSnmpParams();
    ASSERT_GT(
        FillAgentInfoAndStartAgent({kAgentId, kDevice, kDevicePort, {"public"}, {}, 0, "", "", 0}),
        0);
    ASSERT_TRUE(InitSnmpGeneralServices());
    InitNotifications();
  }
  void TearDown() override {
    FreeSnmpV3Resources();
    StopNotifications();
    StopSnmpGeneralServices();
    FreeSimulatorResources();
    InstallSessionTransport(nullptr, nullptr);
    SnmpAgentTest::TearDown();
  }

  NotificationRequest Request(std::uint8_t type, std::int32_t version) const {
    NotificationRequest request;
    request.pduType = type;
    request.version = version;
    request.managerHost = "127.0.0.1";
    request.managerPort = manager_.Port();
    request.community = "public";
    request.enterprise = "1.3.6.1.4.1.99";
    request.genericTrap = 6;
    request.specificTrap = 7;
    request.trapOid = ".1.3.6.1.4.1.99.0.7";
    request.bindings = {std::vector<std::string>{"1.3.6.1.2.1.2.2.1.1.2"},
                        std::vector<std::int32_t>{kAsnInteger}, std::vector<std::string>{"2"}};
    request.agentId = kAgentId;
    request.agentText = kDevice;
    return request;
  }
  static bool WaitFor(const std::function<bool()>& done) {
    for (int wait = 0; wait < 400 && !done(); ++wait)
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    return done();
  }

  ManagerSocket manager_;
  const std::string device_ = kDevice + ":" + std::to_string(kDevicePort);
};

TEST_F(NotifierTest, RefusedNotificationsSendNothing) {
  NotificationRequest shortValues = Request(kTrapV2, kSnmpV2c);
  shortValues.bindings = {std::vector<std::string>{"1.3.6.1.1", "1.3.6.1.2", "1.3.6.1.3"},
                          std::vector<std::int32_t>{2, 2, 2}, std::vector<std::string>{"1", "2"}};
  EXPECT_EQ(SendNotification(shortValues).result, NotifyResult::kBadArrays);
  NotificationRequest badValue = Request(kTrapV2, kSnmpV2c);
  (*badValue.bindings.values)[0] = "4294967296";  // beyond 32 bits
  EXPECT_EQ(SendNotification(badValue).result, NotifyResult::kBadBinding);
  NotificationRequest unresolved = Request(kTrapV2, kSnmpV2c);
  unresolved.managerHost = "1:::2";
  EXPECT_EQ(SendNotification(unresolved).result, NotifyResult::kUnresolved);
  NotificationRequest noDevice = Request(kTrapV2, kSnmpV2c);
  noDevice.agentId = kAgentId + 1;
  EXPECT_EQ(SendNotification(noDevice).result, NotifyResult::kNoDevice);
  EXPECT_EQ(SendNotification(Request(kInformRequest, kSnmpV1)).result, NotifyResult::kNoForm);
  EXPECT_FALSE(manager_.Receive(200));

  NotificationRequest noBindings = Request(kTrapV1, kSnmpV1);
  noBindings.bindings = {};
  EXPECT_EQ(SendNotification(noBindings).result, NotifyResult::kSent);
  EXPECT_TRUE(manager_.Receive());
}

// A Response from another port of the manager's host does not acknowledge the inform; the one
// from the manager does, and the host is told with the Response's bindings.
TEST_F(NotifierTest, InformIsAcknowledgedOnlyByTheManagerItWasSentTo) {
  NotifyOutcome outcome = SendNotification(Request(kInformRequest, kSnmpV2c));
  ASSERT_EQ(outcome.result, NotifyResult::kSent);
  auto received = manager_.Receive();
  ASSERT_TRUE(received);
  EXPECT_EQ(received->second, device_);
  std::vector<std::uint8_t> response = received->first;
  ASSERT_EQ(response.at(PduOffset(response)), kInformRequest);
  response[PduOffset(response)] = kGetResponse;

  ManagerSocket spoofer;
  spoofer.SendToDevice(response);
  std::this_thread::sleep_for(std::chrono::milliseconds(200));
  EXPECT_EQ(PendingInforms(), 1u);
  EXPECT_TRUE(host_.AnsweredInforms().empty());

  manager_.SendToDevice(response);
  ASSERT_TRUE(WaitFor([&] { return !host_.AnsweredInforms().empty(); }));
  EXPECT_EQ(PendingInforms(), 0u);
  InformReport report = host_.AnsweredInforms()[0];
  EXPECT_EQ(report.informId, outcome.informId);
  EXPECT_EQ(report.managerPort, manager_.Port());
  EXPECT_EQ(report.deviceAddress, kDevice);
  ASSERT_EQ(report.oids.size(), 3u);
  EXPECT_EQ(report.oids[1], ".1.3.6.1.6.3.1.1.4.1.0");
  EXPECT_EQ(report.types[2], "Integer");
  EXPECT_EQ(report.values[2], "2");
  EXPECT_TRUE(host_.DroppedInforms().empty());
}

// A user of the engine's table (at level, in context "") whose notify view is made of families
// (subtree, included or excluded).
void AddNotifiedUser(const std::string& name, const char* auth, const char* password, int level,
                     const std::vector<std::pair<std::string, int>>& families) {
  ClearEngineId();
  ASSERT_EQ(AddUsmUserFromHost(name, auth, password, "NO_PRIV", "-", 1), 1);
  CreateAndAddSnmpVacmContextTableEntry("");
  CreateAndAddSnmpVacmSecurityToGroupTableEntry(3, name, name + "s", 3);
  CreateAndAddNewSnmpVacmAccessTableEntry(name + "s", "", 3, level, 1, "", "", "notify", 3);
  for (const auto& [subtree, type] : families)
    CreateAndAddSnmpVacmViewTreeFamilyTableEntry("notify", subtree, "", type, 3);
  CreateLCDVacmAccessTable();
  CreateLCDVacmViewTreeFamilyTable();
}

// An SNMPv3 message around the PDU.
std::vector<std::uint8_t> V3Message(const V3Envelope& envelope, const SnmpPdu& pdu) {
  std::vector<std::uint8_t> encoded = EncodeNotificationPdu(pdu);
  std::vector<std::uint8_t> message(kMaxSnmpMessage);
  std::size_t length = message.size();
  EXPECT_TRUE(EncodeV3Message(envelope, encoded.data(), encoded.size(), message.data(), &length));
  message.resize(length);
  return message;
}

// An SNMPv3 message of the manager's engine to the device, answering one of the device's.
std::vector<std::uint8_t> ManagerMessage(std::uint8_t type, const V3Received& answered,
                                         const UsmUser& user, std::uint8_t level) {
  V3Envelope envelope;
  envelope.msgId = answered.msgId;
  envelope.msgMaxSize = 1500;
  envelope.level = level;
  envelope.engineId = envelope.contextEngineId = "manager-engine";
  envelope.boots = 2;
  envelope.time = 50;
  envelope.userName = answered.userName;
  envelope.auth = user.auth;
  envelope.authKey = GetLocalKeyValue(user.authPassword, user.auth, envelope.engineId);
  SnmpPdu pdu;
  pdu.type = type;
  pdu.requestId = answered.pdu.requestId;
  pdu.requestVarBinds = answered.pdu.requestVarBinds;
  return V3Message(envelope, pdu);
}

// An SNMPv3 inform first discovers the manager from an ephemeral port, then leaves from the
// device keyed to the manager's engine; an unauthenticated Response naming its msgID and
// request-id does not acknowledge it, the authentic one does.
TEST_F(NotifierTest, V3InformIsAcknowledgedOnlyByAnAuthenticResponse) {
  AddNotifiedUser("signer", "MD5_AUTH", "signerpass1", kAuthNoPriv, {{"1.3", kVacmViewIncluded}});
  std::optional<UsmUser> user = GetUsmEntry(EngineId(), "signer");
  ASSERT_TRUE(user);
  NotificationRequest request = Request(kInformRequest, kSnmpV3);
  request.userName = "signer";
  // A manager that never answers discovery holds up no other inform, and drops only its own.
  ManagerSocket silent;
  NotificationRequest unanswered = request;
  unanswered.managerPort = silent.Port();
  NotifyOutcome dropped = SendNotification(unanswered);
  ASSERT_EQ(dropped.result, NotifyResult::kSent);
  EXPECT_NE(dropped.informId, 0u);
  auto start = std::chrono::steady_clock::now();
  ASSERT_EQ(SendNotification(request).result, NotifyResult::kSent);

  auto discovery = manager_.Receive();
  ASSERT_TRUE(discovery);
  EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(400));
  EXPECT_NE(discovery->second, device_);
  V3Received probe;
  ASSERT_TRUE(ParseV3Message(discovery->first.data(), discovery->first.size(), nullptr, &probe));
  EXPECT_TRUE(probe.engineId.empty());
  std::uint16_t ephemeral = static_cast<std::uint16_t>(
      std::stoi(discovery->second.substr(discovery->second.find(':') + 1)));
  manager_.SendToDevice(ManagerMessage(kReport, probe, *user, kNoAuthNoPriv), ephemeral);

  auto sent = manager_.Receive();
  ASSERT_TRUE(sent);
  EXPECT_EQ(sent->second, device_);
  V3Received inform;
  ASSERT_TRUE(ParseV3Message(sent->first.data(), sent->first.size(), &*user, &inform));
  EXPECT_EQ(inform.engineId, "manager-engine");
  EXPECT_EQ(inform.level, kAuthNoPriv);
  EXPECT_EQ(inform.pdu.type, kInformRequest);

  manager_.SendToDevice(ManagerMessage(kGetResponse, inform, *user, kNoAuthNoPriv));
  std::this_thread::sleep_for(std::chrono::milliseconds(200));
  EXPECT_TRUE(host_.AnsweredInforms().empty());
  EXPECT_EQ(PendingInforms(), 1u);
  manager_.SendToDevice(ManagerMessage(kGetResponse, inform, *user, kAuthNoPriv));
  ASSERT_TRUE(WaitFor([&] { return !host_.AnsweredInforms().empty(); }));
  EXPECT_EQ(PendingInforms(), 0u);
  EXPECT_FALSE(manager_.Receive(100)) << "the device answers nothing to the manager";
  ASSERT_TRUE(WaitFor([&] { return !host_.DroppedInforms().empty(); }));
  EXPECT_EQ(host_.DroppedInforms()[0].managerPort, silent.Port());
  EXPECT_EQ(host_.DroppedInforms()[0].informId, dropped.informId);
  EXPECT_TRUE(silent.Receive(0)) << "its discovery request";
  EXPECT_FALSE(silent.Receive(0)) << "and nothing after it";
}

// SNMPv3 traps go to users of the engine's table, in a known context, within the user's notify
// view; the device is the authoritative engine that the message names.
TEST_F(NotifierTest, V3TrapsNameTheDeviceAndKeepToTheNotifyView) {
  AddNotifiedUser("watcher", "NO_AUTH", "-", kNoAuthNoPriv,
                  {{"1.3.6.1.4.1.99", kVacmViewIncluded},
                   {"1.3.6.1.4.1.99.0.8", kVacmViewExcluded},
                   {"1.3.6.1.2.1.2", kVacmViewIncluded}});
  NotificationRequest request = Request(kTrapV2, kSnmpV3);
  request.userName = "watcher";
  ASSERT_EQ(SendNotification(request).result, NotifyResult::kSent);
  auto received = manager_.Receive();
  ASSERT_TRUE(received);
  EXPECT_EQ(received->second, device_);
  std::string engineId = kDevice + "#" + std::to_string(kDevicePort);
  std::vector<std::uint8_t> engineIdField = {0x04, static_cast<std::uint8_t>(engineId.size())};
  engineIdField.insert(engineIdField.end(), engineId.begin(), engineId.end());
  EXPECT_TRUE(Contains(received->first, engineIdField));
  EXPECT_TRUE(Contains(received->first, {0x06, 0x08, 0x2b, 6, 1, 4, 1, 99, 0, 7}));

  NotificationRequest excludedTrap = request, outsideBinding = request, stranger = request,
                      otherContext = request;
  excludedTrap.trapOid = "1.3.6.1.4.1.99.0.8";
  outsideBinding.bindings = {std::vector<std::string>{"1.3.6.1.2.1.1.5.0"},
                             std::vector<std::int32_t>{kAsnOctetString},
                             std::vector<std::string>{"x"}};
  stranger.userName = "stranger";
  otherContext.contextName = "elsewhere";
  for (const NotificationRequest& refused : {excludedTrap, outsideBinding, stranger, otherContext})
    EXPECT_EQ(SendNotification(refused).result, NotifyResult::kRefused);
  EXPECT_FALSE(manager_.Receive(200));
}

// A device with a v1 and a v2c sink: its start raises one coldStart to each, in each one's form;
// a request with an unknown community one authenticationFailure to each; so does an SNMPv3
// request with a wrong digest, but engine discovery raises nothing.
TEST_F(NotifierTest, StandardTrapsReachEverySinkOfTheDeviceInItsVersion) {
  ManagerSocket v1Sink, v2Sink;
  const std::string sinked = "127.78.1.2";
  auto sink = [](std::int32_t version, const char* host, std::uint16_t port,
                 const char* community) {
    TrapSinkConfig config;
    config.version = version;
    config.host = host;
    config.port = port;
    config.community = community;
    return config;
  };
  ManagerSocket informSink;
  std::vector<TrapSinkConfig> sinks = {sink(kSnmpV1, "127.0.0.1", v1Sink.Port(), "v1c"),
                                       sink(kSnmpV2c, "localhost", v2Sink.Port(), "v2c"),
                                       sink(kSnmpV2c, "127.0.0.1", informSink.Port(), "v2c")};
  sinks[2].inform = true;
  sinks[2].timeout = 60;
  EXPECT_EQ(SetTrapSinks(kAgentId + 1, 1, {sinks[0], sink(kSnmpV2c, "1:::2", 162, "")}), 1);
  ASSERT_EQ(SetTrapSinks(kAgentId + 1, 1, sinks), -1);
  ASSERT_GT(
      FillAgentInfoAndStartAgent({kAgentId + 1, sinked, kDevicePort, {"public"}, {}, 0, "", "", 0}),
      0);
  // The standard traps' enterprise and agent address are pinned where they are built.
  auto expectV1 = [&](std::uint8_t generic) {
    auto trap = v1Sink.Receive();
    ASSERT_TRUE(trap);
    EXPECT_EQ(trap->second, sinked + ":" + std::to_string(kDevicePort));
    EXPECT_EQ(trap->first.at(PduOffset(trap->first)), kTrapV1);
    EXPECT_TRUE(Contains(trap->first, {4, 3, 'v', '1', 'c'}));
    EXPECT_TRUE(Contains(trap->first, {2, 1, generic, 2, 1, 0, 0x43}));
  };
  auto expectV2 = [&](std::uint8_t trapOidLast) {
    auto trap = v2Sink.Receive();
    ASSERT_TRUE(trap);
    EXPECT_EQ(trap->second, sinked + ":" + std::to_string(kDevicePort));
    EXPECT_EQ(trap->first.at(PduOffset(trap->first)), kTrapV2);
    EXPECT_TRUE(Contains(trap->first, {6, 9, 0x2B, 6, 1, 6, 3, 1, 1, 5, trapOidLast}));
  };
  expectV1(kColdStart);
  expectV2(1);
  auto inform = informSink.Receive();
  ASSERT_TRUE(inform);
  EXPECT_EQ(inform->first.at(PduOffset(inform->first)), kInformRequest);
  EXPECT_TRUE(Contains(inform->first, {6, 9, 0x2B, 6, 1, 6, 3, 1, 1, 5, 1}));
  EXPECT_EQ(PendingInforms(), 1u);
  ClearTrapSinks();
  ASSERT_EQ(SetTrapSinks(kAgentId + 1, 1, {sinks[0], sinks[1]}), -1);

  tessel::Request badCommunity = GetOf({"1.3.6.1.2.1.1.5.0"});
  badCommunity.community = "guess";
  v1Sink.SendToDevice(EncodeRequest(badCommunity), kDevicePort, sinked);
  expectV1(kAuthenticationFailure);
  expectV2(5);

  AddNotifiedUser("signer", "MD5_AUTH", "signerpass1", kAuthNoPriv, {{"1.3", kVacmViewIncluded}});
  SnmpPdu get;
  get.type = kGetRequest;
  get.requestId = 7;
  V3Envelope discovery;
  discovery.msgId = 1;
  discovery.msgMaxSize = 1500;
  discovery.reportable = true;
  ManagerSocket manager;
  manager.SendToDevice(V3Message(discovery, get), kDevicePort, sinked);
  ASSERT_TRUE(manager.Receive());  // the Report that tells the engine ID
  EXPECT_FALSE(v1Sink.Receive(200));
  EXPECT_FALSE(v2Sink.Receive(0));

  V3Envelope forged = discovery;
  forged.level = kAuthNoPriv;
  forged.engineId = AgentEngineId(*FindAgentSession(sinked, kDevicePort));
  forged.userName = "signer";
  forged.auth = AuthProtocol::kMd5;
  forged.authKey = GetLocalKeyValue("not-the-password", forged.auth, forged.engineId);
  manager.SendToDevice(V3Message(forged, get), kDevicePort, sinked);
  ASSERT_TRUE(manager.Receive());  // the wrongDigest Report
  expectV1(kAuthenticationFailure);
  expectV2(5);
  EXPECT_FALSE(v1Sink.Receive(200));
  EXPECT_FALSE(v2Sink.Receive(0));

  // A v3 sink gets the trap from the device's engine, as its user, at the user's level.
  TrapSinkConfig v3Sink = sink(kSnmpV3, "127.0.0.1", manager.Port(), "");
  v3Sink.userName = "signer";
  ASSERT_EQ(SetTrapSinks(kAgentId + 1, 1, {v3Sink}), -1);
  EXPECT_EQ(RaiseStandardTrap(*FindAgentSession(sinked, kDevicePort), kColdStart), 1u);
  auto v3Trap = manager.Receive();
  ASSERT_TRUE(v3Trap);
  V3Received received;
  ParseV3Message(v3Trap->first.data(), v3Trap->first.size(), nullptr, &received);
  EXPECT_EQ(received.engineId, forged.engineId);
  EXPECT_EQ(received.level, kAuthNoPriv);
  EXPECT_EQ(received.userName, "signer");
  ClearTrapSinks();
}

}  // namespace
}  // namespace tessel
