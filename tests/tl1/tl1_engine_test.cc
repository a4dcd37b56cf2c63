#include "tl1/tl1_engine.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

#include "base/log.h"
#include "support/memory_host.h"
#include "tl1/noon.h"

namespace tessel {
namespace {

using Answer = std::vector<std::optional<std::string>>;
constexpr auto kAck = Tl1OutputKind::kAcknowledgment;
constexpr auto kResponse = Tl1OutputKind::kResponse;

// A response of NE1 at the fixed time: identification, then the lines as they are written.
Tl1Output Response(const std::string& ctag, const std::string& word,
                   const std::string& lines = "") {
  return {"\r\n\n   NE1 24-06-30 12:00:00\r\nM  " + ctag + " " + word + lines + "\r\n;", kResponse};
}

struct Tl1EngineTest : ::testing::Test {
  Tl1EngineTest() {
    for (const char* code : {"RTRV-HDR", "RTRV-ALM", "ENT-EQPT", "ACT-USER", "CANC-USER"}) {
      registry.RegisterCmd(code);
    }
  }
  Tl1EngineResult Run(const std::string& message) { return engine.TL1Engine(message, session); }

  MemoryHost host;
  Tl1CommandRegistry registry;
  Tl1PendingList pending{[] { return std::time_t{1718000000}; }};
  Tl1Engine engine{&registry, &pending, &host, Noon};
  Tl1Agent agent{7, "NE1", "127.0.1.9", 3083, "", "", "mode"};
  Tl1SessionContext session{(7ull << 32) | 1, &agent, false, false};
};

TEST_F(Tl1EngineTest, MessagesAnswerAsTheHostAndTheParserDecide) {
  host.SetTl1Reply("RTRV-HDR", {0, Answer{"1"}});
  host.SetTl1Reply("ENT-EQPT", {6, Answer{"1"}});
  host.SetTl1Reply("RTRV-ALM-ALL",
                   {1, Answer{"1", "0 {AID}:CR,{CTAG}", "1 ALARMS", "2 note", "9 x"}});
  struct Case {
    std::string message;
    std::vector<Tl1Output> expected;
  } cases[] = {
      {"\r\n\r\n", {}},
      {"RTRV-HDR:::1", {{"NA 0\r\n<", kAck}}},
      {"RTRV-HDR:::1\x18;", {{"OK 0\r\n<", kAck}}},
      {"\r\nRTRV-HDR:::1;\r\n", {Response("1", "COMPLD")}},
      {"RTRV-HDR:::;", {Response("0", "DENY", "\r\n   IICM\r\n   \"INVALID COMMAND\"")}},
      {"RTRV-HDR:::ABCDEFG;",
       {Response("0", "DENY", "\r\n   IICT\r\n   \"INVALID CORRELATION TAG\"")}},
      {"RTRV-HDR:::9:DATE=10-13-01;",
       {Response("9", "DENY", "\r\n   AIDT\r\n   \"INVALID DATE TIME\"")}},
      {"RTRV-XYZ:::2;", {Response("2", "DENY", "\r\n   SCNF\r\n   \"COMMAND NOT FOUND\"")}},
      {"RTRV-HDR:NE2::3;",
       {Response("3", "DENY", "\r\n   IITA\r\n   \"INVALID TARGET IDENTIFIER\"")}},
      {"ENT-EQPT:NE1:SLOT-1:4;", {{"NG 4\r\n<", kAck}}},
      {"RTRV-ALM-ALL:NE1:ALL:5;",
       {{"IP 5\r\n<", kAck},
        Response("5", "COMPLD", "\r\n   \"{AID}:CR,5\"\r\n   ALARMS\r\n   /*note*/\r\n   \"x\"")}},
      {"ACT-USER:NE1:admin:6::pw;", {Response("6", "DENY")}},  // the host answers null
  };
  for (const Case& row : cases) {
    SCOPED_TRACE(row.message);
    EXPECT_EQ(Run(row.message).outputs, row.expected);
  }
  // Only the commands that passed every check reached the host, and the acknowledged NG did not.
  std::vector<Tl1HostQuery> queries = host.Tl1Queries();
  ASSERT_EQ(queries.size(), 3u);
  EXPECT_EQ(queries[1].verb, "RTRV");
  EXPECT_EQ(queries[1].modifier1, "ALM");
  EXPECT_EQ(queries[1].modifier2, "ALL");
  EXPECT_EQ(queries[1].aidText, "ALL");
  EXPECT_EQ(queries[0].parameters, std::nullopt);
  EXPECT_EQ(queries[2].parameters, (Answer{"pw"}));
}

TEST_F(Tl1EngineTest, HostErrorCodesBecomeDenyResponses) {
  struct Case {
    Answer answer;
    std::string lines;
  } cases[] = {
      {{"ErrorCode", "IIAC"}, "\r\n   IIAC\r\n   \"INVALID ACCESS IDENTIFIER\""},
      {{"ErrorCode", "IIDT"}, "\r\n   IIDT\r\n   \"INVALID DATA PARAMETER\""},
      {{"ErrorCode", "IISP"}, "\r\n   IISP\r\n   \"INVALID SYNTAX OR PUNCTUATION\""},
      {{"ErrorCode", "IITA"}, "\r\n   IITA\r\n   \"INVALID TARGET IDENTIFIER\""},
      {{"ErrorCode", "IENE", "SPECIFIED OBJECT ENTITY DOES NOT EXIST"},
       "\r\n   IENE\r\n   \"SPECIFIED OBJECT ENTITY DOES NOT EXIST\""},
      {{"ErrorCode", "XY"}, "\r\n   XY"},
      {{"ErrorCode", ""}, ""},
      {{"ErrorCode"}, ""},
      {{"7", "0 x"}, ""},
      {{std::nullopt}, ""},
  };
  for (const Case& row : cases) {
    host.SetTl1Reply("ENT-EQPT", {0, row.answer});
    EXPECT_EQ(Run("ENT-EQPT::S-1:8::A,,(3);").outputs,
              (std::vector<Tl1Output>{Response("8", "DENY", row.lines)}))
        << row.lines;
  }
  host.SetTl1Reply("ENT-EQPT", {0, Answer{"3"}});
  EXPECT_EQ(Run("ENT-EQPT::S-1:8;").outputs, (std::vector<Tl1Output>{Response("8", "PRTL")}));

  Tl1HostQuery query = host.Tl1Queries().front();
  EXPECT_EQ(query.parameters, (Answer{"A", std::nullopt, "3"}));
  EXPECT_EQ(query.agentId, 7);
  EXPECT_EQ(query.agentAddress, "127.0.1.9");
  EXPECT_EQ(query.agentPort, 3083);
  EXPECT_EQ(query.hostText1, std::nullopt);  // null unless both texts are set
  EXPECT_EQ(query.hostText3, "mode");
  agent.hostText1 = "db";
  agent.hostText2 = "table";
  Run("ENT-EQPT::S-1:8;");
  EXPECT_EQ(host.Tl1Queries().back().hostText1, "db");
  EXPECT_EQ(host.Tl1Queries().back().hostText2, "table");
}

TEST_F(Tl1EngineTest, LoginGuardsEveryCommandButActUser) {
  session.loginRequired = true;
  host.SetTl1Reply("RTRV-HDR", {0, Answer{"1"}});
  host.SetTl1Reply("ACT-USER",
                   {0, Answer{"ErrorCode", "PIUI", "PRIVILEGE, ILLEGAL USER IDENTITY"}});
  host.SetTl1Reply("CANC-USER", {0, Answer{"1"}});
  Tl1EngineResult result = Run("RTRV-HDR:::1;");
  EXPECT_EQ(
      result.outputs,
      (std::vector<Tl1Output>{Response("1", "DENY", "\r\n   PLNA\r\n   \"LOGIN NOT ACTIVE\"")}));
  EXPECT_TRUE(host.Tl1Queries().empty());
  EXPECT_FALSE(Run("ACT-USER:NE1:admin:2::wrong;").loggedIn);

  host.SetTl1Reply("ACT-USER", {0, Answer{"1"}});
  result = Run("ACT-USER:NE1:admin:3::admin;");
  EXPECT_TRUE(result.loggedIn);
  EXPECT_FALSE(result.closeSession);
  session.loggedIn = true;
  EXPECT_EQ(Run("RTRV-HDR:::4;").outputs, (std::vector<Tl1Output>{Response("4", "COMPLD")}));

  result = Run("CANC-USER:NE1:admin:5;");
  EXPECT_EQ(result.outputs, (std::vector<Tl1Output>{Response("5", "COMPLD")}));
  EXPECT_TRUE(result.closeSession);
  EXPECT_FALSE(result.loggedIn);
}

TEST_F(Tl1EngineTest, DelayedCommandsWaitAndRunLater) {
  host.SetTl1Reply("ENT-EQPT", {0, Answer{"1", "1 done {CTAG}"}});
  EXPECT_EQ(Run("ENT-EQPT:NE1:A:1:ON=5;").outputs,
            (std::vector<Tl1Output>{Response("1", "DELAY")}));
  EXPECT_EQ(
      Run("ENT-EQPT:NE1:A:2:ON=5;").outputs,
      (std::vector<Tl1Output>{Response("2", "DENY", "\r\n   SAAS\r\n   \"ALREADY ASSIGNED\"")}));
  EXPECT_TRUE(host.Tl1Queries().empty());
  std::vector<Tl1PendingEntry> entries = pending.List();
  ASSERT_EQ(entries.size(), 1u);
  EXPECT_EQ(entries[0].commandText, "ENT-EQPT:NE1:A:1:ON=5");
  EXPECT_EQ(entries[0].sessionId, session.sessionId);
  EXPECT_EQ(engine.ExecuteCommand(pending.Take(entries[0].id)->command, session).outputs,
            (std::vector<Tl1Output>{Response("1", "COMPLD", "\r\n   done 1")}));
}

TEST_F(Tl1EngineTest, TheLogNeverHoldsAnActUserPassword) {
  char path[] = "/tmp/tl1_engine_logXXXXXX";
  int descriptor = mkstemp(path);
  ASSERT_GE(descriptor, 0);
  close(descriptor);
  ASSERT_TRUE(OpenEngineLog({3, path, 0}));
  host.SetTl1Reply("ACT-USER", {0, Answer{"1"}});
  Run("act-user:NE1:admin:1::s3cret;");
  Run("ACT-USER:NE1:admin:2:s3cret;");
  Run("RTRV-HDR:::3::visible;");
  CloseEngineLog();
  OpenEngineLog({0, "", 0});
  std::stringstream log;
  log << std::ifstream(path).rdbuf();
  unlink(path);
  EXPECT_NE(log.str().find("act-user:NE1:admin:1:"), std::string::npos);
  EXPECT_NE(log.str().find("visible"), std::string::npos);
  EXPECT_EQ(log.str().find("s3cret"), std::string::npos);
}

TEST(Tl1CommandRegistryTest, CodesAreUniqueWithoutRegardToCaseAndFallBackToShorterCodes) {
  Tl1CommandRegistry registry;
  EXPECT_TRUE(registry.RegisterCmd("ENT-EQPT"));
  EXPECT_FALSE(registry.RegisterCmd("ent-eqpt"));
  EXPECT_FALSE(registry.RegisterCmd(""));
  for (const char* code : {"rtrv-alm", "RTRV-ALM-ENV", "DLT", "act-user"}) {
    EXPECT_TRUE(registry.RegisterCmd(code));
  }
  EXPECT_EQ(registry.Codes(),
            (std::vector<std::string>{"act-user", "DLT", "ENT-EQPT", "rtrv-alm", "RTRV-ALM-ENV"}));
  struct Case {
    const char* command;
    std::optional<std::string> found;
  } cases[] = {
      {"RTRV-ALM-ALL:::1", "rtrv-alm"}, {"RTRV-ALM-ENV:::1", "RTRV-ALM-ENV"},
      {"RTRV-ALM:::1", "rtrv-alm"},     {"DLT-EQPT-X:::1", "DLT"},
      {"ACT-USER:::1", "act-user"},     {"RTRV-EQPT:::1", std::nullopt},
      {"ENT-EQPT-ALL:::1", "ENT-EQPT"}, {"ENT:::1", std::nullopt},
  };
  for (const Case& row : cases) {
    Tl1InputCmd cmd;
    int errorNumber = 0;
    ASSERT_TRUE(InputCmdParser(&cmd, row.command, &errorNumber));
    EXPECT_EQ(registry.FindTL1Command(cmd), row.found) << row.command;
  }
}

}  // namespace
}  // namespace tessel
