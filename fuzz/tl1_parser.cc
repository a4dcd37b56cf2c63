// Feeds arbitrary bytes to the TL1 parser and, as one message of a session, to the command engine
// on the in-memory host, and checks what must hold for any input: a parsed command is well
// formed, and every output is an acknowledgment or a response of at most 4096 bytes with its
// terminator. The host answers with lines made of the input, so long lines are cut too.
#include <cstdint>
#include <cstdlib>
#include <string>

#include "support/memory_host.h"
#include "tl1/tl1_engine.h"

namespace tessel {
namespace {

void Check(bool condition) {
  if (!condition) std::abort();
}

void CheckParsed(std::string text) {
  if (PrepareTL1Message(&text) != 0) return;
  Tl1InputCmd cmd;
  int errorNumber = 0;
  if (!InputCmdParser(&cmd, text, &errorNumber)) {
    Check(Tl1Error(errorNumber) != nullptr);
    return;
  }
  Check(!cmd.verb.empty() && cmd.ctag && cmd.ctag->size() <= 6);
  Check(cmd.aidText ? cmd.aidParts.size() == cmd.aidSeparators.size() + 1 : cmd.aidParts.empty());
}

bool EndsWith(const std::string& text, const char* suffix) {
  return text.size() >= 3 && text.compare(text.size() - 3, 3, suffix) == 0;
}

}  // namespace
}  // namespace tessel

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tessel;
  std::string input(reinterpret_cast<const char*>(data), size);
  CheckParsed(input);

  static MemoryHost host;
  static Tl1CommandRegistry registry;
  static bool registered = [] {
    for (const char* code : {"RTRV-HDR", "RTRV-ALM", "ENT-EQPT", "ACT-USER", "CANC-USER"}) {
      registry.RegisterCmd(code);
    }
    return true;
  }();
  (void)registered;
  std::string longLine = "0 {CTAG}";
  while (longLine.size() < 9000 && !input.empty()) longLine += input;
  for (const char* code : {"RTRV-ALM", "RTRV-ALM-ALL"}) {
    host.SetTl1Reply(code, {1, HostAnswer{{"1", longLine, "1 {CTAG}", "2 x"}}});
  }
  host.SetTl1Reply("ENT-EQPT",
                   {static_cast<std::int32_t>(size % 8), HostAnswer{{"ErrorCode", input}}});

  Tl1PendingList pending([] { return std::time_t{1718000000}; });
  Tl1Engine engine(&registry, &pending, &host, [] { return std::tm{}; });
  Tl1Agent agent{1, "NE1", "127.0.0.1", 3083, "", "", ""};
  // Login is required where the input names CANC-USER, so that the seeds of other commands pass.
  Tl1SessionContext session{1ull << 32 | 1, &agent, input.find("CANC") != std::string::npos, false};
  for (const Tl1Output& output : engine.TL1Engine(input, session).outputs) {
    if (output.kind == Tl1OutputKind::kAcknowledgment) {
      Check(EndsWith(output.text, "\r\n<"));
    } else {
      Check(output.text.size() <= kTl1ResponseSize);
      Check(EndsWith(output.text, "\r\n;") || EndsWith(output.text, "\r\n>"));
    }
  }
  return 0;
}
