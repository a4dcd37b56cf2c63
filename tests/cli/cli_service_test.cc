#include "cli/cli_service.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>

#include "support/loopback_client.h"
#include "support/memory_host.h"

namespace tessel {
namespace {

using namespace std::chrono_literals;
using namespace std::string_literals;
using Answer = std::vector<std::optional<std::string>>;
using Clock = std::chrono::steady_clock;

// Ports of this suite: per process, so that runs on one machine at the same time do not meet.
const std::uint16_t kPort = static_cast<std::uint16_t>(30000 + (::getpid() % 900) * 10);
const std::string kAddress = "127.88.0.1";
const std::string kBannerAndPrompt = std::string(kCliBanner) + "\r\nUsername: ";

struct CliServiceTest : ::testing::Test {
  CliServiceTest() {
    host.SetCliReply("show version", 5, Answer{"response", "Version 1\n"});
    CliAgent agent;
    agent.userName = "admin";
    agent.password = "pw";
    agent.ipAddress = kAddress;
    agent.port = kPort;
    agent.deviceName = "R7";
    service.RegisterAgent(agent);
    EXPECT_TRUE(service.StartAgent(kAddress, kPort, false, 0, 0));
  }
  std::unique_ptr<LoopbackClient> Connect() {
    auto client = std::make_unique<LoopbackClient>(kAddress, kPort);
    EXPECT_TRUE(client->Connected());
    return client;
  }
  // A client that takes no part in Telnet: it sends a line first, and so is served at once.
  std::unique_ptr<LoopbackClient> LoggedIn() {
    auto client = Connect();
    client->Send("admin\r\n");
    client->ReadUntil("Password: ");
    client->Send("pw\r\n");
    EXPECT_TRUE(client->ReadUntil("R7>").ends_with("\r\nR7>"));
    return client;
  }

  MemoryHost host;
  std::vector<std::string> status;
  CliService service{{&host,
                      2,
                      {},
                      [this](const std::string& line) { status.push_back(line); },
                      1000ms,
                      3,
                      "./",
                      {}}};
};

TEST_F(CliServiceTest, TelnetOpeningNeverHoldsAnotherClient) {
  auto start = Clock::now();
  auto silent = Connect();
  auto negotiating = Connect();
  EXPECT_EQ(negotiating->ReadUntil("\xff\xfd\x18"), "\xff\xfd\x18");
  negotiating->Send("\xff\xfb\x18");
  EXPECT_EQ(negotiating->ReadUntil("\xff\xf0"), "\xff\xfa\x18\x01\xff\xf0");
  negotiating->Send("\xff\xfa\x18\x00XTERM\xff\xf0"s);
  EXPECT_EQ(negotiating->ReadUntil("Username: "), "\xff\xfb\x03\xff\xfb\x01" + kBannerAndPrompt);
  EXPECT_LT(Clock::now() - start, 500ms) << "served while the other client stays silent";
  negotiating->Send("a");
  EXPECT_EQ(negotiating->ReadUntil("a", 1, 1s), "a") << "a negotiated client gets each key echoed";

  EXPECT_EQ(silent->ReadUntil("Username: "), "\xff\xfd\x18" + kBannerAndPrompt);
  EXPECT_GE(Clock::now() - start, 900ms) << "a silent client is given up on after a second";
}

TEST_F(CliServiceTest, LinesSplitOrTogetherAreAnsweredInOrderWithEcho) {
  auto client = Connect();
  client->Send("adm");
  client->Send("in\r\npw\r\nshow version\r\nsh");
  client->Send("ow version\r\n\r\n");
  std::string expected = "\xff\xfd\x18" + kBannerAndPrompt +
                         "admin\r\nPassword: \r\nR7>show version\r\nVersion 1\r\nR7>"
                         "show version\r\nVersion 1\r\nR7>\r\nR7>";
  EXPECT_EQ(client->ReadUntil("R7>", 4), expected);
  EXPECT_EQ(service.Counters().loginsSucceeded, 1u);
  EXPECT_EQ(service.Counters().commandsAnswered, 2u);
}

TEST_F(CliServiceTest, ThirdFailedLoginCloses) {
  auto client = Connect();
  for (int attempt = 0; attempt < 3; ++attempt) client->Send("admin\r\nwrong\r\n");
  std::string seen = client->ReadUntil("% Authentication failed\r\n", 3);
  EXPECT_EQ(seen.find("wrong"), std::string::npos) << "a password is never echoed";
  EXPECT_TRUE(client->WaitClosed(2s));
}

TEST_F(CliServiceTest, SessionPastTheLimitGetsOneLineAndIsClosed) {
  std::vector<std::unique_ptr<LoopbackClient>> clients;
  for (int i = 0; i < 3; ++i) clients.push_back(LoggedIn());
  auto refused = Connect();
  EXPECT_EQ(refused->ReadUntil("\n"), kCliSessionLimitLine);
  EXPECT_TRUE(refused->WaitClosed(2s));
  clients.front()->Send("show version\r\n");
  EXPECT_EQ(clients.front()->ReadUntil("R7>"), "show version\r\nVersion 1\r\nR7>");
  clients.pop_back();  // a place is free again once the server has seen the close
  bool admitted = false;
  for (int attempt = 0; attempt < 20 && !admitted; ++attempt)
    admitted = Connect()->ReadUntil("\xff\xfd\x18", 1, 200ms) == "\xff\xfd\x18";
  EXPECT_TRUE(admitted);
}

TEST_F(CliServiceTest, IdleSessionsCloseAndStopClosesTheRest) {
  auto idle = LoggedIn();
  host.SetCliReply("touch", 5, Answer{"timeout", "1"});
  idle->Send("touch\r\n");
  idle->ReadUntil("R7>");
  auto start = Clock::now();
  EXPECT_TRUE(idle->WaitClosed(3s));
  EXPECT_GE(Clock::now() - start, 900ms);
  auto open = LoggedIn();
  EXPECT_TRUE(service.StopAgent(kAddress, kPort, false));
  EXPECT_TRUE(open->WaitClosed(2s));
  EXPECT_FALSE(service.StopAgent(kAddress, kPort, false));
  EXPECT_EQ(status,
            (std::vector<std::string>{"Cli Agent Started at Port : " + std::to_string(kPort) +
                                          " and at IPAddress : " + kAddress,
                                      "Cli Agent Stopped at Port : " + std::to_string(kPort) +
                                          " and at IPAddress : " + kAddress}));
}

}  // namespace
}  // namespace tessel
