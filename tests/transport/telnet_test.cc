#include "transport/telnet.h"

#include <gtest/gtest.h>

namespace tessel {
namespace {

using namespace std::string_literals;

constexpr std::uint8_t kDo = kTelnetDo, kDont = kTelnetDont, kWill = kTelnetWill,
                       kWont = kTelnetWont, kEcho = kTelnetEcho, kGoAhead = kTelnetSuppressGoAhead,
                       kTerminalType = 24, kWindowSize = 31;

std::string Command(std::uint8_t verb, std::uint8_t option) {
  return {'\xff', static_cast<char>(verb), static_cast<char>(option)};
}

struct Exchange {
  const char* name;
  std::string received, data, replies;
  bool serverEchoes;
  bool offered = true;  // the server sent its opening offer first
};

// Each case is read at once and again one byte per read: a command may be split anywhere.
TEST(TelnetTest, OptionNegotiationAndCommandsInTheStream) {
  const Exchange exchanges[] = {
      {"offers accepted", Command(kDo, kEcho) + Command(kDo, kGoAhead) + "ab", "ab", "", true},
      {"echo refused", Command(kDont, kEcho), "", "", false},
      {"a request for the state in force is not answered",
       Command(kDo, kEcho) + Command(kDo, kEcho) + Command(kDont, kEcho) + Command(kDont, kEcho),
       "", Command(kWont, kEcho), false},
      {"echo asked for without the offer", Command(kDo, kEcho), "", Command(kWill, kEcho), true,
       false},
      {"other options refused, the client's echo too",
       Command(kDo, kTerminalType) + Command(kWill, kWindowSize) + Command(kWill, kEcho), "",
       Command(kWont, kTerminalType) + Command(kDont, kWindowSize) + Command(kDont, kEcho), true},
      {"the client's go-ahead suppressed once",
       Command(kWill, kGoAhead) + Command(kWill, kGoAhead) + Command(kWont, kGoAhead) +
           Command(kWont, kGoAhead),
       "", Command(kDo, kGoAhead) + Command(kDont, kGoAhead), true},
      {"IAC IAC is a data byte", "a\xff\xffz", "a\xffz", "", false},
      {"subnegotiation skipped", "\xff\xfa\x18\x00xt\xff\xff\r\xff\xf0ok"s, "ok", "", true},
      {"subnegotiation cut short by a command",
       "\xff\xfa\x1f\x00P"s + Command(kDo, kTerminalType) + "z", "z", Command(kWont, kTerminalType),
       true},
      {"commands without effect", "\xff\xf1\xff\xf6x", "x", "", true},
      {"CR NUL and CR LF are one line end", "a\r\0b\r\nc\n\r\r\n"s, "a\rb\rc\n\r\r", "", false},
  };
  for (const Exchange& exchange : exchanges) {
    for (std::size_t readSize : {exchange.received.size(), std::size_t{1}}) {
      TelnetInput telnet;
      if (exchange.offered) {
        EXPECT_EQ(telnet.Open(), "\xff\xfb\x01\xff\xfb\x03");
      }
      TelnetFeed read;
      for (std::size_t at = 0; at < exchange.received.size(); at += readSize) {
        TelnetFeed part = telnet.Feed(exchange.received.substr(at, readSize));
        read.data += part.data;
        read.replies += part.replies;
      }
      std::string how = exchange.name + " in reads of "s + std::to_string(readSize);
      EXPECT_EQ(read.data, exchange.data) << how;
      EXPECT_EQ(read.replies, exchange.replies) << how;
      // the first read decides for a client that does not answer the offer
      if (readSize > 1 || exchange.data.size() < 3) {
        EXPECT_EQ(telnet.ServerEchoes(), exchange.serverEchoes) << how;
      }
    }
  }
}

TEST(TelnetTest, ClientThatDoesNotAnswerIsJudgedByItsFirstData) {
  for (auto [firstRead, echoes] : {std::pair{"RTRV-HDR:::1;\r\n", false}, {"R", true}}) {
    TelnetInput telnet;
    telnet.Open();
    telnet.Feed("\xff\xf1");  // commands alone decide nothing
    EXPECT_TRUE(telnet.ServerEchoes());
    telnet.Feed(firstRead);
    telnet.Feed("more data");
    EXPECT_EQ(telnet.ServerEchoes(), echoes) << firstRead;
    telnet.Feed(Command(echoes ? kDont : kDo, kEcho));
    EXPECT_EQ(telnet.ServerEchoes(), !echoes) << "an answer outweighs the guess";
  }
}

struct Opening {
  const char* name;
  std::string received, replies;
  TelnetInput::Negotiation negotiation;
  std::string terminalType;
};

// The command-line opening: the terminal type is asked for first, and only a client that names
// one other than "dumb" is offered echo and go-ahead suppression; no WONT or DONT is answered.
TEST(TelnetTest, CommandLineOpeningAsksForTheTerminalType) {
  using N = TelnetInput::Negotiation;
  const std::string send = "\xff\xfa\x18\x01\xff\xf0"s,
                    offer = Command(kWill, kGoAhead) + Command(kWill, kEcho);
  auto is = [](const std::string& name) { return "\xff\xfa\x18\x00"s + name + "\xff\xf0"; };
  const Opening openings[] = {
      {"names a terminal", Command(kWill, kTerminalType) + is("XTerm"), send + offer,
       N::kNegotiated, "xterm"},
      {"a dumb terminal, in any case", Command(kWill, kTerminalType) + is("DuMb"), send,
       N::kNotNegotiated, "dumb"},
      {"refuses", Command(kWont, kTerminalType), "", N::kNotNegotiated, ""},
      {"sends data first", "admin\r\n", "", N::kNotNegotiated, ""},
      {"agrees but has not named one", Command(kWill, kTerminalType), send, N::kPending, ""},
      {"WONT and DONT are never answered",
       Command(kWill, kTerminalType) + is("vt100") + Command(kDo, kEcho) + Command(kDont, kEcho) +
           Command(kWill, kGoAhead) + Command(kWont, kGoAhead),
       send + offer + Command(kDo, kGoAhead), N::kNegotiated, "vt100"},
      {"a long name is cut, the overflow dropped",
       Command(kWill, kTerminalType) + is(std::string(600, 'A')), send + offer, N::kNegotiated,
       std::string(40, 'a')},
  };
  for (const Opening& opening : openings) {
    for (std::size_t readSize : {opening.received.size(), std::size_t{1}}) {
      TelnetInput telnet;
      EXPECT_EQ(telnet.OpenAskingTerminalType(), Command(kDo, kTerminalType));
      std::string replies;
      for (std::size_t at = 0; at < opening.received.size(); at += readSize)
        replies += telnet.Feed(opening.received.substr(at, readSize)).replies;
      std::string how = opening.name + " in reads of "s + std::to_string(readSize);
      EXPECT_EQ(replies, opening.replies) << how;
      EXPECT_EQ(telnet.NegotiationState(), opening.negotiation) << how;
      EXPECT_EQ(telnet.TerminalType(), opening.terminalType) << how;
    }
  }
}

TEST(TelnetTest, UnsettledOpeningGivenUpIsServedByItsFirstData) {
  for (auto [firstRead, echoes] : {std::pair{"show version\r\n", false}, {"s", true}}) {
    TelnetInput telnet;
    telnet.OpenAskingTerminalType();
    telnet.Feed(Command(kWill, kTerminalType));
    telnet.GiveUpNegotiation();
    EXPECT_EQ(telnet.NegotiationState(), TelnetInput::Negotiation::kNotNegotiated);
    EXPECT_EQ(telnet.Feed("\xff\xfa\x18\x00xterm\xff\xf0"s).replies, "") << "too late";
    telnet.Feed(firstRead);
    EXPECT_EQ(telnet.ServerEchoes(), echoes) << firstRead;
  }
}

TEST(TelnetTest, EscapedDataReadsBackUnchanged) {
  std::string bytes;
  for (int byte = 0; byte < 256; ++byte)
    bytes.push_back(static_cast<char>(byte == '\r' ? 0 : byte));
  EXPECT_EQ(EscapeTelnetData(bytes).size(), 257u);
  EXPECT_EQ(TelnetInput().Feed(EscapeTelnetData(bytes)).data, bytes);
}

}  // namespace
}  // namespace tessel
