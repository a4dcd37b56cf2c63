#include "engine/agent_registry.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "engine/engine_state.h"
#include "support/memory_host.h"

namespace tessel {
namespace {

using ::testing::ElementsAre;

// A transport that opens every loopback address except 127.0.0.99 and records every close.
class AgentRegistryTest : public ::testing::Test {
 protected:
  void SetUp() override {
    FreeSimulatorResources();
    InstallHost(&host_);
    gv_trapPort = 0;
    InstallSessionTransport(
        [this](AgentSession& session) -> std::int64_t {
          ++opens_;
          return session.transport.localAddress == "127.0.0.99" ? 0 : nextSocket_++;
        },
        [this](std::int64_t socket) { closed_.push_back(socket); });
  }
  void TearDown() override {
    FreeSimulatorResources();
    InstallSessionTransport(nullptr, nullptr);
    InstallHost(nullptr);
  }

  static AgentRegistration Agent(const std::string& address, std::uint16_t port,
                                 std::int32_t id = 1) {
    AgentRegistration agent;
    agent.agentId = id;
    agent.address = address;
    agent.port = port;
    agent.readCommunities = {"public"};
    agent.writeCommunities = {"private"};
    agent.databaseName = "db";
    agent.tableName = "table" + std::to_string(id);
    return agent;
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
  std::int64_t socket = FillAgentInfoAndStartAgent(agent);
  ASSERT_EQ(socket, 100);

  std::optional<AgentSession> session = LookupAgentByAddress("127.0.0.1");
  ASSERT_TRUE(session);
  EXPECT_EQ(session->socket, 100);
  EXPECT_EQ(session->transport.localPort, 160);  // configured port minus one
  EXPECT_EQ(session->agentInfo->agentKey, "127.0.0.1#161");
  EXPECT_EQ(session->agentInfo->started.load(), 1);
  EXPECT_EQ(session->agentInfo->engineBoots.load(), 4u);
  EXPECT_THAT(session->agentInfo->readCommunities.Snapshot(), ElementsAre("a", "", "b"));
  EXPECT_EQ(gv_snmpPort.load(), 161);
  EXPECT_EQ(MaxSocket(), 100);
  EXPECT_EQ(GetModeInfo("127.0.0.1", "161"), "db:table7");
  EXPECT_EQ(GetModeInfo("127.0.0.1", "162"), std::nullopt);
  EXPECT_EQ(GetAgentID("127.0.0.1"), 7);
  EXPECT_EQ(GetAgentID("127.0.0.2"), -1);
  EXPECT_THAT(host_.StatusLines(),
              ElementsAre("Snmp Agent Started at port : 161 and at IPAddress : 127.0.0.1"));
}

TEST_F(AgentRegistryTest, AgentThatCannotOpenIsDroppedAndReported) {
  EXPECT_FALSE(StartAgent("127.0.0.99", 161, 0)) << "empty registry";
  RegisterAgentInfo(Agent("127.0.0.99", 161));
  EXPECT_FALSE(StartAgent("127.0.0.99", 161, 0));
  EXPECT_EQ(RegisteredAgentCount(), 0);
  EXPECT_EQ(FillAgentInfoAndStartAgent(Agent("127.0.0.99", 161)), 0);
  EXPECT_EQ(RegisteredAgentCount(), 0);
  EXPECT_FALSE(LookupAgentByAddress("127.0.0.99"));
  const std::string refused =
      "Unable to start SNMP Agent at Port : 161 and at IpAddress : 127.0.0.99 ";
  EXPECT_THAT(host_.StatusLines(), ElementsAre(refused, refused));

  InstallSessionTransport(nullptr, nullptr);
  EXPECT_EQ(FillAgentInfoAndStartAgent(Agent("127.0.0.1", 161)), 0) << "no transport opens nothing";
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
  EXPECT_EQ(session->agentInfo->started.load(), 0);
  EXPECT_THAT(session->agentInfo->readCommunities.Snapshot(), ElementsAre("a,b")) << "not split";
  EXPECT_EQ(session->agentInfo->engineBoots.load(), 0u);

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

  // A second start replaces the socket and closes the one it replaces.
  EXPECT_TRUE(StartAgent("127.0.0.1", 161, 3));
  session = FindAgentSession("127.0.0.1", 161);
  EXPECT_EQ(session->socket, 101);
  EXPECT_EQ(session->agentInfo->engineBoots.load(), 3u);
  EXPECT_THAT(closed_, ElementsAre(100));
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

TEST_F(AgentRegistryTest, PortsWrapAndLongKeysAreCut) {
  RegisterAgentInfo(Agent("127.0.0.1", 0));
  EXPECT_EQ(FindAgentSession("127.0.0.1", 0)->transport.localPort, 65535);
  EXPECT_TRUE(GetModeInfo("127.0.0.1", "0"));

  std::string longAddress(60, 'a');
  RegisterAgentInfo(Agent(longAddress, 161));
  EXPECT_EQ(LookupAgentByAddress(longAddress)->agentInfo->agentKey, std::string(47, 'a'));
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
  EXPECT_THAT(SplitCommunities(""), ElementsAre(""));
}

}  // namespace
}  // namespace tessel
