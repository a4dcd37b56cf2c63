#include "cli/cli_service.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <mutex>

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

// A client that names its terminal, answered up to the login prompt.
void Negotiate(LoopbackClient& client) {
  EXPECT_EQ(client.ReadUntil("\xff\xfd\x18"), "\xff\xfd\x18");
  client.Send("\xff\xfb\x18");
  EXPECT_EQ(client.ReadUntil("\xff\xf0"), "\xff\xfa\x18\x01\xff\xf0");
  client.Send("\xff\xfa\x18\x00XTERM\xff\xf0"s);
  EXPECT_EQ(client.ReadUntil("Username: "), "\xff\xfb\x03\xff\xfb\x01" + kBannerAndPrompt);
  client.Send("\xff\xfd\x03\xff\xfd\x01");  // the server's echo accepted
}

TEST_F(CliServiceTest, TelnetOpeningNeverHoldsAnotherClient) {
  auto start = Clock::now();
  auto silent = Connect();
  auto negotiating = Connect();
  Negotiate(*negotiating);
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

TEST_F(CliServiceTest, NegotiatedSessionDrawsKeysAsksTheHostAndHidesSecretsTypedAhead) {
  host.SetCliReply("enable", 5, Answer{"level", "6"});
  host.SetCliCompletion("sh", "show");
  host.SetCliHelp("show ", "version  System status\n");
  service.Agents().Update(service.Agents().FindAt(kAddress, kPort)->id, [](CliAgent& agent) {
    agent.enablePassword = "en";
    agent.enableByTelnet = true;
  });
  auto client = Connect();
  Negotiate(*client);
  client->Send("admin\rpw\r");
  EXPECT_EQ(client->ReadUntil("R7>"), "admin\r\nPassword: \r\nR7>");
  client->Send("sh\t");
  EXPECT_EQ(client->ReadUntil("show"), "show");
  client->Send(" ?");
  EXPECT_EQ(client->ReadUntil("R7>show "), " ?\r\nversion  System status\r\nR7>show ");
  client->Send(
      "\x15"
      "enable\ren\r");  // Ctrl-U, then the secret typed before it is asked for
  EXPECT_EQ(client->ReadUntil("R7#"), "\x1b[5D\x1b[0Kenable\r\nPassword: **\r\nR7#");
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

// Stands in for the SSH server: the test plays its part, accepting an authenticated session
// and handing on its bytes, and reads what the service sends.
class FakeSshServer final : public StreamServer {
 public:
  bool Listen(std::uint32_t tag, const std::string&, std::uint16_t, std::uint32_t, int*) override {
    tags.push_back(tag);
    return true;
  }
  void CloseListeners(std::uint32_t) override {}
  bool Send(TcpSessionId, std::string bytes) override {
    std::lock_guard<std::mutex> lock(mutex_);
    sent_ += bytes;
    arrived_.notify_all();
    return true;
  }
  void Close(TcpSessionId, bool) override {}
  std::vector<TcpSessionId> SessionsOf(std::uint32_t) const override { return {}; }
  std::size_t SessionCount() const override { return 0; }
  void Stop() override {}
  // What was sent up to the end of until, waiting at most two seconds for it.
  std::string ReadUntil(const std::string& until) {
    std::unique_lock<std::mutex> lock(mutex_);
    arrived_.wait_for(lock, 2s, [&] { return sent_.find(until) != std::string::npos; });
    std::size_t end = sent_.find(until);
    end = end == std::string::npos ? sent_.size() : end + until.size();
    std::string head = sent_.substr(0, end);
    sent_.erase(0, end);
    return head;
  }
  std::vector<std::uint32_t> tags;

 private:
  std::mutex mutex_;
  std::condition_variable arrived_;
  std::string sent_;
};

TEST(CliServiceSsh, SessionsOfThePluggedInServerStartLoggedIn) {
  MemoryHost host;
  host.SetCliReply("show version", 5, Answer{"response", "Version 1\n"});
  FakeSshServer* ssh = nullptr;
  TcpSessionEvents* events = nullptr;
  CliPasswordCheck check;
  std::string keys;
  CliServiceOptions options;
  options.host = &host;
  options.status = [](const std::string&) {};
  options.sshServer = [&](TcpSessionEvents* to, CliPasswordCheck checker, const std::string& dir) {
    auto server = std::make_unique<FakeSshServer>();
    ssh = server.get();
    events = to;
    check = std::move(checker);
    keys = dir;
    return server;
  };
  CliService service(std::move(options));
  std::uint32_t tag =
      service.RegisterAgent({0, "admin", "pw", "", false, kAddress, kPort, "", "", "", "", "R7"});
  service.SetSshKeyDirectory("/state/keys");
  service.SetSshEnabled(false);
  EXPECT_FALSE(service.StartSshListener(kAddress, kPort + 2, kPort));
  service.SetSshEnabled(true);
  ASSERT_TRUE(service.StartSshListener(kAddress, kPort + 2, kPort));
  EXPECT_EQ(ssh->tags, std::vector<std::uint32_t>{tag});
  EXPECT_EQ(keys, "/state/keys");
  EXPECT_TRUE(check(tag, "admin", "pw"));
  EXPECT_FALSE(check(tag, "admin", "pw2"));
  EXPECT_FALSE(check(tag + 1, "admin", "pw"));
  TcpSessionId id = MakeTcpSessionId(tag, kSshClientBit | 1);
  events->OnAccepted(id, tag, {});
  EXPECT_EQ(ssh->ReadUntil("R7>"), "R7>");
  events->OnBytes(id, "show version\r");
  EXPECT_EQ(ssh->ReadUntil("R7>"), "show version\r\nVersion 1\r\nR7>");
  EXPECT_EQ(service.Counters().loginsSucceeded, 1u);
  events->OnClosed(id);
}

}  // namespace
}  // namespace tessel
