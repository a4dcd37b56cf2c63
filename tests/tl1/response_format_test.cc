#include "tl1/response_format.h"

#include <gtest/gtest.h>

namespace tessel {
namespace {

std::tm At(int year, int month, int day, int hour, int minute, int second) {
  std::tm time{};
  time.tm_year = year - 1900;
  time.tm_mon = month - 1;
  time.tm_mday = day;
  time.tm_hour = hour;
  time.tm_min = minute;
  time.tm_sec = second;
  return time;
}

const std::tm kNow = At(2024, 6, 30, 14, 5, 9);
const std::string kOpening = "\r\n\n   NE1 24-06-30 14:05:09\r\nM  15 COMPLD";

// The line texts of a run of responses, each response's opening checked and removed.
std::vector<std::string> LinesOf(const std::vector<std::string>& texts) {
  std::vector<std::string> lines;
  for (std::size_t i = 0; i < texts.size(); ++i) {
    const std::string& text = texts[i];
    EXPECT_LE(text.size(), kTl1ResponseSize);
    EXPECT_EQ(text.substr(0, kOpening.size()), kOpening);
    EXPECT_EQ(text.substr(text.size() - 3), i + 1 < texts.size() ? "\r\n>" : "\r\n;");
    std::string body = text.substr(kOpening.size(), text.size() - kOpening.size() - 3);
    for (std::size_t start = 0; start < body.size();) {
      EXPECT_EQ(body.substr(start, 5), "\r\n   ");
      std::size_t end = std::min(body.find("\r\n   ", start + 5), body.size());
      lines.push_back(body.substr(start + 5, end - start - 5));
      start = end;
    }
  }
  return lines;
}

TEST(Tl1FormatTest, ResponsesAcknowledgmentsAndIdentificationsAreExactBytes) {
  std::vector<Tl1TextElement> elements{
      {kTl1QuotedLine, "SLOT-1:OC48"}, {kTl1PlainLine, "ALARMS"}, {kTl1CommentLine, "note"}};
  std::vector<std::string> texts = OutputFormattor("NE1", kNow, "15", kCompld, elements);
  ASSERT_EQ(texts.size(), 1u);
  EXPECT_EQ(texts[0], kOpening + "\r\n   \"SLOT-1:OC48\"\r\n   ALARMS\r\n   /*note*/\r\n;");

  EXPECT_EQ(OutputFormattor("NE1", At(2009, 1, 2, 3, 4, 5), std::nullopt, kDeny, {})[0],
            "\r\n\n   NE1 09-01-02 03:04:05\r\nM  0 DENY\r\n;");
  EXPECT_EQ(FormatResponseIdentification("7", kDelay), "\r\nM  7 DELAY");
  EXPECT_EQ(AckFormatter(kAckInProgress, "15"), "IP 15\r\n<");
  EXPECT_EQ(AckFormatter(kAckNotGranted, "15"), "NG 15\r\n<");
  EXPECT_EQ(AckFormatter(3, "0"), "NA 0\r\n<");
  EXPECT_EQ(FormatAutonomousMessage("NE1", kNow, 0, 17, "REPT", "ALM", "EQPT",
                                    {{kTl1QuotedLine, "SLOT-1:CR,LOS"}})[0],
            "\r\n\n   NE1 24-06-30 14:05:09\r\n*C 17 REPT ALM EQPT\r\n   \"SLOT-1:CR,LOS\"\r\n;");
  EXPECT_EQ(FormatAutonomousIdentification(3, 5, "REPT", std::nullopt, std::nullopt),
            "\r\nA  5 REPT");
  EXPECT_EQ(FormatAutonomousIdentification(2, 0, "REPT", "EVT", std::nullopt), "\r\n*  0 REPT EVT");
}

TEST(Tl1FormatTest, ErrorTableAndErrorElements) {
  std::vector<Tl1TextElement> elements;
  OutputErrorFormatter(&elements, 51);
  EXPECT_EQ(elements, (std::vector<Tl1TextElement>{{kTl1PlainLine, "IIAC"},
                                                   {kTl1QuotedLine, "INVALID ACCESS IDENTIFIER"}}));
  EXPECT_STREQ(Tl1Error(1)->code, "EANS");
  EXPECT_STREQ(Tl1Error(105)->text, "COMMAND NOT FOUND");
  EXPECT_STREQ(Tl1Error(176)->code, "AIDT");
  EXPECT_EQ(Tl1Error(0), nullptr);
  EXPECT_EQ(Tl1Error(177), nullptr);
  EXPECT_EQ(Tl1ErrorNumber("PLNA"), 72);
  EXPECT_EQ(Tl1ErrorNumber("PIUI"), 175);
  EXPECT_EQ(Tl1ErrorNumber("piui"), 0);
  // Every code is four capitals and names its own entry.
  for (int number = 1; number <= kTl1ErrorCount; ++number) {
    std::string code = Tl1Error(number)->code;
    EXPECT_EQ(code.size(), 4u);
    EXPECT_EQ(Tl1ErrorNumber(code), number) << code;
  }
}

TEST(Tl1FormatTest, LongBlocksContinueInFurtherResponses) {
  // 60 lines of 100 bytes: every response full up to the last, all lines once and in order.
  std::vector<Tl1TextElement> elements;
  for (int i = 0; i < 60; ++i) {
    elements.push_back({kTl1QuotedLine, std::to_string(1000 + i) + std::string(96, 'x')});
  }
  std::vector<std::string> texts = OutputFormattor("NE1", kNow, "15", kCompld, elements);
  ASSERT_EQ(texts.size(), 2u);
  std::vector<std::string> lines = LinesOf(texts);
  ASSERT_EQ(lines.size(), elements.size());
  for (std::size_t i = 0; i < lines.size(); ++i)
    EXPECT_EQ(lines[i], "\"" + elements[i].text + "\"");
  EXPECT_GT(texts[0].size() + 100 + 10, kTl1ResponseSize);  // no room left for the next line

  // A line that just fits stays whole; one byte more and it is cut and continued.
  std::size_t fits = kTl1ResponseSize - kOpening.size() - 8;
  EXPECT_EQ(
      OutputFormattor("NE1", kNow, "15", kCompld, {{kTl1PlainLine, std::string(fits, 'a')}}).size(),
      1u);
  std::string tooLong = std::string(fits, 'a') + "b";
  texts = OutputFormattor("NE1", kNow, "15", kCompld, {{kTl1PlainLine, tooLong}});
  ASSERT_EQ(texts.size(), 2u);
  EXPECT_EQ(texts[0].size(), kTl1ResponseSize);
  EXPECT_EQ(LinesOf(texts), (std::vector<std::string>{std::string(fits, 'a'), "b"}));
}

TEST(Tl1FormatTest, OneOverlongLineIsCutAtCharacterBoundariesAndNeverDropped) {
  std::string text;
  for (int i = 0; i < 3000; ++i) text += "\xc3\xa9";  // 6000 bytes of a two-byte character
  std::vector<Tl1TextElement> elements{
      {kTl1PlainLine, "before"}, {kTl1CommentLine, text}, {kTl1PlainLine, "after"}};
  std::vector<std::string> texts = OutputFormattor("NE1", kNow, "15", kCompld, elements);
  std::vector<std::string> lines = LinesOf(texts);
  ASSERT_EQ(texts.size(), 3u);
  ASSERT_EQ(lines.size(), 4u);
  EXPECT_EQ(lines.front(), "before");
  EXPECT_EQ(lines.back(), "after");
  std::string joined;
  for (std::size_t i = 1; i + 1 < lines.size(); ++i) {
    const std::string& piece = lines[i];
    ASSERT_EQ(piece.substr(0, 2), "/*");
    ASSERT_EQ(piece.substr(piece.size() - 2), "*/");
    EXPECT_EQ(piece.size() % 2, 0u) << "cut inside a character";
    joined += piece.substr(2, piece.size() - 4);
  }
  EXPECT_EQ(joined, text);
}

}  // namespace
}  // namespace tessel
