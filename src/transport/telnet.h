// Telnet for interactive sessions: the server's opening offer (it will echo and suppress
// go-ahead) and a reader that strips commands from the client's stream and answers its option
// requests without ever entering a negotiation loop. A pure state machine: one per connection,
// used by one thread at a time; no sockets. A session sends Open() when it accepts, passes each
// read through Feed (replies back to the client, data on to its LineEditor) and sets the
// editor's echo from ServerEchoes() after each read.
//
// A command-line session opens with OpenAskingTerminalType() instead: it asks for the client's
// terminal type first and offers echo and go-ahead suppression only to a client that names one
// (other than "dumb"); a client that refuses, sends data first or is given up on by the caller's
// timer (GiveUpNegotiation) is served as not negotiated. Such a session never answers a WONT or
// DONT.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace tessel {

inline constexpr std::uint8_t kTelnetIac = 255;
inline constexpr std::uint8_t kTelnetDont = 254;
inline constexpr std::uint8_t kTelnetDo = 253;
inline constexpr std::uint8_t kTelnetWont = 252;
inline constexpr std::uint8_t kTelnetWill = 251;
inline constexpr std::uint8_t kTelnetSubnegotiation = 250;
inline constexpr std::uint8_t kTelnetSubnegotiationEnd = 240;
inline constexpr std::uint8_t kTelnetEcho = 1;
inline constexpr std::uint8_t kTelnetSuppressGoAhead = 3;
inline constexpr std::uint8_t kTelnetTerminalType = 24;

struct TelnetFeed {
  std::string data;     // the client's data, commands removed; CR NUL and CR LF become one CR
  std::string replies;  // answers to the client's option requests, to be sent back as they are
};

class TelnetInput {
 public:
  // The offer to send when the connection opens: IAC WILL ECHO, IAC WILL SUPPRESS-GO-AHEAD. The
  // offers count as outstanding until the client answers, so its answer is not answered again.
  std::string Open();

  // The command-line opening: IAC DO TERMINAL-TYPE.
  std::string OpenAskingTerminalType();

  enum class Negotiation : std::uint8_t { kPending, kNegotiated, kNotNegotiated };
  // Settled for an Open() session from the start.
  Negotiation NegotiationState() const { return negotiation_; }
  // A client that has not settled the opening by now is served as not negotiated.
  void GiveUpNegotiation();
  // Lower case, at most 40 characters; empty until the client named one.
  const std::string& TerminalType() const { return terminalType_; }

  // Reads the next bytes of the client's stream; a command may be split over several calls.
  TelnetFeed Feed(std::string_view bytes);

  // Whether the server echoes what the client types (and the line editor draws): yes once the
  // client accepted ECHO, no once it refused it. A client that has not answered is judged by its
  // first read: one that sends whole lines (3 bytes or more at once) edits and echoes them itself.
  // A command-line session that is not negotiated echoes only for a client that sends single
  // keys (fewer than 3 bytes in its first read).
  bool ServerEchoes() const;

  static constexpr std::size_t kSubnegotiationLimit = 512;
  static constexpr std::size_t kTerminalTypeLimit = 40;

 private:
  enum class Option : std::uint8_t { kOff, kOn, kOffered };
  enum class State : std::uint8_t {
    kData,
    kAfterCr,
    kCommand,
    kOptionName,
    kSubnegotiation,
    kSubnegotiationCommand
  };

  void ReadData(std::uint8_t byte, TelnetFeed* out);
  void ReadCommand(std::uint8_t byte);
  void ReadOptionRequest(std::uint8_t option, std::string* replies);
  // What the client asks of this side (DO / DONT) and what it says of itself (WILL / WONT).
  void AnswerServerOption(std::uint8_t option, bool enable, std::string* replies);
  void AnswerClientOption(std::uint8_t option, bool enable, std::string* replies);
  void EndSubnegotiation(std::string* replies);
  void Settle(Negotiation negotiation, std::string* replies);

  State state_ = State::kData;
  std::uint8_t verb_ = 0;  // the DO/DONT/WILL/WONT whose option byte comes next
  std::array<Option, 256> server_{};
  std::array<Option, 256> client_{};
  std::size_t firstDataLength_ = 0;  // 0 until the first read that carried data
  bool commandLine_ = false;         // opened with OpenAskingTerminalType
  Negotiation negotiation_ = Negotiation::kNegotiated;
  std::string subnegotiation_;  // the parameters of the one being read, up to the limit
  std::string terminalType_;
};

// Data bytes for a telnet client: each 0xFF doubled so that it is not taken for a command.
std::string EscapeTelnetData(std::string_view bytes);

}  // namespace tessel
