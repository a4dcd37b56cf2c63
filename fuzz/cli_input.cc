// Feeds arbitrary client bytes through a command-line session's input (the Telnet opening and
// the line editor handing off one event at a time), answering each event as a worker would,
// once at once and once in small reads. Checks that the split changes no event, that no event
// line holds a line end or reaches the limit, and that a line typed under a hidden mask is never
// drawn and one under the star mask only as stars.
#include "cli/cli_input.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

namespace tessel {
namespace {

void Fail(const char* what) {
  std::fprintf(stderr, "%s\n", what);
  abort();
}

// Bytes a masked line may draw: line ends, and for stars the stars and the cursor moves.
void CheckMasked(LineEditor::Masking masking, std::string_view output) {
  std::string_view allowed =
      masking == LineEditor::Masking::kHidden ? "\r\n" : "\r\n*\x1b[0123456789CDK";
  if (output.find_first_not_of(allowed) != std::string_view::npos) Fail("a secret was drawn");
}

std::vector<CliInputEvent> Run(std::string_view input, std::size_t readSize) {
  CliInput session(true);
  session.Open();
  std::vector<CliInputEvent> events;
  auto masking = LineEditor::Masking::kNone;
  int lines = 0;
  auto answer = [&] {
    while (true) {
      std::string output;
      std::optional<CliInputEvent> event = session.Next(&output);
      if (masking != LineEditor::Masking::kNone) CheckMasked(masking, output);
      if (!event) return;
      if (event->text.find_first_of("\r\n") != std::string::npos) Fail("a line holds a line end");
      if (event->text.size() >= LineEditor::kLineLimit) Fail("a line reaches the limit");
      if (event->kind == CliInputEvent::Kind::kComplete) session.SetLine(event->text + "x");
      if (event->kind == CliInputEvent::Kind::kHelp) session.ShowLine();
      // As a session does, the masking changes only with a line: each third line is a
      // password, each third after it a secret.
      if (event->kind == CliInputEvent::Kind::kLine)
        masking = static_cast<LineEditor::Masking>(++lines % 3);
      events.push_back(std::move(*event));
      session.Answered(masking, "");
    }
  };
  for (std::size_t at = 0; at < input.size(); at += readSize) {
    session.Feed(input.substr(at, readSize));
    answer();
  }
  session.GiveUpNegotiation();
  answer();
  return events;
}

}  // namespace
}  // namespace tessel

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  std::size_t readSize = 1 + data[0] % 16;
  std::string_view input(reinterpret_cast<const char*>(data) + 1, size - 1);
  if (tessel::Run(input, input.size() + 1) != tessel::Run(input, readSize))
    tessel::Fail("reading in parts changes the events");
  return 0;
}
