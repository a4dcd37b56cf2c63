// What one TL1 session's input bytes become: the messages for the command engine, and the bytes
// to send back at once (telnet option answers, echo and redraw). A raw session's stream is cut at
// each ';' outside double quotes, so a command may arrive in pieces and several may share a read;
// an interactive (telnet) session goes through the option handling and the line editor, and each
// completed line is one message. A pure state machine: one per session, used by one thread at a
// time; no sockets.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "transport/line_editor.h"
#include "transport/telnet.h"

namespace tessel {

inline constexpr const char* kTl1Prompt = "TL1>>";

struct Tl1InputEvent {
  enum class Kind : std::uint8_t {
    kMessage,    // text: one message for the command engine
    kOverflow,   // a raw message grew past the limit without its ';' and was dropped
    kEmptyLine,  // an interactive session's empty line, answered with the prompt alone
  };
  Kind kind = Kind::kMessage;
  std::string text;
  bool operator==(const Tl1InputEvent&) const = default;
};

struct Tl1InputResult {
  std::string reply;  // to send to the client now
  std::vector<Tl1InputEvent> events;
};

class Tl1SessionInput {
 public:
  // A raw message this long without its terminator is dropped.
  static constexpr std::size_t kMessageLimit = 4096;

  // completion: the command codes that complete a prefix (interactive sessions only).
  Tl1SessionInput(bool interactive, LineEditor::Completion completion);

  bool Interactive() const { return interactive_; }
  // What the session sends when it opens: an interactive session's telnet offer and its prompt.
  std::string Open();
  Tl1InputResult Feed(std::string_view bytes);

 private:
  void FeedRaw(std::string_view bytes, Tl1InputResult* result);
  void FeedInteractive(std::string_view bytes, Tl1InputResult* result);

  const bool interactive_;
  // Raw sessions: the message so far and whether it is inside a quoted string.
  std::string message_;
  bool inQuotes_ = false;
  // Interactive sessions.
  TelnetInput telnet_;
  LineEditor editor_;
};

}  // namespace tessel
