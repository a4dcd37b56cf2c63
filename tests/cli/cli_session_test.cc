#include "cli/cli_session.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "support/memory_host.h"

namespace tessel {
namespace {

using Answer = std::vector<std::optional<std::string>>;
using Kind = LineEditor::Masking;

struct Step {
  std::string line;
  std::string text;  // what the session sends back
  std::int32_t mode;
  bool close = false;
};

struct CliSessionTest : ::testing::Test {
  CliSessionTest() {
    CliAgent agent;
    agent.userName = "admin";
    agent.password = "pw";
    agent.enablePassword = "secret";
    agent.enableByTelnet = true;
    agent.ipAddress = "127.0.0.1";
    agent.port = 2323;
    agent.hostText1 = "routers";
    agent.deviceName = "R7";
    agentId = agents.Register(agent);
    host.SetCliReply("enable", 5, Answer{"level", "6"});
    host.SetCliReply("configure terminal", 6, Answer{"level", "7"});
    host.SetCliReply("interface Gi0/1", 7,
                     Answer{"level", "9", "context", "interface GigabitEthernet0/1"});
    host.SetCliReply("exit", 9, Answer{"level", "7"});
    host.SetCliReply("exit", 6, Answer{"level", "8"});
    host.SetCliReply("show version", 5, Answer{"response", "Version 1\nup\n"});
    host.SetCliReply("hostname R9", 7, Answer{"devicename", "R9"});
  }
  CliSession Session(bool loggedIn = false) {
    return CliSession({&agents, &prompts, &host,
                       [] {
                         return std::vector<std::string>{"a", "b"};
                       }},
                      agentId, loggedIn);
  }
  // Runs the steps in order on one session.
  void Run(CliSession& session, const std::vector<Step>& steps) {
    for (const Step& step : steps) {
      CliAnswer answer = session.Line(step.line);
      EXPECT_EQ(answer.text, step.text) << step.line;
      EXPECT_EQ(session.Mode(), step.mode) << step.line;
      EXPECT_EQ(answer.close, step.close) << step.line;
    }
  }
  void LogIn(CliSession& session) {
    session.Line("admin");
    ASSERT_TRUE(session.Line("pw").loggedIn);
  }

  MemoryHost host;
  CliAgents agents;
  CliPrompts prompts;
  std::uint32_t agentId = 0;
};

const std::string kFailed = "% Authentication failed\r\n";

TEST_F(CliSessionTest, LoginDialogue) {
  CliSession session = Session();
  EXPECT_EQ(session.Open(), std::string(kCliBanner) + "\r\nUsername: ");
  Run(session, {{"", "Username: ", 0},
                {"admin", "Password: ", 1},
                {"wrong", kFailed + "\r\nUsername: ", 0},
                {"Admin", "Password: ", 1},
                {"pw", kFailed + "\r\nUsername: ", 0},
                {"admin", "Password: ", 1},
                {"pw", "R7>", 5}});
  EXPECT_EQ(session.Masking(), Kind::kNone);
  CliSession failing = Session();
  Run(failing, {{"admin", "Password: ", 1}, {"", kFailed + "\r\nUsername: ", 0}});
  EXPECT_EQ(failing.Masking(), Kind::kNone);
  failing.Line("admin");
  EXPECT_EQ(failing.Masking(), Kind::kHidden);
  Run(failing,
      {{"x", kFailed + "\r\nUsername: ", 0}, {"admin", "Password: ", 1}, {"y", kFailed, 0, true}});
  EXPECT_EQ(Session(true).Open(), "R7>") << "over SSH the session starts logged in";
  // Nothing in the banner reads as a prompt or a question for credentials.
  for (const char* forbidden : {"ser", "ogin", "assword", ">\r", "#\r"})
    EXPECT_EQ(std::string(kCliBanner).find(forbidden), std::string::npos) << forbidden;
}

TEST_F(CliSessionTest, EnableSecretAndModes) {
  CliSession session = Session();
  LogIn(session);
  Run(session, {{"  show version ", "Version 1\r\nup\r\nR7>", 5}, {"enable", "Password: ", 2}});
  EXPECT_EQ(session.Masking(), Kind::kStars);
  Run(session, {{"x", "Password: ", 2},
                {"y", "Password: ", 2},
                {"z", "% Bad Secrets\r\nR7>", 5},
                {"enable", "Password: ", 2},
                {"secret", "R7#", 6},
                {"configure terminal", "R7(config)#", 7},
                {"interface Gi0/1", "R7(config-if)#", 9}});
  EXPECT_EQ(session.Context(), "interface GigabitEthernet0/1");
  EXPECT_EQ(host.CliQueries().back().context, "") << "the line is asked with the old context";
  Run(session, {{"   ", "R7(config-if)#", 9}, {"exit", "R7(config)#", 7}});
  EXPECT_EQ(session.Context(), "") << "cleared at mode 7";
  session.Line("interface Gi0/1");
  EXPECT_EQ(session.Suspend().text, "R7#");
  EXPECT_EQ(session.Context(), "");
  EXPECT_EQ(session.Suspend().text, "R7#") << "Ctrl-Z outside configuration changes nothing";
  Run(session, {{"configure terminal", "R7(config)#", 7}, {"hostname R9", "R9(config)#", 7}});
  EXPECT_EQ(Session(true).Open(), "R9>") << "the device name is the agent's";
  session.Suspend();
  Run(session, {{"exit", "", 8, true}});
  agents.Update(agentId, [](CliAgent& agent) { agent.enableByTelnet = false; });
  CliSession direct = Session(true);
  Run(direct, {{"enable", "R9#", 6}});
}

TEST_F(CliSessionTest, HostReplyKeys) {
  CliSession session = Session();
  LogIn(session);
  host.SetCliReply("keys", 5,
                   Answer{"historysize", "12", "history", "", "timeout", "60", "password", "new",
                          "enablepassword", "s2:0", "odd", "text", std::nullopt, std::nullopt,
                          "update", "ignored", "telnet", "ignored"});
  CliAnswer answer = session.Line("keys");
  EXPECT_EQ(answer.text, "a\r\nb\r\ntext\r\nR7>");
  EXPECT_EQ(answer.historySize, std::optional<std::size_t>{12});
  CliAgent agent = *agents.Find(agentId);
  EXPECT_EQ(agent.keepAliveSeconds, 60u);
  EXPECT_EQ(agent.password, "new");
  EXPECT_EQ(agent.enablePassword, "s2");
  EXPECT_FALSE(agent.enableByTelnet);
  EXPECT_EQ(session.Line("unknown to the host").text, "R7>") << "a null reply";
  CliHostQuery query = host.CliQueries().back();
  EXPECT_EQ(query.line, "unknown to the host");
  EXPECT_EQ(query.hostText1, "routers");
  EXPECT_EQ(query.ipAddress, "127.0.0.1");
  EXPECT_EQ(query.port, 2323);
  host.SetCliHelp("sh ", "show  Show running system information\n");
  host.SetCliCompletion("sh", "show");
  CliAnswer help = session.Help("sh ");
  EXPECT_EQ(help.text, "\r\nshow  Show running system information\r\nR7>");
  EXPECT_TRUE(help.showLine);
  EXPECT_EQ(session.Complete("sh").line, std::optional<std::string>{"show"});
  EXPECT_EQ(session.Complete("xyz").line, std::nullopt);
  CliSession notLoggedIn = Session();
  notLoggedIn.Line("admin");
  EXPECT_EQ(notLoggedIn.Help("sh ").text, "\r\nPassword: ") << "no host call before login";
}

TEST(CliSessionModes, LevelRules) {
  struct Rule {
    std::int32_t current, value;
    bool enableByTelnet;
    std::int32_t next;
  };
  for (Rule rule : {Rule{6, 7, false, 7},
                    {7, 5, false, 5},
                    {9, 4, false, 9},
                    {23, 6, false, 6},
                    {5, 6, true, 2},
                    {5, 6, false, 6},
                    {5, 8, false, 8},
                    {5, 16, false, 16},
                    {5, 7, false, 5},
                    {5, 15, false, 5},
                    {0, 6, false, 0},
                    {2, 6, false, 2}}) {
    EXPECT_EQ(CliSession::NextMode(rule.current, rule.value, rule.enableByTelnet), rule.next)
        << rule.current << " " << rule.value;
  }
}

TEST(CliSessionModes, PromptsAndUserAddedModes) {
  CliPrompts prompts;
  auto dir = std::filesystem::temp_directory_path() / ("cli_modes_" + std::to_string(getpid()));
  std::filesystem::create_directories(dir / "conf");
  std::ofstream(dir / "conf/IosModes.prop") << "# modes\nlow=15\nbgp=20\r\nisis=17\nnonsense\n";
  std::ofstream(dir / "conf/IosPrompts.prop") << "#\nbgp=(config-bgp)#;rest\nisis=(config-isis)#\n";
  EXPECT_TRUE(prompts.ReadUserModes(dir.string() + "/"));
  std::filesystem::remove_all(dir);
  EXPECT_FALSE(prompts.ReadUserModes(dir.string() + "/")) << "missing files";
  const std::pair<std::int32_t, std::string> expected[] = {{0, "Username: "},
                                                           {1, "Password: "},
                                                           {2, "Password: "},
                                                           {5, "R1>"},
                                                           {6, "R1#"},
                                                           {7, "R1(config)#"},
                                                           {9, "R1(config-if)#"},
                                                           {10, "R1(config-router)#"},
                                                           {15, "R1(config-router)#"},
                                                           {11, "R1(config-line)#"},
                                                           {12, "R1(config-vlan)#"},
                                                           {20, "R1(config-bgp)#"},
                                                           {17, "R1(config-isis)#"},
                                                           {23, "[R1@R1 R1]$ "},
                                                           {18, "R1#"}};
  for (const auto& [mode, prompt] : expected) EXPECT_EQ(prompts.Prompt(mode, "R1"), prompt) << mode;
  prompts.SetOverride("custom>");
  EXPECT_EQ(prompts.Prompt(20, "R1"), "custom>");
  EXPECT_EQ(prompts.Prompt(5, "R1"), "R1>") << "the override is for user-added modes";
  prompts.SetPromptString("$devicename-cli>");
  EXPECT_EQ(prompts.Prompt(5, "R1"), "R1-cli>");
  prompts.SetPromptString("plain$ ");
  EXPECT_EQ(prompts.Prompt(5, "R1"), "plain$ ");
  EXPECT_EQ(prompts.Prompt(23, "R1"), "plain$ ");
}

}  // namespace
}  // namespace tessel
