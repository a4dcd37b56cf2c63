#include "tl1/input_cmd.h"

#include <gtest/gtest.h>

namespace tessel {
namespace {

// The parsed command in one line, so that a table row states all of it: the command code, then
// only the fields that are present.
std::string Describe(const Tl1InputCmd& cmd) {
  std::string text = CommandCodeOf(cmd);
  if (cmd.tid) text += " tid=" + *cmd.tid;
  if (cmd.aidText) {
    text += " aid=[" + cmd.aidParts[0];
    for (std::size_t i = 1; i < cmd.aidParts.size(); ++i) {
      text += "|" + cmd.aidSeparators[i - 1] + "|" + cmd.aidParts[i];
    }
    text += "]";
  }
  if (cmd.ctag) text += " ctag=" + *cmd.ctag;
  auto triple = [](const Tl1DateOrTime& t) {
    return std::to_string(t[0]) + "-" + std::to_string(t[1]) + "-" + std::to_string(t[2]);
  };
  if (cmd.generalBlock) {
    text += " on=" + std::to_string(cmd.generalBlock->on);
    if (cmd.generalBlock->date) text += " date=" + triple(*cmd.generalBlock->date);
    if (cmd.generalBlock->time) text += " time=" + triple(*cmd.generalBlock->time);
  }
  if (cmd.contingencyFlag) text += " cf=" + std::to_string(cmd.contingencyFlag);
  if (cmd.retrieveIndicator) text += " rtrvind=" + *cmd.retrieveIndicator;
  for (const Tl1PayloadBlock& block : cmd.payloadBlocks) {
    text += " [";
    for (std::size_t i = 0; i < block.params.size(); ++i) {
      text += (i ? "|" : "") + block.params[i].value_or("<null>");
    }
    text += "]";
  }
  return text;
}

struct ParseCase {
  const char* input;     // prepared text, without its ';'
  const char* expected;  // Describe() of the result, or nullptr when parsing fails
  int errorNumber = 0;   // when it fails
};

TEST(Tl1InputParserTest, FieldsParseOrFailWithTheirErrorNumber) {
  const ParseCase cases[] = {
      // Command code and the field structure.
      {"RTRV-ALM-ALL:NE1::7", "RTRV-ALM-ALL tid=NE1 ctag=7"},
      {"rtrv-hdr:::1", "RTRV-HDR ctag=1"},
      {"RTRV-HDR:::1:", "RTRV-HDR ctag=1"},
      {"ENT-EQPT#X2:::1", "ENT-EQPT-X2 ctag=1"},
      {"RTRV#X:::1", "RTRV#X ctag=1"},
      {"RTRV-HDR:::", nullptr, 52},
      {"RTRV-HDR::", nullptr, 52},
      {"RTRV-HDR-A-B:::1", nullptr, 52},
      {"RTRV HDR:::1", nullptr, 52},
      {"1RTRV:::1", nullptr, 52},
      {"RTRV-:::1", nullptr, 52},
      {"RTRV-1:::1", nullptr, 52},
      {":::1", nullptr, 52},
      // TID.
      {"A:ABCDEFGHIJKLMNOPQRST::1", "A tid=ABCDEFGHIJKLMNOPQRST ctag=1"},
      {"A:ABCDEFGHIJKLMNOPQRSTU::1", nullptr, 58},
      {"A:1NE::1", nullptr, 58},
      {"A:NE-1::1", nullptr, 58},
      {"A:\"NE 1\"::1", "A tid=\"NE 1\" ctag=1"},
      {"A:\"NE\"X::1", nullptr, 58},
      {"A:\"NE::1", nullptr, 58},
      // CTAG.
      {"A:::ABCDEF", "A ctag=ABCDEF"},
      {"A:::ABCDEFG", nullptr, 53},
      {"A:::D'12", "A ctag=D'12"},
      {"A:::1.5", "A ctag=1.5"},
      {"A:::1.2.3", nullptr, 53},
      {"A:::12.", nullptr, 53},
      {"A:::D'", nullptr, 53},
      {"A:::A-1", nullptr, 53},
      // AID.
      {"A::1-1-1&&-5:1", "A aid=[1|-|1|-|1|&&-|5] ctag=1"},
      {"A::A,B,C:1", nullptr, 51},
      {"A::A,B:1", "A aid=[A|,|B] ctag=1"},
      {"A::1-2,3-4,5-6:1", nullptr, 51},
      {"A::1-2,3-4:1", "A aid=[1|-|2|,|3|-|4] ctag=1"},
      {"A::A&B,C:1", nullptr, 51},
      {"A::A&B&&C:1", "A aid=[A|&|B|&&|C] ctag=1"},
      {"A::S-1&-2&-3:1", "A aid=[S|-|1|&-|2|&-|3] ctag=1"},
      {"A::1&&-2&&-3:1", nullptr, 51},
      {"A::A&B-C:1", nullptr, 51},
      {"A::ALL:1", "A aid=[ALL] ctag=1"},
      {"A::&-:1", nullptr, 51},
      // General block.
      {"A:::1:ON=5", "A ctag=1 on=5"},
      {"A:::1:ON=X", nullptr, 47},
      {"A:::1:ON=99999999999", nullptr, 47},
      {"A:::1:,,,1", "A ctag=1 cf=1"},
      {"A:::1:,,,2", nullptr, 52},
      {"A:::1:5,24-06-30,14-05-09,,ALL-X", "A ctag=1 on=5 date=24-6-30 time=14-5-9 rtrvind=ALL-X"},
      {"A:::1:DATE=10-13-01", nullptr, 176},
      {"A:::1:TIME=24-00-00", nullptr, 176},
      {"A:::1:DATE=24-1", nullptr, 52},
      {"A:::1:TIME=1-2-3,DATE=24-12-31", "A ctag=1 on=-1 date=24-12-31 time=1-2-3"},
      {"A:::1:FOO=1", nullptr, 52},
      {"A:::1:on=1", nullptr, 52},
      {"A:::1:5", nullptr, 52},
      {"A:::1:5,,", nullptr, 52},
      {"A:::1:ON=5,,,DATE=1-1-1", nullptr, 47},  // by position: ON is "ON=5"
      // Payload.
      {"A:::1::\"x y\",(7),,B=2", "A ctag=1 [x y|7|<null>|B=2]"},
      {"A:::1::A=1, B=2", nullptr, 54},
      {"A:::1::\"a:b\":C", "A ctag=1 [a:b] [C]"},
      {"A:::1::a\"b,c\"", "A ctag=1 [a\"b|c\"]"},
      {"A:::1::(7", nullptr, 54},
      {"A:::1::\"abc", nullptr, 54},
      {"A:::1::\"a\"b", nullptr, 54},
      {"ACT-USER:NE1:admin:1::secret", "ACT-USER tid=NE1 aid=[admin] ctag=1 [secret]"},
      {"A:::1::X:Y,", "A ctag=1 [X] [Y]"},
  };
  for (const ParseCase& row : cases) {
    SCOPED_TRACE(row.input);
    Tl1InputCmd cmd;
    int errorNumber = 0;
    bool parsed = InputCmdParser(&cmd, row.input, &errorNumber);
    if (row.expected) {
      ASSERT_TRUE(parsed) << "error " << errorNumber;
      EXPECT_EQ(Describe(cmd), row.expected);
    } else {
      EXPECT_FALSE(parsed) << Describe(cmd);
      EXPECT_EQ(errorNumber, row.errorNumber);
    }
  }
  Tl1InputCmd cmd;
  int errorNumber = 0;
  std::string longBlock = "A:::1::" + std::string(5001, 'x');
  EXPECT_FALSE(InputCmdParser(&cmd, longBlock, &errorNumber));
  EXPECT_EQ(errorNumber, 54);
}

TEST(Tl1InputParserTest, PreparationCutsAtTheTerminatorAndDropsControlCharacters) {
  struct Case {
    std::string input;
    int ack;
    std::string cleaned;
  } cases[] = {
      {"RTRV-HDR:::1;RTRV-HDR:::2;", 0, "RTRV-HDR:::1"},
      {"RTRV-HDR:::1", 3, ""},
      {"A:::1::\"a;b\";", 0, "A:::1::\"a;b\""},
      {"A:::1::\"a;b;", 3, ""},
      {"RTRV\x18-HDR:::1;", 5, ""},
      {"RTRV-HDR:::1;\x18", 0, "RTRV-HDR:::1"},
      {std::string("\x01R\x7fT\x1f\x0e", 5) + std::string(1, '\0') + ":::1;", 0, "RT:::1"},
      {"A\t\n\v\f\r\x80\xff:::1;", 0, "A\t\n\v\f\r\x80\xff:::1"},
  };
  for (Case& row : cases) {
    SCOPED_TRACE(row.input);
    std::string text = row.input;
    EXPECT_EQ(PrepareTL1Message(&text), row.ack);
    if (row.ack == 0) {
      EXPECT_EQ(text, row.cleaned);
    }
  }
}

}  // namespace
}  // namespace tessel
