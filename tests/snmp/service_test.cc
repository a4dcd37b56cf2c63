#include "snmp/service.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <unistd.h>

#include <map>
#include <thread>

#include "engine/agent_registry.h"
#include "snmp/message.h"
#include "support/snmp_agent_fixture.h"
#include "snmp/agent_sockets.h"
#include "transport/socket_batch.h"

namespace tessel {
namespace {

// Ports of this suite: distinct per test, and per process so that runs on one machine at the same
// time do not meet (20000-32000, below the ephemeral range).
const std::uint16_t kBasePort = static_cast<std::uint16_t>(20000 + (::getpid() % 300) * 40);

sockaddr_in Address(const std::string& text, std::uint16_t port) {
  sockaddr_in address{AF_INET, htons(port), {}, {}};
  inet_pton(AF_INET, text.c_str(), &address.sin_addr);
  return address;
}

// A UDP socket bound to address:port (sharing it with the engine's wildcard sockets when
// share), or -1.
int Bound(const std::string& text, std::uint16_t port, bool share = false) {
  int socket = ::socket(AF_INET, SOCK_DGRAM, 0);
  int on = 1;
  if (share) setsockopt(socket, SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
  sockaddr_in address = Address(text, port);
  if (bind(socket, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0) return socket;
  close(socket);
  return -1;
}

std::string Agent(int i) { return "127.77.1." + std::to_string(i + 1); }
std::string Endpoint(const std::string& address, std::uint16_t port) {
  return address + ":" + std::to_string(port);
}

std::vector<std::uint8_t> GetSysName(std::int32_t requestId = 42) {
  Request request = GetOf({"1.3.6.1.2.1.1.5.0"});
  request.requestId = requestId;
  return EncodeRequest(request);
}

// A manager's socket on loopback.
class Manager {
 public:
  ~Manager() { close(socket_); }

  void Send(const std::vector<std::uint8_t>& datagram, const std::string& agent,
            std::uint16_t port) {
    sockaddr_in to = Address(agent, port);
    sendto(socket_, datagram.data(), datagram.size(), 0, reinterpret_cast<sockaddr*>(&to),
           sizeof to);
  }
  // The source of the answer to a GetRequest sent to agent:port, if it came within two seconds.
  std::optional<std::string> Ask(const std::string& agent, std::uint16_t port) {
    Send(GetSysName(), agent, port);
    std::map<std::int32_t, std::string> answered = ReceiveAll(1);
    return answered.empty() ? std::nullopt : std::optional(answered.begin()->second);
  }
  // Request id -> the source of its answer, for up to count answers that come within two
  // seconds of each other.
  std::map<std::int32_t, std::string> ReceiveAll(std::size_t count) {
    std::map<std::int32_t, std::string> answered;
    std::vector<std::uint8_t> reply(kMaxSnmpMessage);
    pollfd ready{socket_, POLLIN, 0};
    while (answered.size() < count && poll(&ready, 1, 2000) == 1) {
      sockaddr_in source{};
      socklen_t sourceLength = sizeof source;
      ssize_t length = recvfrom(socket_, reply.data(), reply.size(), 0,
                                reinterpret_cast<sockaddr*>(&source), &sourceLength);
      SnmpPdu pdu;
      char text[INET_ADDRSTRLEN] = {};
      if (length <= 0 ||
          ParseSnmpMessage(reply.data(), static_cast<std::size_t>(length), &pdu) != 1)
        continue;
      EXPECT_EQ(pdu.requestVarBinds.at(0).value, VarValue::Octets(kAsnOctetString, "r1"));
      answered[pdu.requestId] =
          Endpoint(inet_ntop(AF_INET, &source.sin_addr, text, sizeof text), ntohs(source.sin_port));
    }
    return answered;
  }

 private:
  int socket_ = Bound("127.0.0.1", 0);
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

  static AgentRegistration Registration(const std::string& address, std::uint16_t port) {
    return {1, address, port, {"public"}, {}, 0, "", "", 0};
  }
  static void StartAgents(int count, std::uint16_t port) {
    for (int i = 0; i < count; ++i)
      ASSERT_GT(FillAgentInfoAndStartAgent(Registration(Agent(i), port)), 0);
  }
};

// Requests waiting on many agents' sockets when the threads start: each shard wakes to more
// ready sockets than it reads one by one, and reads them together where io_uring serves (else one
// by one). The first agent holds a queue of its own, read in batches from its socket, with a
// malformed request in it that is dropped without disturbing the answers around it. Every request
// is answered from the address and port it was sent to, to its own request id.
TEST_F(ServiceTest, RequestsToManyAgentsAtOnceAreAnsweredByEach) {
  const std::uint16_t port = kBasePort + 20;
  const int agents = AgentSocketShards() * 12;
  StartAgents(agents, port);
  Manager manager;
  std::map<std::int32_t, std::string> expected;
  for (int round = 0; round < 2; ++round) {
    for (int i = 0; i < agents; ++i) {
      manager.Send(GetSysName(round * 100 + i), Agent(i), port);
      expected[round * 100 + i] = Endpoint(Agent(i), port);
    }
  }
  for (std::int32_t id = 1000; id < 1040; ++id) {
    manager.Send(id == 1020 ? std::vector<std::uint8_t>{0x30, 0x03, 0x02, 0x01} : GetSysName(id),
                 Agent(0), port);
    if (id != 1020) expected[id] = Endpoint(Agent(0), port);
  }
  const ServiceReadCounts before = ServiceReads();
  ASSERT_TRUE(InitSnmpGeneralServices());
  EXPECT_EQ(manager.ReceiveAll(expected.size()), expected);
  const ServiceReadCounts after = ServiceReads();
  EXPECT_GE(after.manySocketWakeups, before.manySocketWakeups + AgentSocketShards());
  EXPECT_EQ(after.socketBatches > before.socketBatches, SocketBatch::Create() != nullptr);
  // The service stops and starts again with every thread; a stopped agent's socket is closed.
  EXPECT_EQ(LiveServiceThreads(), AgentSocketShards());
  StopSnmpGeneralServices();
  EXPECT_EQ(LiveServiceThreads(), 0);
  ASSERT_TRUE(InitSnmpGeneralServices());
  EXPECT_EQ(manager.Ask(Agent(1), port), Endpoint(Agent(1), port));
  EXPECT_TRUE(StopAgent(Agent(0), port));
  int freed = Bound(Agent(0), port);
  EXPECT_GE(freed, 0);
  close(freed);
}

// The wildcard sockets answer for registered agents without sockets of their own, from the
// agent's address; a starting agent takes the port from them, and when another socket holds
// the port on the agent's address the start is refused and the wildcard sockets stay.
TEST_F(ServiceTest, WildcardSocketsAnswerForRegisteredAgentsAndGiveWayToStartingOnes) {
  const std::uint16_t port = kBasePort + 30;
  ASSERT_EQ(RegisterAgentInfo(Registration(Agent(0), port)), 1);
  ASSERT_TRUE(InitSnmpGeneralServices());
  Manager manager;
  EXPECT_EQ(manager.Ask(Agent(0), port), Endpoint(Agent(0), port));
  // An address no agent owns is dropped, and the loop goes on.
  EXPECT_FALSE(manager.Ask(Agent(9), port));
  int other = Bound(Agent(1), port, true);
  ASSERT_GE(other, 0);
  EXPECT_LE(FillAgentInfoAndStartAgent(Registration(Agent(1), port)), 0);
  close(other);
  EXPECT_EQ(manager.Ask(Agent(0), port), Endpoint(Agent(0), port));
  EXPECT_TRUE(StartAgent(Agent(0), port, 1));
  EXPECT_EQ(manager.Ask(Agent(0), port), Endpoint(Agent(0), port));
}

// An epoll that fails for good (here: its descriptor now names an eventfd) ends its service
// thread, which would otherwise spin on the error; the stop still joins every thread.
TEST_F(ServiceTest, ThreadWhoseEpollFailsEndsInsteadOfSpinning) {
  const std::uint16_t port = kBasePort + 40;
  const int shards = AgentSocketShards();
  StartAgents(shards, port);  // agents go to the shards in turn: one request wakes each thread
  ASSERT_TRUE(InitSnmpGeneralServices());
  int junk = eventfd(0, EFD_CLOEXEC);
  std::vector<int> saved;
  for (int shard = 0; shard < shards; ++shard) {
    saved.push_back(dup(AgentSocketsEpoll(shard)));
    dup2(junk, AgentSocketsEpoll(shard));
  }
  Manager manager;
  for (int i = 0; i < shards; ++i) manager.Send(GetSysName(), Agent(i), port);
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
