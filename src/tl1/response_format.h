// TL1 output text: the error table, the acknowledgment, completion and alarm code words, and the
// formatting of responses, acknowledgments and autonomous messages. A response text never passes
// kTl1ResponseSize bytes: lines that do not fit continue in a further response (the text before
// ends with "\r\n>"), and a single line too long for a response of its own is cut and continued.
// Pure functions; safe from any thread.
#pragma once

#include <cstdint>
#include <ctime>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tessel {

inline constexpr std::size_t kTl1ResponseSize = 4096;

struct Tl1ErrorEntry {
  const char* code;  // four letters
  const char* text;
};
inline constexpr int kTl1ErrorCount = 176;
// The entry of a 1-based error number; nullptr outside 1..kTl1ErrorCount.
const Tl1ErrorEntry* Tl1Error(int errorNumber);
// The error number of a four-letter code (exact case); 0 when the table has none.
int Tl1ErrorNumber(std::string_view code);

inline constexpr int kErrorScnf = 105;
inline constexpr int kErrorSaas = 87;
inline constexpr int kErrorPlna = 72;
inline constexpr int kErrorIisp = 57;

// Acknowledgment codes, 1-based: IP, PF, NA, RL, OK, NG.
inline constexpr int kAckInProgress = 1;
inline constexpr int kAckNotGranted = 6;
const char* AckCodeWord(int ackCode);  // nullptr outside 1..6

// Completion codes, 1-based.
inline constexpr int kCompld = 1;
inline constexpr int kDeny = 2;
inline constexpr int kPrtl = 3;
inline constexpr int kDelay = 4;
inline constexpr int kRtrv = 5;
const char* CompletionCodeWord(int completionCode);  // nullptr outside 1..5

// Line types of a text block; 5, 4 and 6 are written like 1, 2 and 3 but reserve more room.
inline constexpr std::uint8_t kTl1PlainLine = 1;
inline constexpr std::uint8_t kTl1QuotedLine = 2;
inline constexpr std::uint8_t kTl1CommentLine = 3;

struct Tl1TextElement {
  std::uint8_t type = kTl1PlainLine;
  std::string text;
  bool operator==(const Tl1TextElement&) const = default;
};

// The local time of response headers; tests give their own.
using Tl1LocalTime = std::function<std::tm()>;
std::tm SystemLocalTime();

// "\r\n\n   SID YY-MM-DD HH:MM:SS"
std::string FormatHeader(std::string_view sid, const std::tm& now);
// "\r\nM  CTAG COMPLD", with 0 for a command without CTAG.
std::string FormatResponseIdentification(const std::optional<std::string>& ctag,
                                         int completionCode);
// "\r\n*C 17 REPT ALM EQPT": alarm codes 0..3 are *C, **, "* ", "A " (any other is "A ").
std::string FormatAutonomousIdentification(std::uint8_t alarmCode, std::uint32_t atag,
                                           std::string_view verb,
                                           const std::optional<std::string>& modifier1,
                                           const std::optional<std::string>& modifier2);

// The opening (header and identification) followed by the lines, in as many texts as they need,
// each with the opening repeated; the last ends with "\r\n;", the others with "\r\n>".
std::vector<std::string> FormatTextBlocks(const std::string& opening,
                                          const std::vector<Tl1TextElement>& elements);

// A whole response: header, identification, text block(s).
std::vector<std::string> OutputFormattor(std::string_view sid, const std::tm& now,
                                         const std::optional<std::string>& ctag, int completionCode,
                                         const std::vector<Tl1TextElement>& elements);

// A whole autonomous message: header, autonomous identification, text block(s).
std::vector<std::string> FormatAutonomousMessage(std::string_view sid, const std::tm& now,
                                                 std::uint8_t alarmCode, std::uint32_t atag,
                                                 std::string_view verb,
                                                 const std::optional<std::string>& modifier1,
                                                 const std::optional<std::string>& modifier2,
                                                 const std::vector<Tl1TextElement>& elements);

// "IP 15\r\n<"
std::string AckFormatter(int ackCode, std::string_view ctag);

// The standard error lines: the code as a plain line, its text as a quoted line.
void OutputErrorFormatter(std::vector<Tl1TextElement>* elements, int errorNumber);

}  // namespace tessel
