#include "snmp/service.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <map>
#include <set>
#include <thread>

#include "engine/agent_registry.h"
#include "engine/engine_state.h"
#include "snmp/message.h"
#include "support/snmp_agent_fixture.h"
#include "transport/agent_sockets.h"
#include "transport/socket_batch.h"

namespace tessel {
namespace {

// Ports of this suite: distinct per test, and per process so that runs on one machine at the same
// time do not meet (20000-32000, below the ephemeral range).
const std::uint16_t kBasePort = static_cast<std::uint16_t>(20000 + (::getpid() % 300) * 40);

sockaddr_in Address(const char* text, std::uint16_t port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(port);
  inet_pton(AF_INET, text, &address.sin_addr);
  return address;
}

std::string SourceText(const sockaddr_in& source) {
  char text[INET_ADDRSTRLEN] = {};
  inet_ntop(AF_INET, &source.sin_addr, text, sizeof text);
  return std::string(text) + ":" + std::to_string(ntohs(source.sin_port));
}

// A manager's socket on loopback.
class Manager {
 public:
  Manager() : socket_(::socket(AF_INET, SOCK_DGRAM, 0)) {
    sockaddr_in local = Address("127.0.0.1", 0);
    bind(socket_, reinterpret_cast<sockaddr*>(&local), sizeof local);
  }
  ~Manager() { close(socket_); }

  void Send(const std::vector<std::uint8_t>& datagram, const char* agent, std::uint16_t port) {
    sockaddr_in to = Address(agent, port);
    sendto(socket_, datagram.data(), datagram.size(), 0, reinterpret_cast<sockaddr*>(&to),
           sizeof to);
  }
  // The next answer within two seconds; its source in *from.
  std::optional<SnmpPdu> Receive(std::string* from = nullptr) {
    pollfd ready{socket_, POLLIN, 0};
    if (poll(&ready, 1, 2000) != 1) return std::nullopt;
    std::vector<std::uint8_t> reply(kMaxSnmpMessage);
    sockaddr_in source{};
    socklen_t sourceLength = sizeof source;
    ssize_t length = recvfrom(socket_, reply.data(), reply.size(), 0,
                              reinterpret_cast<sockaddr*>(&source), &sourceLength);
    if (from) *from = SourceText(source);
    SnmpPdu pdu;
    if (length <= 0 || ParseSnmpMessage(reply.data(), static_cast<std::size_t>(length), &pdu) != 1)
      return std::nullopt;
    return pdu;
  }

  // Sends the datagram and waits for one answer.
  std::optional<SnmpPdu> Ask(const std::vector<std::uint8_t>& datagram, const char* agent,
                             std::uint16_t port, std::string* from = nullptr) {
    Send(datagram, agent, port);
    return Receive(from);
  }

 private:
  int socket_;
};

class ServiceTest : public SnmpAgentTest {
 protected:
  void SetUp() override {
    SnmpAgentTest::SetUp();
    InitSnmpParams();
  }
  void TearDown() override {
    StopSnmpGeneralServices();
    FreeSimulatorResources();
    InstallSessionTransport(nullptr, nullptr);
    SnmpAgentTest::TearDown();
  }

  static AgentRegistration Agent(const char* address, std::uint16_t port) {
    AgentRegistration agent;
    agent.agentId = 1;
    agent.address = address;
    agent.port = port;
    agent.readCommunities = {"public"};
    agent.writeCommunities = {"private"};
    return agent;
  }

  static std::vector<std::uint8_t> GetSysName() {
    Request request;
    request.bindings = {{O("1.3.6.1.2.1.1.5.0"), VarValue::Empty(kAsnNull)}};
    return EncodeRequest(request);
  }
};

TEST_F(ServiceTest, EveryAgentAnswersFromItsOwnAddressAndPort) {
  ASSERT_GT(FillAgentInfoAndStartAgent(Agent("127.77.0.1", kBasePort)), 0);
  ASSERT_GT(FillAgentInfoAndStartAgent(Agent("127.77.0.2", kBasePort + 1)), 0);
  ASSERT_TRUE(InitSnmpGeneralServices());
  Manager manager;
  std::string from;
  for (int round = 0; round < 3; ++round) {
    auto first = manager.Ask(GetSysName(), "127.77.0.1", kBasePort, &from);
    ASSERT_TRUE(first);
    EXPECT_EQ(first->requestVarBinds.at(0).value, VarValue::Octets(kAsnOctetString, "r1"));
    EXPECT_EQ(from, "127.77.0.1:" + std::to_string(kBasePort));
    ASSERT_TRUE(manager.Ask(GetSysName(), "127.77.0.2", kBasePort + 1, &from));
    EXPECT_EQ(from, "127.77.0.2:" + std::to_string(kBasePort + 1));
  }
  // A stopped agent no longer answers; the others do.
  EXPECT_TRUE(StopAgent("127.77.0.1", kBasePort));
  EXPECT_FALSE(manager.Ask(GetSysName(), "127.77.0.1", kBasePort));
  EXPECT_TRUE(manager.Ask(GetSysName(), "127.77.0.2", kBasePort + 1));
  // Its socket is closed: the address and port are free again.
  int other = socket(AF_INET, SOCK_DGRAM, 0);
  sockaddr_in released = Address("127.77.0.1", kBasePort);
  EXPECT_EQ(bind(other, reinterpret_cast<sockaddr*>(&released), sizeof released), 0);
  close(other);
  StopSnmpGeneralServices();
  EXPECT_EQ(LiveServiceThreads(), 0);
}

// Requests that queue up on one socket are read and answered in batches; a malformed one in
// between is dropped without disturbing the answers around it.
TEST_F(ServiceTest, QueuedRequestsAreAllAnsweredToTheirOwnRequestIds) {
  ASSERT_GT(FillAgentInfoAndStartAgent(Agent("127.77.0.4", kBasePort + 40)), 0);
  ASSERT_TRUE(InitSnmpGeneralServices());
  Manager manager;
  std::set<std::int32_t> expected;
  for (std::int32_t id = 1; id <= 40; ++id) {
    if (id == 20) {
      manager.Send({0x30, 0x03, 0x02, 0x01}, "127.77.0.4", kBasePort + 40);
      continue;
    }
    Request request;
    request.requestId = id;
    request.bindings = {{O("1.3.6.1.2.1.1.5.0"), VarValue::Empty(kAsnNull)}};
    manager.Send(EncodeRequest(request), "127.77.0.4", kBasePort + 40);
    expected.insert(id);
  }
  std::set<std::int32_t> answered;
  while (std::optional<SnmpPdu> reply = manager.Receive()) {
    EXPECT_EQ(reply->requestVarBinds.at(0).value, VarValue::Octets(kAsnOctetString, "r1"));
    answered.insert(reply->requestId);
    if (answered.size() == expected.size()) break;
  }
  EXPECT_EQ(answered, expected);
}

// Requests waiting on many agents' sockets when the threads start: each shard wakes to more
// ready sockets than it reads one by one, and reads them together where io_uring serves (else one
// by one). Every request is answered from the address it was sent to.
TEST_F(ServiceTest, RequestsToManyAgentsAtOnceAreAnsweredByEach) {
  const int agents = AgentSocketShards() * 12;
  for (int i = 0; i < agents; ++i) {
    std::string address = "127.77.1." + std::to_string(i + 1);
    ASSERT_GT(FillAgentInfoAndStartAgent(Agent(address.c_str(), kBasePort + 50)), 0);
  }
  Manager manager;
  std::map<std::int32_t, std::string> expected;
  for (int round = 0; round < 2; ++round) {
    for (int i = 0; i < agents; ++i) {
      Request request;
      request.requestId = round * 100 + i;
      request.bindings = {{O("1.3.6.1.2.1.1.5.0"), VarValue::Empty(kAsnNull)}};
      std::string address = "127.77.1." + std::to_string(i + 1);
      manager.Send(EncodeRequest(request), address.c_str(), kBasePort + 50);
      expected[request.requestId] = address + ":" + std::to_string(kBasePort + 50);
    }
  }
  const ServiceReadCounts before = ServiceReads();
  ASSERT_TRUE(InitSnmpGeneralServices());
  std::map<std::int32_t, std::string> answered;
  std::string from;
  while (std::optional<SnmpPdu> reply = manager.Receive(&from)) {
    answered[reply->requestId] = from;
    if (answered.size() == expected.size()) break;
  }
  EXPECT_EQ(answered, expected);
  const ServiceReadCounts after = ServiceReads();
  EXPECT_GE(after.manySocketWakeups, before.manySocketWakeups + AgentSocketShards());
  EXPECT_EQ(after.socketBatches > before.socketBatches, SocketBatch::Create() != nullptr);
}

TEST_F(ServiceTest, WildcardSocketAnswersRegisteredAgentsFromTheirAddress) {
  ASSERT_EQ(RegisterAgentInfo(Agent("127.77.0.9", kBasePort + 10)), 1);
  ASSERT_TRUE(InitSnmpGeneralServices());
  Manager manager;
  std::string from;
  auto reply = manager.Ask(GetSysName(), "127.77.0.9", kBasePort + 10, &from);
  ASSERT_TRUE(reply);
  EXPECT_EQ(from, "127.77.0.9:" + std::to_string(kBasePort + 10));
  // An address no agent owns is dropped, and the loop goes on.
  EXPECT_FALSE(manager.Ask(GetSysName(), "127.77.0.10", kBasePort + 10));
  EXPECT_TRUE(manager.Ask(GetSysName(), "127.77.0.9", kBasePort + 10));
  // Starting the agent takes the port over from the wildcard socket.
  EXPECT_TRUE(StartAgent("127.77.0.9", kBasePort + 10, 1));
  EXPECT_TRUE(manager.Ask(GetSysName(), "127.77.0.9", kBasePort + 10, &from));
  EXPECT_EQ(from, "127.77.0.9:" + std::to_string(kBasePort + 10));
}

// A port that another socket serves on the agent's address is refused; the wildcard sockets,
// which gave way for the attempt, come back and go on answering for the registered agents.
TEST_F(ServiceTest, PortServedByAnotherSocketIsRefusedAndTheWildcardsStay) {
  const std::uint16_t port = kBasePort + 20;
  ASSERT_EQ(RegisterAgentInfo(Agent("127.77.0.6", port)), 1);
  ASSERT_TRUE(InitSnmpGeneralServices());
  int other = socket(AF_INET, SOCK_DGRAM, 0);
  int on = 1;
  setsockopt(other, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);  // shares with the wildcards
  sockaddr_in taken = Address("127.77.0.5", port);
  ASSERT_EQ(bind(other, reinterpret_cast<sockaddr*>(&taken), sizeof taken), 0);
  EXPECT_EQ(FillAgentInfoAndStartAgent(Agent("127.77.0.5", port)), 0);
  EXPECT_EQ(host_.StatusLines().back(),
            "Unable to start SNMP Agent at Port : " + std::to_string(port) +
                " and at IpAddress : 127.77.0.5 ");
  close(other);
  EXPECT_TRUE(Manager().Ask(GetSysName(), "127.77.0.6", port));
}

TEST_F(ServiceTest, StopEndsEveryThreadAndTheServiceStartsAgain) {
  ASSERT_GT(FillAgentInfoAndStartAgent(Agent("127.77.0.3", kBasePort + 30)), 0);
  for (int cycle = 0; cycle < 2; ++cycle) {
    ASSERT_TRUE(InitSnmpGeneralServices());
    EXPECT_EQ(LiveServiceThreads(), AgentSocketShards());
    Manager manager;
    EXPECT_TRUE(manager.Ask(GetSysName(), "127.77.0.3", kBasePort + 30));
    StopSnmpGeneralServices();
    EXPECT_EQ(LiveServiceThreads(), 0);
  }
}

// An epoll that fails for good (here: its descriptor now names an eventfd) ends its service
// thread, which would otherwise spin on the error; the stop still joins every thread.
TEST_F(ServiceTest, ThreadWhoseEpollFailsEndsInsteadOfSpinning) {
  const int shards = AgentSocketShards();
  for (int i = 0; i < shards; ++i) {  // agents go to the shards in turn: one wakes each thread
    std::string address = "127.77.2." + std::to_string(i + 1);
    ASSERT_GT(FillAgentInfoAndStartAgent(Agent(address.c_str(), kBasePort + 70)), 0);
  }
  ASSERT_TRUE(InitSnmpGeneralServices());
  int junk = eventfd(0, EFD_CLOEXEC);
  std::vector<int> saved;
  for (int shard = 0; shard < shards; ++shard) {
    saved.push_back(dup(AgentSocketsEpoll(shard)));
    dup2(junk, AgentSocketsEpoll(shard));
  }
  Manager manager;
  for (int i = 0; i < shards; ++i)
    manager.Send(GetSysName(), ("127.77.2." + std::to_string(i + 1)).c_str(), kBasePort + 70);
  for (int wait = 0; wait < 200 && LiveServiceThreads() > 0; ++wait)
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  EXPECT_EQ(LiveServiceThreads(), 0);
  for (int shard = 0; shard < shards; ++shard) {
    dup2(saved[static_cast<std::size_t>(shard)], AgentSocketsEpoll(shard));
    close(saved[static_cast<std::size_t>(shard)]);
  }
  close(junk);
}

}  // namespace
}  // namespace tessel
