// The TL1 input parser: one received message (ending with its ';') becomes a Tl1InputCmd, or an
// outcome the command engine answers: an acknowledgment code when the message itself is unusable,
// a TL1 error number (an index into the error table of response_format.h) when a field is wrong.
// The accepted shape is VERB[-MOD1[-MOD2]]:[TID]:[AID]:CTAG[:[GENERAL BLOCK][:PAYLOAD]].
// Pure functions; safe from any thread.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tessel {

// Year (two digits), month, day; or hour, minute, second.
using Tl1DateOrTime = std::array<std::uint16_t, 3>;

struct Tl1GeneralBlock {
  std::int32_t on = -1;  // -1 when not given
  std::optional<Tl1DateOrTime> date;
  std::optional<Tl1DateOrTime> time;
};

// One colon-separated payload block; an empty parameter is kept as nullopt.
struct Tl1PayloadBlock {
  std::vector<std::optional<std::string>> params;
};

struct Tl1InputCmd {
  std::string verb;  // upper-cased
  std::optional<std::string> modifier1;
  std::optional<std::string> modifier2;
  std::optional<std::string> tid;      // as typed, quotes kept
  std::optional<std::string> aidText;  // the whole field as typed
  std::vector<std::string> aidParts;
  std::vector<std::string>
      aidSeparators;  // between consecutive parts: "-", ",", "&", "&&", "&-", "&&-"
  std::optional<std::string> ctag;
  std::optional<Tl1GeneralBlock> generalBlock;
  std::uint16_t contingencyFlag = 0;
  std::optional<std::string> retrieveIndicator;
  std::vector<Tl1PayloadBlock> payloadBlocks;
};

// Acknowledgment codes a message can fail with before it is parsed.
inline constexpr int kAckNoTerminator = 3;  // NA
inline constexpr int kAckCancelled = 5;     // OK

// Error numbers the field parsers give.
inline constexpr int kErrorIdnv = 47;
inline constexpr int kErrorIiac = 51;
inline constexpr int kErrorIicm = 52;
inline constexpr int kErrorIict = 53;
inline constexpr int kErrorIidt = 54;
inline constexpr int kErrorIita = 58;
inline constexpr int kErrorAidt = 176;

// Cuts the message at its first ';' outside double quotes (dropping the ';' and what follows) and
// removes control characters other than TAB, LF, VT, FF and CR. 0 on success, else the ack code:
// kAckNoTerminator without such a ';', kAckCancelled when a CAN (0x18) precedes it.
int PrepareTL1Message(std::string* text);

// The tokenizer of every field parser: the text from *position up to the next whole occurrence of
// delimiter, moving *position behind it; the rest when none follows; nullopt at the end. So a
// delimiter at the very end yields no trailing empty token, two adjacent ones an empty token.
std::optional<std::string> NextToken(std::string_view text, std::string_view delimiter,
                                     std::size_t* position);

// Parses prepared text into *cmd (which starts empty). On false, *errorNumber says why.
bool InputCmdParser(Tl1InputCmd* cmd, std::string_view text, int* errorNumber);

// The field parsers, in field order; each sets *errorNumber only when it fails.
bool CmdParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber);
bool TIDParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber);
bool AIDParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber);
bool CtagParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber);
bool GenBlockParser(Tl1InputCmd* cmd, std::string_view field, int* errorNumber);
bool MesgPayLoadParser(Tl1InputCmd* cmd, std::string_view remainder, int* errorNumber);

// The command code as typed in canonical form: VERB, VERB-MOD1 or VERB-MOD1-MOD2.
std::string CommandCodeOf(const Tl1InputCmd& cmd);

}  // namespace tessel
