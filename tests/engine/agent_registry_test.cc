#include "engine/agent_registry.h"

#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <string>
#include <vector>

#include "engine/engine_state.h"
#include "support/memory_host.h"
#include "snmp/agent_sockets.h"

namespace tessel {
namespace {

using ::testing::ElementsAre;

// Agent id on address:port, communities "public" and "private", table "t<id>" of "db".
AgentRegistration Agent(const std::string& address, std::uint16_t port, std::int32_t id = 1) {
  return {id, address, port, {"public"}, {"private"}, 0, "db", "t" + std::to_string(id), 0};
}

std::string NotStarted(int port, const std::string& address) {
  return "Unable to start SNMP Agent at Port : " + std::to_string(port) +
         " and at IpAddress : " + address + " ";
}

// A transport that opens every port but 999 and records every close.
class AgentRegistryTest : public ::testing::Test {
 protected:
  void SetUp() override {
    FreeSimulatorResources();
    InstallHost(&host_);
    gv_trapPort = 0;
    InstallSessionTransport(
        [this](AgentSession& session) -> std::int64_t {
          ++opens_;
          return session.transport.configuredPortMinusOne == 998 ? kNoSocket : nextSocket_++;
        },
        [this](std::int64_t socket) { closed_.push_back(socket); });
  }
  void TearDown() override {
    FreeSimulatorResources();
    InstallSessionTransport(nullptr, nullptr);
    InstallHost(nullptr);
  }

  MemoryHost host_;
  std::int64_t nextSocket_ = 100;
  int opens_ = 0;
  std::vector<std::int64_t> closed_;
};

TEST_F(AgentRegistryTest, StartedAgentIsRegisteredPublishedAndReported) {
  AgentRegistration agent = Agent("127.0.0.1", 161, 7);
  agent.readCommunities = {"a,,b"};
  agent.engineBoots = 4;
  ASSERT_EQ(FillAgentInfoAndStartAgent(agent), 100);

  std::optional<AgentSession> session = LookupAgentByAddress("127.0.0.1");
  ASSERT_TRUE(session);
  EXPECT_EQ(session->agentInfo->started.load(), 1);
  EXPECT_EQ(session->agentInfo->engineBoots.load(), 4u);
  EXPECT_THAT(session->agentInfo->readCommunities.Snapshot(), ElementsAre("a", "", "b"));
  EXPECT_EQ(gv_snmpPort.load(), 161);
  EXPECT_EQ(GetModeInfo("127.0.0.1", "161"), "db:t7");
  EXPECT_EQ(GetModeInfo("127.0.0.1", "162"), std::nullopt);
  EXPECT_EQ(GetAgentID("127.0.0.1"), 7);
  EXPECT_EQ(GetAgentID("127.0.0.2"), -1);
  EXPECT_THAT(host_.StatusLines(),
              ElementsAre("Snmp Agent Started at port : 161 and at IPAddress : 127.0.0.1"));
}

TEST_F(AgentRegistryTest, AgentThatCannotOpenIsDroppedWithoutTouchingOthers) {
  EXPECT_FALSE(StartAgent("127.0.0.1", 999, 0)) << "empty registry";
  FillAgentInfoAndStartAgent(Agent("127.0.0.1", 161, 1));
  EXPECT_EQ(FillAgentInfoAndStartAgent(Agent("127.0.0.1", 999, 2)), kNoSocket);
  EXPECT_EQ(GetAgentID("127.0.0.1"), 1) << "a refused agent leaves the running one's entry";

  RegisterAgentInfo(Agent("127.0.0.1", 999, 3));
  EXPECT_EQ(GetAgentID("127.0.0.1"), 3) << "the later registration wins";
  EXPECT_FALSE(StartAgent("127.0.0.1", 999, 0));
  EXPECT_EQ(GetAgentID("127.0.0.1"), 1) << "the dropped agent gives the entry back";
  EXPECT_EQ(RegisteredAgentCount(), 1);

  RegisterAgentInfo(Agent("127.0.0.3", 999, 4));
  EXPECT_FALSE(StartAgent("127.0.0.3", 999, 0));
  EXPECT_FALSE(LookupAgentByAddress("127.0.0.3"));
  EXPECT_THAT(host_.StatusLines(),
              ElementsAre(testing::_, NotStarted(999, "127.0.0.1"), NotStarted(999, "127.0.0.1"),
                          NotStarted(999, "127.0.0.3")));

  InstallSessionTransport(nullptr, nullptr);
  EXPECT_EQ(FillAgentInfoAndStartAgent(Agent("127.0.0.4", 161)), kNoSocket) << "no transport";
}

TEST_F(AgentRegistryTest, TwoPortsOnOneAddressShareTheAddressEntry) {
  FillAgentInfoAndStartAgent(Agent("127.0.0.1", 161, 1));
  FillAgentInfoAndStartAgent(Agent("127.0.0.1", 162, 2));
  EXPECT_EQ(RegisteredAgentCount(), 2);
  EXPECT_EQ(GetAgentID("127.0.0.1"), 2) << "the later registration wins";

  EXPECT_TRUE(StopAgent("127.0.0.1", 161));
  EXPECT_THAT(closed_, ElementsAre(100));
  EXPECT_FALSE(LookupAgentByAddress("127.0.0.1")) << "either stop removes the shared entry";
  EXPECT_TRUE(FindAgentSession("127.0.0.1", 162));
  EXPECT_FALSE(FindAgentSession("127.0.0.1", 161));
  EXPECT_FALSE(StopAgent("127.0.0.1", 161));
}

TEST_F(AgentRegistryTest, RegisteredAgentStopsRestartsAndStartsByPosition) {
  AgentRegistration agent = Agent("127.0.0.1", 161, 9);
  agent.readCommunities = {"a,b"};
  EXPECT_EQ(RegisterAgentInfo(agent), 9);
  std::optional<AgentSession> session = FindAgentSession("127.0.0.1", 161);
  ASSERT_TRUE(session);
  EXPECT_EQ(session->socket, kNoSocket);
  EXPECT_THAT(session->agentInfo->readCommunities.Snapshot(), ElementsAre("a,b")) << "not split";

  // Never started: the stop only drops the address entry.
  EXPECT_TRUE(StopAgent("127.0.0.1", 161));
  EXPECT_EQ(RegisteredAgentCount(), 1);
  EXPECT_FALSE(LookupAgentByAddress("127.0.0.1"));
  EXPECT_TRUE(closed_.empty());

  EXPECT_FALSE(RestartAgent(1));
  EXPECT_FALSE(RestartAgent(-1));
  EXPECT_TRUE(RestartAgent(0));
  EXPECT_EQ(FindAgentSession("127.0.0.1", 161)->socket, 100);
  EXPECT_TRUE(RestartAgent(0)) << "a started agent is left as it is";
  EXPECT_EQ(opens_, 1);
  EXPECT_FALSE(StartAgent("127.0.0.1", 170, 3));
}

TEST_F(AgentRegistryTest, TrapPortAvoidsTheAgentPort) {
  RegisterAgentInfo(Agent("127.0.0.1", 161));
  EXPECT_EQ(gv_trapPort.load(), 162) << "an unset trap port follows the agent";
  gv_trapPort = 300;
  RegisterAgentInfo(Agent("127.0.0.2", 300));
  EXPECT_EQ(gv_trapPort.load(), 301);
  RegisterAgentInfo(Agent("127.0.0.3", 161));
  EXPECT_EQ(gv_trapPort.load(), 301) << "a different port leaves it";
  StopAgent("127.0.0.3", 301);
  EXPECT_EQ(gv_trapPort.load(), 302) << "stop applies the same rule";
}

TEST_F(AgentRegistryTest, CommunitiesAreAppendedByMode) {
  RegisterAgentInfo(Agent("127.0.0.1", 161));
  SetCommunitiesValue("127.0.0.1", {"r1,r2"}, {"w1"}, 1);
  SetCommunitiesValue("127.0.0.1", {"r3"}, {"w2,"}, 2);
  SetCommunitiesValue("127.0.0.1", {"public"}, {"w3"}, 3);
  SetCommunitiesValue("127.0.0.2", {"x"}, {"x"}, 3);
  const AgentInfo& info = *LookupAgentByAddress("127.0.0.1")->agentInfo;
  EXPECT_THAT(info.readCommunities.Snapshot(), ElementsAre("public", "r1", "r2", "public"));
  EXPECT_THAT(info.writeCommunities.Snapshot(), ElementsAre("private", "w2", "", "w3"));
}

// The registry over real agent sockets: every socket the process holds at the end of a test
// belongs to an agent.
class AgentSocketRegistryTest : public AgentRegistryTest {
 protected:
  static constexpr const char* kAddress = "127.0.0.1";

  void SetUp() override {
    AgentRegistryTest::SetUp();
    InstallSessionTransport(OpenAgentSocket, CloseAgentSocket);
    port_ = FreePort();
    sockets_ = OpenSockets();
  }
  void TearDown() override {
    FreeSimulatorResources();
    EXPECT_EQ(OpenSockets(), sockets_) << "a socket outlived its agent";
    AgentRegistryTest::TearDown();
  }

  static int OpenSockets() {
    int count = 0;
    for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
      std::error_code error;
      if (std::filesystem::read_symlink(entry.path(), error).string().starts_with("socket:"))
        ++count;
    }
    return count;
  }

  // A UDP port that nothing on the loopback address holds right now.
  static std::uint16_t FreePort() {
    int probe = socket(AF_INET, SOCK_DGRAM, 0);
    sockaddr_in address{AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    socklen_t length = sizeof address;
    bind(probe, reinterpret_cast<sockaddr*>(&address), length);
    getsockname(probe, reinterpret_cast<sockaddr*>(&address), &length);
    close(probe);
    return ntohs(address.sin_port);
  }

  std::uint16_t port_ = 0;
  int sockets_ = 0;
};

TEST_F(AgentSocketRegistryTest, NoStartStopOrRestartLosesASocket) {
  RegisterAgentInfo(Agent(kAddress, port_, 1));
  // The shards' epolls exist before standard input closes: restoring it must not replace one.
  for (int shard = 0; shard < AgentSocketShards(); ++shard) ASSERT_GE(AgentSocketsEpoll(shard), 0);
  int input = dup(STDIN_FILENO);
  close(STDIN_FILENO);
  bool started = StartAgent(kAddress, port_, 1);
  dup2(input, STDIN_FILENO);
  close(input);
  ASSERT_TRUE(started);
  std::int64_t socket = FindAgentSession(kAddress, port_)->socket;
  EXPECT_GT(socket, STDERR_FILENO) << "an agent socket never takes a standard descriptor";
  EXPECT_TRUE(FindAgentSocket(static_cast<int>(socket)));
  EXPECT_TRUE(StartAgent(kAddress, port_, 2)) << "a running agent stays on its socket";
  ASSERT_TRUE(FindAgentSession(kAddress, port_));
  EXPECT_EQ(FindAgentSession(kAddress, port_)->socket, socket);
  EXPECT_EQ(FindAgentSession(kAddress, port_)->agentInfo->engineBoots.load(), 2u);
  EXPECT_TRUE(RestartAgent(0));
  EXPECT_EQ(FillAgentInfoAndStartAgent(Agent(kAddress, port_, 2)), kNoSocket) << "port taken";
  EXPECT_EQ(GetAgentID(kAddress), 1);
  EXPECT_EQ(OpenSockets(), sockets_ + 1);

  EXPECT_TRUE(StopAgent(kAddress, port_));
  EXPECT_EQ(OpenSockets(), sockets_);
  EXPECT_GE(FillAgentInfoAndStartAgent(Agent(kAddress, port_, 3)), 0) << "the port is free again";
  EXPECT_EQ(OpenSockets(), sockets_ + 1);
}

}  // namespace
}  // namespace tessel
