#include "transport/line_editor.h"

#include <gtest/gtest.h>
#include <strings.h>

#include <algorithm>

namespace tessel {
namespace {

const std::string kUp = "\x1b[A", kDown = "\x1b[B", kRight = "\x1b[C", kLeft = "\x1b[D";

// The commands the first word of a prefix starts, letters compared without case.
std::vector<std::string> CompleteCommand(std::string_view prefix) {
  std::string word(prefix.substr(0, prefix.find(' ')));
  std::vector<std::string> matches;
  for (const char* command : {"RTRV-HDR", "RTRV-ALM-ALL", "RTRV-ALM-EQPT", "ACT-USER"})
    if (strncasecmp(command, word.c_str(), word.size()) == 0) matches.push_back(command);
  return matches;
}

struct Typing {
  const char* name;
  std::string keys, output;
  std::vector<std::string> lines;
};

// Each case is typed at once and again one byte per read: how the keys are split must not
// matter.
void ExpectTyping(const std::vector<Typing>& cases, bool echo = true) {
  for (const Typing& typing : cases) {
    for (std::size_t readSize : {typing.keys.size(), std::size_t{1}}) {
      LineEditor editor("TL1>>", CompleteCommand);
      editor.SetEcho(echo);
      LineEditor::Result typed;
      for (std::size_t at = 0; at < typing.keys.size(); at += readSize) {
        LineEditor::Result part = editor.Feed(std::string_view(typing.keys).substr(at, readSize));
        typed.output += part.output;
        typed.lines.insert(typed.lines.end(), part.lines.begin(), part.lines.end());
      }
      std::string how = typing.name + std::string(" in reads of ") + std::to_string(readSize);
      EXPECT_EQ(typed.output, typing.output) << how;
      EXPECT_EQ(typed.lines, typing.lines) << how;
    }
  }
}

// One case a line.
// clang-format off
TEST(LineEditorTest, EditingKeysRedrawTheLine) {
  ExpectTyping({
      {"insert before the cursor", "ac" + kLeft + "b\r", "ac\x1b[Dbc\x1b[D\r\n", {"abc"}},
      {"DEL at the end", "abc\x7f\r", "abc\x1b[D\x1b[0K\r\n", {"ab"}},
      {"BS in the middle", "abc" + kLeft + "\b\r", "abc\x1b[D\x1b[Dc\x1b[0K\x1b[D\r\n", {"ac"}},
      {"home and end", "abc\x01x\x05y\r", "abc\x1b[3Dxabc\x1b[3D\x1b[3Cy\r\n", {"xabcy"}},
      {"right stops at the end", "ab" + kLeft + kRight + kRight + "c\r", "ab\x1b[D\x1b[Cc\r\n",
       {"abc"}},
      {"left and BS stop at the start", "\ba" + kLeft + kLeft + "b\r", "a\x1b[Dba\x1b[D\r\n",
       {"ba"}},
      {"Ctrl-U kills the line", "abc\x15z\r", "abc\x1b[3D\x1b[0Kz\r\n", {"z"}},
      {"delete under the cursor", "abc\x01\x1b[3~\r", "abc\x1b[3Dbc\x1b[0K\x1b[2D\r\n", {"bc"}},
      {"erase to the end", "abc" + kLeft + kLeft + "\x1b[0K\r", "abc\x1b[D\x1b[D\x1b[0K\r\n",
       {"a"}},
      {"cursor keys in ESC O form", "ab\x1bODc\r", "ab\x1b[Dcb\x1b[D\r\n", {"acb"}},
      {"unknown keys and sequences ignored", "a\x1b[5~\x02\x1bxb\r", "ab\r\n", {"ab"}},
      {"CR LF is one line end, LF alone is one", "a\r\nb\n\r", "a\r\nb\r\n\r\n", {"a", "b", ""}},
  });
}

TEST(LineEditorTest, HistoryWalksTheLastLines) {
  ExpectTyping({
      {"up recalls the last, down the typed line", "one\rtwo\rthree\rt" + kUp + kDown + "\r",
       "one\r\ntwo\r\nthree\r\nthree\x1b[4D\x1b[0K\r\n", {"one", "two", "three", "t"}},
      {"up stops at the oldest, only what differs is drawn", "abc\rabd\r" + kUp + kUp + kUp + "\r",
       "abc\r\nabd\r\nabd\x1b[Dc\r\n", {"abc", "abd", "abc"}},
      {"empty lines are not kept", "a\r\r" + kUp + "\r", "a\r\n\r\na\r\n", {"a", "", "a"}},
  });
  LineEditor editor("TL1>>", CompleteCommand);
  for (int i = 0; i <= 40; ++i) editor.Feed("c" + std::to_string(i) + "\r");
  std::string walk;
  for (int up = 1; up <= 41; ++up) {  // c0 was dropped: the oldest kept is c1
    walk += kUp;
    LineEditor replay = editor;
    std::string expected = "c" + std::to_string(std::max(41 - up, 1));
    EXPECT_EQ(replay.Feed(walk + "\r").lines, std::vector<std::string>{expected}) << up;
  }
}

TEST(LineEditorTest, CompletionOfTheFirstWord) {
  ExpectTyping({
      {"a unique match completes", "RTRV-H\t\r", "RTRV-HDR\r\n", {"RTRV-HDR"}},
      {"in the case of the command", "act\t\r", "act\x1b[3DACT-USER\r\n", {"ACT-USER"}},
      {"several: common prefix and list", "RTRV-A?\r",
       "RTRV-A\r\nRTRV-ALM-ALL\r\nRTRV-ALM-EQPT\r\nTL1>>RTRV-ALM-\r\n", {"RTRV-ALM-"}},
      {"an empty line offers all", "\t",
       "\r\nRTRV-HDR\r\nRTRV-ALM-ALL\r\nRTRV-ALM-EQPT\r\nACT-USER\r\nTL1>>", {}},
      {"no match leaves the line", "X?\r", "X\r\n", {"X"}},
      {"no completion after the first word", "RTRV-H x\t?\r", "RTRV-H x\r\n", {"RTRV-H x"}},
  });
}

TEST(LineEditorTest, PasswordFieldOfActUserIsNotShown) {
  ExpectTyping({
      {"typed", "ACT-USER::admin:1::se?cr\x7fxt;\r", "ACT-USER::admin:1::;\r\n",
       {"ACT-USER::admin:1::se?cxt;"}},
      {"any case", "act-user:ne:u:c::pw\r", "act-user:ne:u:c::\r\n", {"act-user:ne:u:c::pw"}},
      {"recalled", "act-user::u:1::pw;\r" + kUp + "\r", "act-user::u:1::;\r\nact-user::u:1::;\r\n",
       {"act-user::u:1::pw;", "act-user::u:1::pw;"}},
      {"a sixth ':' ends the field", "ACT-USER::u:1::p:x\r", "ACT-USER::u:1::x\r\n",
       {"ACT-USER::u:1::p:x"}},
      {"other commands are shown", "ENT-USER::u:1::pw;\r", "ENT-USER::u:1::pw;\r\n",
       {"ENT-USER::u:1::pw;"}},
  });
}

const std::string kLongest(4093, 'a');

TEST(LineEditorTest, LineReachingTheLimitIsDroppedWithItsRest) {
  ExpectTyping({
      {"the longest line", kLongest + "\r", kLongest + "\r\n", {kLongest}},
      {"one more", kLongest + "aa\rx\r", kLongest + "\r\nTL1>>x\r\n", {"x"}},
  });
}

TEST(LineEditorTest, WithoutEchoNothingIsDrawn) {
  ExpectTyping({
      {"keys still edit", "ab\x7fz\x1b[Dx\r\n", "", {"axz"}},
      {"'?' is text and TAB nothing", "RTRV-H\t?\r", "", {"RTRV-H?"}},
      {"a line past the limit still gets the prompt", kLongest + "a\r\nx\n", "\r\nTL1>>", {"x"}},
  }, false);
}
// clang-format on

struct HandOff {
  const char* name;
  std::string keys;
  bool echo;
  LineEditor::Masking masking;
  std::string output;
  std::optional<LineEditor::Request> request;  // else one completed line:
  std::string line;
  std::size_t consumed;
};

// A command-line session: every completed line is written back, TAB, '?' and Ctrl-Z go to the
// caller, and a feed stops at the first line or request, leaving the rest for the next feed.
TEST(LineEditorTest, CommandLineHandsOffRequestsAndEchoesEveryLine) {
  using Kind = LineEditor::Request::Kind;
  using M = LineEditor::Masking;
  const HandOff cases[] = {
      {"a line with echo off is written back", "sh ver\r\nnext", false, M::kNone, "sh ver\r\n",
       std::nullopt, "sh ver", 7},
      {"CR NUL ends it once", "a\r\0b", false, M::kNone, "a\r\n", std::nullopt, "a", 2},
      {"a hidden line shows nothing", "secret\rx", true, M::kHidden, "\r\n", std::nullopt,
       "secret", 7},
      {"hidden without echo", "secret\n", false, M::kHidden, "\r\n", std::nullopt, "secret", 7},
      {"stars", "ab\x7f\x7fxyz\r", true, M::kStars, "**\x1b[D\x1b[0K\x1b[D\x1b[0K***\r\n", std::nullopt,
       "xyz", 8},
      {"TAB", "int gi\tx", true, M::kNone, "int gi", LineEditor::Request{Kind::kComplete, "int gi"},
       "", 7},
      {"'?' shown", "sh ?x", true, M::kNone, "sh ?", LineEditor::Request{Kind::kHelp, "sh "}, "", 4},
      {"'?' without echo", "sh ?\r\n", false, M::kNone, "",
       LineEditor::Request{Kind::kHelp, "sh "}, "", 4},
      {"a '?' in a secret is part of it", "a?b\r", true, M::kStars, "***\r\n", std::nullopt, "a?b",
       4},
      {"Ctrl-Z drops the line", "conf\x1a", true, M::kNone, "conf^Z\r\n",
       LineEditor::Request{Kind::kSuspend, ""}, "", 5},
  };
  for (const HandOff& c : cases) {
    LineEditor editor("R1>", {}, {true, true});
    editor.SetEcho(c.echo);
    editor.SetMasking(c.masking);
    LineEditor::Result result = editor.Feed(c.keys);
    EXPECT_EQ(result.output, c.output) << c.name;
    EXPECT_EQ(result.consumed, c.consumed) << c.name;
    ASSERT_EQ(result.request.has_value(), c.request.has_value()) << c.name;
    if (c.request) {
      EXPECT_EQ(result.request->kind, c.request->kind) << c.name;
      EXPECT_EQ(result.request->line, c.request->line) << c.name;
      EXPECT_TRUE(result.lines.empty()) << c.name;
    } else {
      EXPECT_EQ(result.lines, std::vector<std::string>{c.line}) << c.name;
    }
  }
}

TEST(LineEditorTest, CommandLineAnswersReplaceOrShowTheLine) {
  LineEditor editor("R1>", {}, {true, true});
  editor.Feed("sh");
  editor.Feed("o\t");
  EXPECT_EQ(editor.SetLine("show"), "w") << "only what changed is drawn";
  EXPECT_EQ(editor.Feed(" ?").output, " ?");
  EXPECT_EQ(editor.ShowLine(), "show ") << "drawn whole after the caller's prompt";
  EXPECT_EQ(editor.Feed("v\r").lines, std::vector<std::string>{"show v"});
  editor.SetMasking(LineEditor::Masking::kStars);
  editor.Feed("secret\r");
  editor.SetMasking(LineEditor::Masking::kNone);
  EXPECT_EQ(editor.History(), std::vector<std::string>{"show v"}) << "secrets are not kept";
  EXPECT_EQ(editor.Feed(kUp + "\r").lines, std::vector<std::string>{"show v"});
  editor.SetHistorySize(0);
  EXPECT_EQ(editor.Feed(kUp + "\r").lines, std::vector<std::string>{""});
}

}  // namespace
}  // namespace tessel
