// What one CLI session's input bytes become: the Telnet opening and option answers, the echo,
// and one event at a time for the session's worker (the opening once the Telnet negotiation is
// settled, then each line, help request, completion request and Ctrl-Z in the order typed).
// While an event is being answered the keys typed after it are kept, so that they are echoed
// and read under the mode the answer leads to (a password typed ahead is never shown). An SSH
// session has no Telnet layer and echoes as a negotiated one. A pure state machine: one per
// session, used by one thread at a time; no sockets.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "transport/line_editor.h"
#include "transport/telnet.h"

namespace tessel {

struct CliInputEvent {
  enum class Kind : std::uint8_t { kOpen, kLine, kComplete, kHelp, kSuspend };
  Kind kind = Kind::kLine;
  std::string text;  // the line, or the line typed so far
  bool operator==(const CliInputEvent&) const = default;
};

class CliInput {
 public:
  // Input kept while an event is answered; what comes beyond it is dropped.
  static constexpr std::size_t kTypedAheadLimit = std::size_t{256} << 10;

  explicit CliInput(bool telnet);

  bool Telnet() const { return telnet_; }
  // What the session sends when it opens: Telnet's request for the terminal type.
  std::string Open();
  // Reads client bytes; returns what to send back at once (option answers).
  std::string Feed(std::string_view bytes);
  // The client did not settle the Telnet opening in time: it is served as not negotiated.
  void GiveUpNegotiation();
  bool Negotiated() const;

  // The next event, unless one is being answered or the opening is not settled; *output gets
  // the echo of the keys read for it.
  std::optional<CliInputEvent> Next(std::string* output);
  // The event given by Next is answered: the next keys are read under masking, and prompt is
  // what a line dropped for its length is answered with.
  void Answered(LineEditor::Masking masking, std::string prompt);

  // Between Next and Answered: the line being typed becomes text, or is shown again after a
  // prompt just sent; the redraw is returned.
  std::string SetLine(std::string_view text);
  std::string ShowLine();
  void SetHistorySize(std::size_t size) { editor_.SetHistorySize(size); }
  std::vector<std::string> History() const { return editor_.History(); }

 private:
  std::string Escaped(std::string text) const;

  const bool telnet_;
  TelnetInput telnetInput_;
  LineEditor editor_;
  std::string typedAhead_;
  bool opened_ = false;       // the opening event was given
  bool outstanding_ = false;  // an event is being answered
};

}  // namespace tessel
