#include "cli/cli_input.h"

#include <gtest/gtest.h>

namespace tessel {
namespace {

using Kind = CliInputEvent::Kind;

// Each key read while an event is answered waits for the answer, so that it is drawn under the
// mode the answer leads to; the opening comes first, once the negotiation is settled.
TEST(CliInputTest, OneEventAtATimeAndKeysTypedAheadWaitForTheAnswer) {
  CliInput input(true);
  EXPECT_EQ(input.Open(), "\xff\xfd\x18");
  EXPECT_EQ(input.Feed("\xff\xfb\x18"), "\xff\xfa\x18\x01\xff\xf0");
  std::string output;
  EXPECT_EQ(input.Next(&output), std::nullopt) << "the terminal type is still to come";
  input.Feed("admin\r");  // typed before the login prompt
  input.GiveUpNegotiation();
  EXPECT_FALSE(input.Negotiated());
  EXPECT_EQ(input.Next(&output), (CliInputEvent{Kind::kOpen, ""}));
  EXPECT_EQ(input.Next(&output), std::nullopt) << "the opening is being answered";
  input.Answered(LineEditor::Masking::kNone, "Username: ");
  EXPECT_EQ(input.Next(&output), (CliInputEvent{Kind::kLine, "admin"}));
  EXPECT_EQ(output, "admin\r\n") << "a line is written back though the client is not negotiated";
  input.Feed("secret\renable\r");
  output.clear();
  EXPECT_EQ(input.Next(&output), std::nullopt);
  EXPECT_EQ(output, "") << "nothing of the password is drawn before its mode is known";
  input.Answered(LineEditor::Masking::kHidden, "Password: ");
  EXPECT_EQ(input.Next(&output), (CliInputEvent{Kind::kLine, "secret"}));
  EXPECT_EQ(output, "\r\n");
  input.Answered(LineEditor::Masking::kNone, "R1>");
  EXPECT_EQ(input.Next(&output), (CliInputEvent{Kind::kLine, "enable"}));
  EXPECT_EQ(input.History(), (std::vector<std::string>{"admin", "enable"})) << "no password";
}

TEST(CliInputTest, SshInputHasNoTelnetLayer) {
  CliInput input(false);
  EXPECT_EQ(input.Open(), "");
  EXPECT_EQ(input.Feed("sh\t"), "");
  std::string output;
  EXPECT_EQ(input.Next(&output), (CliInputEvent{Kind::kOpen, ""}));
  input.Answered(LineEditor::Masking::kNone, "R1>");
  EXPECT_EQ(input.Next(&output), (CliInputEvent{Kind::kComplete, "sh"}));
  EXPECT_EQ(output, "sh") << "an SSH client is drawn for";
  EXPECT_EQ(input.SetLine("show\xff"), "ow\xff") << "with no Telnet escapes";
}

}  // namespace
}  // namespace tessel
