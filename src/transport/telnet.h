// Telnet for interactive sessions: the server's opening offer (it will echo and suppress
// go-ahead) and a reader that strips commands from the client's stream and answers its option
// requests without ever entering a negotiation loop. A pure state machine: one per connection,
// used by one thread at a time; no sockets. A session sends Open() when it accepts, passes each
// read through Feed (replies back to the client, data on to its LineEditor) and sets the
// editor's echo from ServerEchoes() after each read.
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

struct TelnetFeed {
  std::string data;     // the client's data, commands removed; CR NUL and CR LF become one CR
  std::string replies;  // answers to the client's option requests, to be sent back as they are
};

class TelnetInput {
 public:
  // The offer to send when the connection opens: IAC WILL ECHO, IAC WILL SUPPRESS-GO-AHEAD. The
  // offers count as outstanding until the client answers, so its answer is not answered again.
  std::string Open();

  // Reads the next bytes of the client's stream; a command may be split over several calls.
  TelnetFeed Feed(std::string_view bytes);

  // Whether the server echoes what the client types (and the line editor draws): yes once the
  // client accepted ECHO, no once it refused it. A client that has not answered is judged by its
  // first read: one that sends whole lines (3 bytes or more at once) edits and echoes them itself.
  bool ServerEchoes() const;

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

  State state_ = State::kData;
  std::uint8_t verb_ = 0;  // the DO/DONT/WILL/WONT whose option byte comes next
  std::array<Option, 256> server_{};
  std::array<Option, 256> client_{};
  std::size_t firstDataLength_ = 0;  // 0 until the first read that carried data
};

// Data bytes for a telnet client: each 0xFF doubled so that it is not taken for a command.
std::string EscapeTelnetData(std::string_view bytes);

}  // namespace tessel
