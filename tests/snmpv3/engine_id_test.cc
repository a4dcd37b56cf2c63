#include "snmpv3/engine_id.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

namespace tessel {
namespace {

class EngineIdTest : public ::testing::Test {
 protected:
  void SetUp() override {
    base_ = std::filesystem::temp_directory_path() / ("engine-id-" + std::to_string(::getpid()));
    std::filesystem::create_directories(base_ / "conf" / "snmp");
    ClearEngineId();
  }
  void TearDown() override {
    ClearEngineId();
    std::filesystem::remove_all(base_);
  }
  std::string ReadFrom(const std::string& contents) {
    std::ofstream(base_ / "conf" / "snmp" / "snmpv3.txt") << contents;
    ClearEngineId();
    EXPECT_TRUE(ReadFromSnmpV3ConfFile(base_.string() + "/"));
    return EngineId();
  }
  std::filesystem::path base_;
};

TEST_F(EngineIdTest, FileGivesTheEngineIdWithoutBlanks) {
  EXPECT_EQ(ReadFrom("800007e5 8001 02\n"), "800007e5800102");
  EXPECT_EQ(ReadFrom(std::string(40, 'a')), std::string(32, 'a'));
  EXPECT_EQ(ReadFrom("abcd"), "192.168.1.161#8001");  // too short: generated
  // Once set, a later start keeps it.
  std::ofstream(base_ / "conf" / "snmp" / "snmpv3.txt") << "0123456789";
  EXPECT_TRUE(ReadFromSnmpV3ConfFile(base_.string() + "/"));
  EXPECT_EQ(EngineId(), "192.168.1.161#8001");
}

TEST_F(EngineIdTest, AgentsHaveTheirOwnEngineIds) {
  AgentSession agent;
  agent.transport.localAddress = "10.0.0.5";
  agent.transport.configuredPortMinusOne = 160;
  EXPECT_EQ(AgentEngineId(agent), "10.0.0.5#161");
  agent.transport.localAddress = "2001:db8:1234:5678:9abc:def0:1234:5678";
  agent.transport.configuredPortMinusOne = 1160;
  EXPECT_EQ(AgentEngineId(agent), "34:5678:9abc:def0:1234:5678#1161");  // the last 32 octets
}

}  // namespace
}  // namespace tessel
