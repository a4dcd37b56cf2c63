// Feeds arbitrary client bytes through the telnet reader and the line editor of an interactive
// session, once at once and once in small reads, and checks that the split changes nothing,
// that every answer is a well-formed option command, that a repeated request is not answered
// again, and that no completed line holds a line end or reaches the line limit.
#include <strings.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "transport/line_editor.h"
#include "transport/telnet.h"

namespace tessel {
namespace {

std::vector<std::string> CompleteCommand(std::string_view prefix) {
  std::string word(prefix);
  std::vector<std::string> matches;
  for (const char* command : {"RTRV-HDR", "RTRV-ALM-ALL", "ACT-USER", "CANC-USER"})
    if (strncasecmp(command, word.c_str(), word.size()) == 0) matches.push_back(command);
  return matches;
}

struct Session {
  std::string replies, output;
  std::vector<std::string> lines;
};

void Fail(const char* what) {
  std::fprintf(stderr, "%s\n", what);
  abort();
}

Session Run(std::string_view input, std::size_t readSize, bool echo, TelnetInput* telnet) {
  LineEditor editor("TL1>>", CompleteCommand);
  editor.SetEcho(echo);
  Session session;
  telnet->Open();
  for (std::size_t at = 0; at < input.size(); at += readSize) {
    TelnetFeed read = telnet->Feed(input.substr(at, readSize));
    LineEditor::Result edited = editor.Feed(read.data);
    session.replies += read.replies;
    session.output += edited.output;
    session.lines.insert(session.lines.end(), edited.lines.begin(), edited.lines.end());
  }
  return session;
}

void CheckReplies(std::string_view replies) {
  if (replies.size() % 3 != 0) Fail("an answer is not three bytes long");
  for (std::size_t at = 0; at < replies.size(); at += 3) {
    auto verb = static_cast<std::uint8_t>(replies[at + 1]);
    if (static_cast<std::uint8_t>(replies[at]) != kTelnetIac || verb < kTelnetWill)
      Fail("an answer is not an option command");
  }
}

// Whatever state the input left the options in, a request repeated at once is not answered a
// second time (a refused one is refused again: it asks again for a change): an end that answers
// only changes of state cannot keep a negotiation going.
void CheckRepeatsUnanswered(TelnetInput* telnet, std::uint8_t someOption) {
  telnet->Feed("\xff\xf0\xff\xf0");  // back to data, whatever command the input broke off
  for (std::uint8_t verb : {kTelnetDo, kTelnetDont, kTelnetWill, kTelnetWont}) {
    for (std::uint8_t option : {kTelnetEcho, kTelnetSuppressGoAhead, someOption}) {
      const char bytes[] = {static_cast<char>(kTelnetIac), static_cast<char>(verb),
                            static_cast<char>(option)};
      std::string_view request(bytes, sizeof bytes);
      std::string first = telnet->Feed(request).replies, second = telnet->Feed(request).replies;
      CheckReplies(first);
      std::uint8_t refusal = verb == kTelnetDo ? kTelnetWont : kTelnetDont;
      bool refused = (verb == kTelnetDo || verb == kTelnetWill) && first.size() == 3 &&
                     static_cast<std::uint8_t>(first[1]) == refusal;
      if (refused ? second != first : !second.empty()) Fail("a repeated request is answered again");
    }
  }
}

}  // namespace
}  // namespace tessel

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  std::size_t readSize = 1 + data[0] % 16;
  bool echo = (data[0] & 0x80) == 0;
  std::string_view input(reinterpret_cast<const char*>(data) + 1, size - 1);
  tessel::TelnetInput whole, split;
  tessel::Session atOnce = tessel::Run(input, input.size() + 1, echo, &whole);
  tessel::Session inReads = tessel::Run(input, readSize, echo, &split);
  if (atOnce.replies != inReads.replies || atOnce.output != inReads.output ||
      atOnce.lines != inReads.lines)
    tessel::Fail("reading in parts changes the result");
  tessel::CheckReplies(atOnce.replies);
  for (const std::string& line : atOnce.lines) {
    if (line.find_first_of("\r\n") != std::string::npos) tessel::Fail("a line holds a line end");
    if (line.size() >= tessel::LineEditor::kLineLimit) tessel::Fail("a line reaches the limit");
  }
  tessel::CheckRepeatsUnanswered(&whole, data[size - 1]);
  return 0;
}
