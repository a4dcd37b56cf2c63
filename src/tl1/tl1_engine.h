// The TL1 command engine: one received message of one session becomes the texts to send back
// (acknowledgments and responses, in order), asking the host for the acknowledgment and the
// response block. It also keeps the session's login state: with login required, only ACT-USER is
// served until an ACT-USER is answered COMPLD; a COMPLD answer to CANC-USER closes the session.
// The engine keeps no state between messages; any number of threads may use one engine at once.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "engine/host_bridge.h"
#include "tl1/command_registry.h"
#include "tl1/input_cmd.h"
#include "tl1/pending_list.h"
#include "tl1/response_format.h"

namespace tessel {

// A TL1 agent as the engine needs it: its identity for the host and its SID for headers and the
// TID check.
struct Tl1Agent {
  std::int32_t agentId = 0;
  std::string sid;
  std::string ipAddress;
  std::uint16_t port = 0;
  std::string hostText1;
  std::string hostText2;
  std::string hostText3;
};

struct Tl1SessionContext {
  std::uint64_t sessionId = 0;
  const Tl1Agent* agent = nullptr;  // nullptr: the agent is gone, commands are denied
  bool loginRequired = false;
  bool loggedIn = false;
};

enum class Tl1OutputKind : std::int32_t { kAutonomous = 1, kResponse = 2, kAcknowledgment = 3 };

struct Tl1Output {
  std::string text;
  Tl1OutputKind kind;
  bool operator==(const Tl1Output&) const = default;
};

struct Tl1EngineResult {
  std::vector<Tl1Output> outputs;  // empty for a message of only line ends
  bool loggedIn = false;           // the session's login state after this message
  bool closeSession = false;       // close once the outputs and their prompt are sent
};

class Tl1Engine {
 public:
  // host nullptr: the installed host at each call. pending nullptr: delayed activation is refused.
  Tl1Engine(const Tl1CommandRegistry* registry, Tl1PendingList* pending, HostBridge* host,
            Tl1LocalTime localTime = SystemLocalTime);

  Tl1EngineResult TL1Engine(std::string_view message, const Tl1SessionContext& session) const;
  // Acknowledgment, host call and response for a parsed command, as when a delayed one runs.
  Tl1EngineResult ExecuteCommand(const Tl1InputCmd& cmd, const Tl1SessionContext& session) const;

 private:
  HostBridge* Host() const;
  // Appends the response texts to result.
  void Respond(const Tl1SessionContext& session, const std::optional<std::string>& ctag,
               int completionCode, const std::vector<Tl1TextElement>& elements,
               Tl1EngineResult* result) const;
  Tl1EngineResult Deny(const Tl1SessionContext& session, const std::optional<std::string>& ctag,
                       int errorNumber) const;
  Tl1EngineResult Schedule(const Tl1InputCmd& cmd, const std::string& text,
                           const Tl1SessionContext& session) const;

  const Tl1CommandRegistry* registry_;
  Tl1PendingList* pending_;
  HostBridge* host_;
  Tl1LocalTime localTime_;
};

// The command text fit for the log: an ACT-USER keeps only its fields up to the CTAG, so that
// the password is never written.
std::string RedactForLog(std::string_view text);

}  // namespace tessel
