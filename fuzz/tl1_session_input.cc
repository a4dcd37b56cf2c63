// Feeds arbitrary client bytes into a TL1 session's input, raw or telnet, once at once and once in
// small reads, and every message it gives into the command engine. A raw session's messages must
// each end at their only ';' outside quotes and stay within the limit; without an overflow the
// read boundaries change nothing and the messages are the input itself, up to its last ';'.
#include "tl1/tl1_session_input.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>
#include <vector>

#include "support/memory_host.h"
#include "tl1/tl1_engine.h"

namespace tessel {
namespace {

void Fail(const char* what) {
  std::fprintf(stderr, "%s\n", what);
  abort();
}

std::vector<std::string> Codes(std::string_view) { return {"RTRV-HDR", "ACT-USER"}; }

std::vector<Tl1InputEvent> Run(std::string_view input, std::size_t readSize, bool interactive) {
  Tl1SessionInput session(interactive, Codes);
  session.Open();
  std::vector<Tl1InputEvent> events;
  for (std::size_t at = 0; at < input.size(); at += readSize) {
    Tl1InputResult result = session.Feed(input.substr(at, readSize));
    events.insert(events.end(), result.events.begin(), result.events.end());
  }
  return events;
}

// The ';' that ends a message, counted outside double quotes; npos when there is none.
std::size_t Terminator(std::string_view message) {
  bool inQuotes = false;
  for (std::size_t i = 0; i < message.size(); ++i) {
    if (message[i] == '"') inQuotes = !inQuotes;
    if (message[i] == ';' && !inQuotes) return i;
  }
  return std::string_view::npos;
}

void CheckRaw(std::string_view input, const std::vector<Tl1InputEvent>& atOnce,
              const std::vector<Tl1InputEvent>& inReads) {
  bool overflow = false;
  std::string joined;
  for (const Tl1InputEvent& event : atOnce) {
    if (event.kind == Tl1InputEvent::Kind::kEmptyLine) Fail("a raw session gave an empty line");
    if (event.kind == Tl1InputEvent::Kind::kOverflow) {
      overflow = true;
      continue;
    }
    if (Terminator(event.text) + 1 != event.text.size()) Fail("a message does not end at its ';'");
    if (event.text.size() > Tl1SessionInput::kMessageLimit + 1) Fail("a message passes the limit");
    joined += event.text;
  }
  for (const Tl1InputEvent& event : inReads) {
    overflow = overflow || event.kind == Tl1InputEvent::Kind::kOverflow;
  }
  if (overflow) return;
  if (atOnce != inReads) Fail("reading in parts changes the messages");
  if (input.substr(0, joined.size()) != joined) Fail("the messages are not the input");
}

void Answer(const std::vector<Tl1InputEvent>& events) {
  static MemoryHost host;
  static Tl1CommandRegistry registry;
  if (registry.Codes().empty()) {
    registry.RegisterCmd("RTRV-HDR");
    registry.RegisterCmd("ACT-USER");
  }
  static Tl1PendingList pending([] { return std::time_t{1718000000}; });
  static Tl1Engine engine(&registry, &pending, &host, [] { return std::tm{}; });
  static const Tl1Agent agent{7, "NE1", "127.0.0.1", 3083, "", "", ""};
  Tl1SessionContext context{(7ull << 32) | 1, &agent, true, false};
  for (const Tl1InputEvent& event : events) {
    if (event.kind != Tl1InputEvent::Kind::kMessage) continue;
    Tl1EngineResult result = engine.TL1Engine(event.text, context);
    context.loggedIn = result.loggedIn;
    for (const Tl1Output& output : result.outputs) {
      if (output.text.empty() || output.text.size() > kTl1ResponseSize)
        Fail("an answer is empty or too long");
    }
  }
  for (const Tl1PendingEntry& entry : pending.List()) pending.Cancel(entry.id);
}

}  // namespace
}  // namespace tessel

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  std::size_t readSize = 1 + data[0] % 16;
  bool interactive = (data[0] & 0x80) != 0;
  std::string_view input(reinterpret_cast<const char*>(data) + 1, size - 1);
  std::vector<tessel::Tl1InputEvent> atOnce = tessel::Run(input, input.size() + 1, interactive);
  std::vector<tessel::Tl1InputEvent> inReads = tessel::Run(input, readSize, interactive);
  if (!interactive) tessel::CheckRaw(input, atOnce, inReads);
  tessel::Answer(atOnce);
  return 0;
}
