#include "engine/engine.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <future>

#include "engine/engine_state.h"
#include "engine/log.h"
#include "support/memory_host.h"

namespace tessel {
namespace {

using namespace std::chrono_literals;
using ::testing::Contains;

class EngineTest : public ::testing::Test {
 protected:
  void SetUp() override {
    InstallHost(&host_);
    InstallSessionTransport([this](AgentSession&) -> std::int64_t { return nextSocket_++; },
                            [this](std::int64_t socket) { closed_.push_back(socket); });
    ASSERT_TRUE(InitAgentParams({}));
    InitAgentRegistry();
  }
  void TearDown() override {
    AdapterJniStopNetwork();
    InstallSessionTransport(nullptr, nullptr);
    InstallHost(nullptr);
  }

  static AgentRegistration Agent(const std::string& address) {
    return {0, address, 161, {}, {}, 0, "", "", 0};
  }

  MemoryHost host_;
  std::int64_t nextSocket_ = 50;
  std::vector<std::int64_t> closed_;
};

TEST_F(EngineTest, BaseLoopHoldsItsThreadUntilTheNetworkStops) {
  std::future<void> loop = std::async(std::launch::async, BaseLoop);
  EXPECT_EQ(loop.wait_for(50ms), std::future_status::timeout);
  AdapterJniStopSnmp();
  EXPECT_EQ(loop.wait_for(50ms), std::future_status::timeout) << "stopping SNMP alone keeps it";
  AdapterJniStopNetwork();
  EXPECT_EQ(loop.wait_for(5s), std::future_status::ready);
  EXPECT_THAT(host_.StatusLines(), Contains("Network resources cleared Successfully"));

  // Initialised again, the loop blocks again.
  ASSERT_TRUE(InitAgentParams({}));
  std::future<void> again = std::async(std::launch::async, BaseLoop);
  EXPECT_EQ(again.wait_for(50ms), std::future_status::timeout);
  AdapterJniStopNetwork();
  EXPECT_EQ(again.wait_for(5s), std::future_status::ready);
}

TEST_F(EngineTest, StopSnmpReleasesAgentsAndTheServiceStartsAgain) {
  EXPECT_EQ(StartSnmpNetwork({Agent("127.0.0.1"), Agent("127.0.0.2")}),
            (std::vector<std::int64_t>{50, 51}));
  EXPECT_EQ(gv_snmpServiceStarted.load(), 1);
  ASSERT_TRUE(InitSnmpThread());

  EXPECT_TRUE(AdapterJniStopSnmp());
  EXPECT_EQ(closed_, (std::vector<std::int64_t>{50, 51}));
  EXPECT_EQ(RegisteredAgentCount(), 0);
  EXPECT_EQ(gv_snmpServiceStarted.load(), 0);
  EXPECT_THAT(host_.StatusLines(), Contains("SNMP resources cleared Successfully"));

  // The first agent started after a stop brings the service back.
  RegisterAgentInfo(Agent("127.0.0.3"));
  EXPECT_TRUE(StartAgentAndService("127.0.0.3", 161, 1));
  EXPECT_EQ(gv_snmpServiceStarted.load(), 1);
  EXPECT_FALSE(StartAgentAndService("127.0.0.4", 161, 1));
}

TEST_F(EngineTest, LogFileFollowsTheDebugLevel) {
  std::filesystem::path directory =
      std::filesystem::path(testing::TempDir()) / "tessel_engine_test";
  std::filesystem::remove_all(directory);
  std::filesystem::create_directories(directory);
  std::string quiet = (directory / "quiet.log").string();
  EXPECT_TRUE(InitAgentParams({false, 0, quiet, 1 << 20}));
  EXPECT_FALSE(std::filesystem::exists(quiet));

  std::string missing = (directory / "missing" / "engine.log").string();
  EXPECT_FALSE(InitAgentParams({false, 2, missing, 1 << 20}));
  EXPECT_THAT(host_.StatusLines(), Contains("Error in opening the Log file : " + missing));
  std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace tessel
