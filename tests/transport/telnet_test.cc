#include "transport/telnet.h"

#include <gtest/gtest.h>

namespace tessel {
namespace {

using namespace std::string_literals;

std::string Command(std::uint8_t verb, std::uint8_t option) {
  return {static_cast<char>(kTelnetIac), static_cast<char>(verb), static_cast<char>(option)};
}

const std::string kIac = "\xff", kSb = "\xfa", kSe = "\xf0";
constexpr std::uint8_t kTerminalType = 24, kWindowSize = 31;

struct Exchange {
  const char* name;
  bool offered;  // the server sent its opening offer first
  std::string received;
  std::string data;
  std::string replies;
  bool serverEchoes;
};

// Each case is read at once and again one byte per read: a command may be split anywhere.
TEST(TelnetTest, OptionNegotiationAndCommandsInTheStream) {
  const Exchange exchanges[] = {
      {"client accepts the offers", true,
       Command(kTelnetDo, kTelnetEcho) + Command(kTelnetDo, kTelnetSuppressGoAhead) + "ab", "ab",
       "", true},
      {"client refuses echo", true, Command(kTelnetDont, kTelnetEcho), "", "", false},
      {"a request for the state in force is not answered", true,
       Command(kTelnetDo, kTelnetEcho) + Command(kTelnetDo, kTelnetEcho) +
           Command(kTelnetDont, kTelnetEcho) + Command(kTelnetDont, kTelnetEcho),
       "", Command(kTelnetWont, kTelnetEcho), false},
      {"echo asked for without the offer", false, Command(kTelnetDo, kTelnetEcho), "",
       Command(kTelnetWill, kTelnetEcho), true},
      {"other options refused, its own echo too", true,
       Command(kTelnetDo, kTerminalType) + Command(kTelnetWill, kWindowSize) +
           Command(kTelnetWill, kTelnetEcho),
       "",
       Command(kTelnetWont, kTerminalType) + Command(kTelnetDont, kWindowSize) +
           Command(kTelnetDont, kTelnetEcho),
       true},
      {"its go-ahead suppressed once", true,
       Command(kTelnetWill, kTelnetSuppressGoAhead) + Command(kTelnetWill, kTelnetSuppressGoAhead) +
           Command(kTelnetWont, kTelnetSuppressGoAhead) +
           Command(kTelnetWont, kTelnetSuppressGoAhead),
       "",
       Command(kTelnetDo, kTelnetSuppressGoAhead) + Command(kTelnetDont, kTelnetSuppressGoAhead),
       true},
      {"IAC IAC is a data byte", true, "a" + kIac + kIac + "b",
       "a\xff"
       "b",
       "", false},
      {"subnegotiation skipped", true,
       kIac + kSb + "\x18\x00xt"s + kIac + kIac + "\r" + kIac + kSe + "ok", "ok", "", true},
      {"subnegotiation cut short by a command", true,
       kIac + kSb + "\x1f\x00P"s + Command(kTelnetDo, kTerminalType) + "z", "z",
       Command(kTelnetWont, kTerminalType), true},
      {"commands without effect", true, kIac + "\xf1" + kIac + "\xf6x", "x", "", true},
      {"CR NUL and CR LF are one line end", true, "a\r\0b\r\nc\n\r\r\n"s, "a\rb\rc\n\r\r", "",
       false},
  };
  for (const Exchange& exchange : exchanges) {
    for (bool byteByByte : {false, true}) {
      TelnetInput telnet;
      if (exchange.offered) {
        EXPECT_EQ(telnet.Open(), "\xff\xfb\x01\xff\xfb\x03");
      }
      TelnetFeed read;
      std::string_view received = exchange.received;
      for (std::size_t at = 0; at < received.size();) {
        std::size_t length = byteByByte ? 1 : received.size();
        TelnetFeed part = telnet.Feed(received.substr(at, length));
        read.data += part.data;
        read.replies += part.replies;
        at += length;
      }
      std::string how = std::string(exchange.name) + (byteByByte ? " (byte by byte)" : "");
      EXPECT_EQ(read.data, exchange.data) << how;
      EXPECT_EQ(read.replies, exchange.replies) << how;
      if (!byteByByte || exchange.data.size() < 3) {
        EXPECT_EQ(telnet.ServerEchoes(), exchange.serverEchoes) << how;
      }
    }
  }
}

// A client that never answers the offer is judged by how it sends its first data.
TEST(TelnetTest, SilentClientJudgedByItsFirstData) {
  const std::pair<std::string, bool> firstReads[] = {
      {"RTRV-HDR:::1;\r\n", false}, {"R", true}, {"\r\n", true}};
  for (const auto& [read, echoes] : firstReads) {
    TelnetInput telnet;
    telnet.Open();
    EXPECT_TRUE(telnet.ServerEchoes());
    telnet.Feed(kIac + "\xf1");  // commands alone decide nothing
    telnet.Feed(read);
    telnet.Feed("more data");
    EXPECT_EQ(telnet.ServerEchoes(), echoes) << read;
  }
  TelnetInput late;
  late.Open();
  late.Feed("RTRV-HDR;\r");
  late.Feed(Command(kTelnetDo, kTelnetEcho));
  EXPECT_TRUE(late.ServerEchoes()) << "the client's answer outweighs the guess";
}

TEST(TelnetTest, EscapedDataReadsBackUnchanged) {
  std::string bytes;
  for (int byte = 0; byte < 256; ++byte)
    if (byte != '\r') bytes.push_back(static_cast<char>(byte));
  std::string escaped = EscapeTelnetData(bytes);
  EXPECT_EQ(escaped.size(), bytes.size() + 1);
  TelnetInput telnet;
  TelnetFeed read = telnet.Feed(escaped);
  EXPECT_EQ(read.data, bytes);
  EXPECT_EQ(read.replies, "");
}

}  // namespace
}  // namespace tessel
