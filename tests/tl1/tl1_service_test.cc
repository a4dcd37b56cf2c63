#include "tl1/tl1_service.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <thread>

#include "support/loopback_client.h"
#include "support/memory_host.h"
#include "tl1/noon.h"

namespace tessel {
namespace {

using namespace std::chrono_literals;
using Answer = std::vector<std::optional<std::string>>;

// Ports of this suite: per process, so that runs on one machine at the same time do not meet.
const std::uint16_t kPort = static_cast<std::uint16_t>(20000 + (::getpid() % 900) * 10);
const std::uint16_t kTelnetPort = kPort + 1;
const std::uint16_t kOtherPort = kPort + 2;
const std::string kAddress = "127.87.0.1";
constexpr std::int32_t kAgentId = 7;
constexpr const char* kPrompt = "\r\nTL1>>";

std::string Response(const std::string& ctag, const std::string& word) {
  return "\r\n\n   NE1 24-06-30 12:00:00\r\nM  " + ctag + " " + word + "\r\n;" + kPrompt;
}

// A loopback client on the agent's address; every read waits at most a few seconds.
struct Client : LoopbackClient {
  explicit Client(std::uint16_t port) : LoopbackClient(kAddress, port) {}
  void Send(const std::string& bytes) { ASSERT_TRUE(LoopbackClient::Send(bytes)); }
};

// A host that takes its time over each response, as a busy one may.
struct SlowHost : MemoryHost {
  HostAnswer Tl1GetResponseBlock(const Tl1HostQuery& query) override {
    std::this_thread::sleep_for(delay.load());
    return MemoryHost::Tl1GetResponseBlock(query);
  }
  std::atomic<std::chrono::milliseconds> delay{0ms};
};

struct Tl1ServiceTest : ::testing::Test {
  Tl1ServiceTest() {
    host.SetTl1Reply("RTRV-HDR", {0, Answer{"1"}});
    host.SetTl1Reply("ENT-EQPT", {0, Answer{"1"}});
    host.SetTl1Reply("ACT-USER", {0, Answer{"1"}});
    host.SetTl1Reply("CANC-USER", {0, Answer{"1"}});
    Start();
  }
  void Start() {
    for (const char* code : {"RTRV-HDR", "ENT-EQPT", "ACT-USER", "CANC-USER"})
      service.Registry().RegisterCmd(code);
    service.RegisterAgent({kAgentId, "NE1", kAddress, kPort, "", "", "mode"}, 0);
    ASSERT_TRUE(service.StartAgent(kAddress, kPort));
  }
  std::uint32_t Alarm(std::uint8_t code, const std::string& verb, const std::string& line) {
    return service.SendAutonomous(kAgentId, {{code, verb, "ALM", std::nullopt, {{2, line}}}});
  }

  SlowHost host;
  std::vector<std::string> status;
  Tl1Service service{{&host,
                      Noon,
                      [] { return std::time(nullptr); },
                      5,
                      {},
                      [this](const std::string& line) { status.push_back(line); }}};
};

TEST_F(Tl1ServiceTest, RawStreamIsCutAtTerminatorsAndEveryAnswerEndsWithThePrompt) {
  EXPECT_EQ(status,
            std::vector<std::string>{"TL1 Agent started at Port : " + std::to_string(kPort) +
                                     ", IpAddress : " + kAddress + " "});
  Client client(kPort);
  ASSERT_TRUE(client.Connected());
  client.Send("RTRV-H");
  std::this_thread::sleep_for(50ms);
  client.Send("DR:::1;");
  EXPECT_EQ(client.ReadUntil(kPrompt), Response("1", "COMPLD"));
  // Two commands, the second split off with a quoted ';' inside.
  client.Send("RTRV-HDR:::2;ENT-EQPT:::3::\"a;b\";RTRV-HDR:::4;");
  EXPECT_EQ(client.ReadUntil(kPrompt, 3),
            Response("2", "COMPLD") + Response("3", "COMPLD") + Response("4", "COMPLD"));
  // Past the limit without a terminator: NA, the rest of the read dropped, the session goes on.
  client.Send(std::string(Tl1SessionInput::kMessageLimit + 1, 'X') + "RTRV-HDR:::5;");
  EXPECT_EQ(client.ReadUntil(kPrompt), std::string("NA 0\r\n<") + kPrompt);
  client.Send("RTRV-HDR:::6;");
  EXPECT_EQ(client.ReadUntil(kPrompt), Response("6", "COMPLD"));
  EXPECT_EQ(service.Counters().commandsAnswered, 6u);
  EXPECT_EQ(service.Counters().sessionsOpen, 1u);
  // A listener that cannot open is reported and its agent forgotten.
  service.RegisterAgent({9, "NE3", "127.87.0.1.1", kOtherPort, "", "", ""}, 0);
  EXPECT_FALSE(service.StartAgent("127.87.0.1.1", kOtherPort));
  EXPECT_EQ(status.back(), "Unable to start TL1 Agent at Port :" + std::to_string(kOtherPort) +
                               " and at IpAddress : 127.87.0.1.1");
  EXPECT_FALSE(service.AgentIdAt("127.87.0.1.1", kOtherPort));
}

TEST_F(Tl1ServiceTest, AClientThatEndsItsInputAfterItsCommandsIsAnsweredThenClosed) {
  host.delay = 200ms;
  Client client(kPort);
  client.Send("RTRV-HDR:::1;RTRV-HDR:::2;");
  client.EndOutput();
  EXPECT_EQ(client.ReadUntil(kPrompt, 2), Response("1", "COMPLD") + Response("2", "COMPLD"));
  EXPECT_TRUE(client.WaitClosed(3s));
}

TEST_F(Tl1ServiceTest, AutonomousMessagesTakeConsecutiveAtagsInSeverityOrder) {
  EXPECT_EQ(Alarm(0, "REPT", "x"), 0u) << "no client: refused";
  Client first(kPort);
  Client second(kPort);
  first.Send("RTRV-HDR:::1;");  // both sessions are known once each has been answered
  second.Send("RTRV-HDR:::1;");
  first.ReadUntil(kPrompt);
  second.ReadUntil(kPrompt);
  ASSERT_TRUE(service.SetAtag(kAgentId, 100));
  // Queued together: the critical one leaves first, the non-alarms keep their order.
  EXPECT_EQ(service.SendAutonomous(kAgentId, {{3, "REPT", "EVT", std::nullopt, {{2, "one"}}},
                                              {3, "REPT", "EVT", std::nullopt, {{2, "two"}}},
                                              {0, "REPT", "ALM", "EQPT", {{2, "crit"}}}}),
            2u);
  std::string toFirst = first.ReadUntil(kPrompt, 3);
  std::string toSecond = second.ReadUntil(kPrompt, 3);
  auto order = [](const std::string& text) {
    return std::vector<std::size_t>{text.find("*C 104 REPT ALM EQPT"), text.find("A  100 REPT EVT"),
                                    text.find("A  102 REPT EVT")};
  };
  auto ordered = [](std::vector<std::size_t> at) {
    return at[0] < at[1] && at[1] < at[2] && at[2] != std::string::npos;
  };
  EXPECT_TRUE(ordered(order(toFirst))) << toFirst;
  EXPECT_NE(toFirst.find("\r\n   \"one\"\r\n;\r\nTL1>>"), std::string::npos) << toFirst;
  EXPECT_TRUE(ordered({toSecond.find("*C 105 REPT ALM EQPT"), toSecond.find("A  101 REPT EVT"),
                       toSecond.find("A  103 REPT EVT")}))
      << toSecond;
  // An identification ending in CANC closes the session after the message; CANC before a
  // modifier does not.
  Alarm(3, "CANC", "still");
  EXPECT_NE(first.ReadUntil(kPrompt).find("CANC ALM"), std::string::npos);
  EXPECT_EQ(service.SendAutonomous(kAgentId, {{3, "REPT", "SESS", "CANC", {}}}), 2u);
  EXPECT_TRUE(first.WaitClosed(3s));
  EXPECT_TRUE(second.WaitClosed(3s));
}

TEST_F(Tl1ServiceTest, LoginIsRequiredBeforeCommandsAndCancUserCloses) {
  service.SetLoginRequired(kAgentId, true);
  Client client(kPort);
  client.Send("RTRV-HDR:::1;");
  EXPECT_NE(client.ReadUntil(kPrompt).find("M  1 DENY\r\n   PLNA"), std::string::npos);
  client.Send("ACT-USER::admin:2::secret;RTRV-HDR:::3;");
  EXPECT_EQ(client.ReadUntil(kPrompt, 2), Response("2", "COMPLD") + Response("3", "COMPLD"));
  EXPECT_TRUE(host.Tl1Queries().size() >= 2);
  client.Send("CANC-USER::admin:4;");
  EXPECT_EQ(client.ReadUntil(kPrompt), Response("4", "COMPLD"));
  EXPECT_TRUE(client.WaitClosed(3s));
}

TEST_F(Tl1ServiceTest, KeepAliveClosesSilentSessionsOnlyWhenSet) {
  Client never(kPort);  // opened with keep-alive 0
  service.SetKeepAlive(1);
  service.RegisterAgent({8, "NE2", kAddress, kOtherPort, "", "", ""}, 0);
  ASSERT_TRUE(service.StartAgent(kAddress, kOtherPort));
  Client silent(kOtherPort);
  ASSERT_TRUE(silent.Connected());
  auto opened = std::chrono::steady_clock::now();
  EXPECT_TRUE(silent.WaitClosed(3s));
  EXPECT_GE(std::chrono::steady_clock::now() - opened, 900ms);
  never.Send("RTRV-HDR:::1;");
  EXPECT_EQ(never.ReadUntil(kPrompt), Response("1", "COMPLD"));
}

TEST_F(Tl1ServiceTest, DelayedCommandsRunOnTheirSessionAndNumberingRestarts) {
  Client client(kPort);
  std::time_t soon = std::time(nullptr) + 2;
  std::tm local{};
  localtime_r(&soon, &local);
  char time[32];
  std::snprintf(time, sizeof time, "TIME=%d-%d-%d", local.tm_hour, local.tm_min, local.tm_sec);
  client.Send("ENT-EQPT:::1:" + std::string(time) + ";");
  EXPECT_EQ(client.ReadUntil(kPrompt), Response("1", "DELAY"));
  EXPECT_EQ(service.ListPending(kAgentId).size(), 1u);
  EXPECT_EQ(client.ReadUntil(kPrompt, 1, 4s), Response("1", "COMPLD"));
  EXPECT_TRUE(service.ListPending(kAgentId).empty());

  client.Send("ENT-EQPT:::2:ON=5;ENT-EQPT:::3:ON=5;ENT-EQPT:::4:ON=6;");
  std::string answers = client.ReadUntil(kPrompt, 3);
  EXPECT_EQ(answers.substr(0, Response("2", "DELAY").size()), Response("2", "DELAY"));
  EXPECT_NE(answers.find("M  3 DENY\r\n   SAAS"), std::string::npos) << answers;
  std::vector<Tl1PendingEntry> waiting = service.ListPending(kAgentId);
  ASSERT_EQ(waiting.size(), 2u);
  EXPECT_EQ(waiting[0].sessionId, MakeTcpSessionId(kAgentId, 1));
  EXPECT_TRUE(service.ListPending(kAgentId + 1).empty());
  EXPECT_FALSE(service.RunPending(kAgentId + 1, waiting[0].id)) << "another agent's entry";
  EXPECT_TRUE(service.RunPending(kAgentId, waiting[0].id));
  EXPECT_EQ(client.ReadUntil(kPrompt), Response("2", "COMPLD"));
  EXPECT_TRUE(service.CancelPending(kAgentId, waiting[1].id));
  EXPECT_FALSE(service.RunPending(kAgentId, waiting[1].id));

  // The last agent stopped: client numbers start at 1 again.
  Client second(kPort);
  second.Send("RTRV-HDR:::1;");
  second.ReadUntil(kPrompt);
  ASSERT_TRUE(service.StopAgent(kAddress, kPort));
  EXPECT_FALSE(service.StopAgent(kAddress, kPort));
  EXPECT_TRUE(client.WaitClosed(3s));
  Start();
  Client again(kPort);
  again.Send("ENT-EQPT:::7:ON=5;");
  again.ReadUntil(kPrompt);
  waiting = service.ListPending(kAgentId);
  ASSERT_EQ(waiting.size(), 1u);
  EXPECT_EQ(waiting[0].sessionId, MakeTcpSessionId(kAgentId, 1));
}

TEST_F(Tl1ServiceTest, TelnetSessionsEditLinesAndCompleteCommands) {
  ASSERT_TRUE(service.StartTelnetListener(kAddress, kTelnetPort, kAgentId));
  EXPECT_FALSE(service.StartTelnetListener(kAddress, kOtherPort, kAgentId + 1));
  Client client(kTelnetPort);
  EXPECT_EQ(client.ReadUntil("TL1>>"), "\xff\xfb\x01\xff\xfb\x03TL1>>");
  client.Send("\xff\xfd\x01\xff\xfd\x03");  // the client takes both offers
  client.Send("rtrv-h");
  client.Send("\t");
  EXPECT_NE(client.ReadUntil("RTRV-HDR").find("RTRV-HDR"), std::string::npos);
  client.Send(":::1;\r\n");
  EXPECT_NE(client.ReadUntil(":::1;").find(":::1;"), std::string::npos) << "echo";
  EXPECT_EQ(client.ReadUntil(kPrompt), "\r\n" + Response("1", "COMPLD"));
  // A line without ';' is one message all the same.
  client.Send("RTRV-HDR:::2\r\n");
  client.ReadUntil("\r\n");
  EXPECT_EQ(client.ReadUntil(kPrompt), std::string("NA 0\r\n<") + kPrompt);
}

}  // namespace
}  // namespace tessel
