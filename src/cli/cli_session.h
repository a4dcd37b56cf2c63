// What one CLI session does with each line, help request, completion request and Ctrl-Z: the
// login dialogue against its agent's user (three failures close the session), the enable secret
// (three wrong ones give "% Bad Secrets"), the mode with its prompt, and the exchange with the
// host that answers every command. The answer is the text to send (the reply and the next
// prompt, CR LF line ends) and what the session's input must do next. A session starting over
// SSH is logged in already and starts in user EXEC.
//
// Threads: one thread at a time per session (the service's worker holding it). The agents,
// prompts and host it is given are thread-safe and outlive it. Secrets typed are never logged.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "cli/cli_agents.h"
#include "cli/cli_prompts.h"
#include "engine/host_bridge.h"
#include "transport/line_editor.h"

namespace tessel {

// The text a client sees when it connects, before the login prompt: nothing in it reads as a
// prompt or a question for credentials.
extern const char* const kCliBanner;
extern const char* const kCliLoginFailed;
extern const char* const kCliBadSecrets;

struct CliAnswer {
  std::string text;                 // to send: the reply, then the prompt
  bool close = false;               // after text is sent
  std::optional<std::string> line;  // the line being typed becomes this (a completion)
  bool showLine = false;            // the line typed so far is shown again after text
  std::optional<std::size_t> historySize;
  bool keepAliveChanged = false;  // the agent's idle limit changed
  bool loggedIn = false;          // this line logged the session in
  bool answered = false;          // the host answered a command
};

struct CliSessionEnvironment {
  CliAgents* agents = nullptr;
  CliPrompts* prompts = nullptr;
  HostBridge* host = nullptr;                         // nullptr: the installed host
  std::function<std::vector<std::string>()> history;  // the session's lines, oldest first
};

class CliSession {
 public:
  CliSession(CliSessionEnvironment environment, std::uint32_t agentId, bool loggedIn);

  // The first text of the session: the banner and the login prompt, or the prompt of a session
  // that starts logged in.
  std::string Open();
  CliAnswer Line(std::string_view line);
  CliAnswer Help(std::string_view line);
  CliAnswer Complete(std::string_view line);
  CliAnswer Suspend();

  std::int32_t Mode() const { return mode_; }
  const std::string& Context() const { return context_; }
  // How the next line is shown as it is typed: not at all for the login password, as '*' for
  // the enable secret.
  LineEditor::Masking Masking() const;
  std::string Prompt() const;

  // The mode a host's "level" value leads to from the current one.
  static std::int32_t NextMode(std::int32_t current, std::int32_t value, bool enableByTelnet);

 private:
  HostBridge* Host() const;
  std::optional<CliAgent> Agent() const;
  CliAnswer LoginPassword(std::string_view password);
  CliAnswer EnableSecret(std::string_view secret);
  CliAnswer Command(std::string line);
  void ApplyReply(const std::vector<std::optional<std::string>>& reply, std::string* text,
                  CliAnswer* answer);
  void Apply(const std::string& key, const std::string& value, std::string* text,
             CliAnswer* answer);
  CliHostQuery Query(std::string_view line, const CliAgent& agent) const;
  // The reply's text with CR LF line ends and a line end after it, then the prompt.
  std::string Reply(std::string text) const;

  CliSessionEnvironment environment_;
  const std::uint32_t agentId_;
  std::int32_t mode_;
  std::string userName_;
  std::string context_;
  std::uint32_t loginFailures_ = 0;
  std::uint32_t enableFailures_ = 0;
};

// Text from the host with "\n" line ends, with "\r\n" ones.
std::string WithCrLf(std::string_view text);

}  // namespace tessel
