#include "cli/cli_session.h"

#include <charconv>
#include <utility>

namespace tessel {

const char* const kCliBanner =
    "----------------------------------------------------------------\r\n"
    "  Tessel simulated network device\r\n"
    "  Authorised access only; activity on this device is recorded.\r\n"
    "----------------------------------------------------------------\r\n";
const char* const kCliLoginFailed = "% Authentication failed";
const char* const kCliBadSecrets = "% Bad Secrets";

namespace {

constexpr std::uint32_t kAttempts = 3;

std::string_view Trimmed(std::string_view line) {
  std::size_t first = line.find_first_not_of(" \t");
  if (first == std::string_view::npos) return {};
  std::size_t last = line.find_last_not_of(" \t");
  return line.substr(first, last - first + 1);
}

std::optional<std::int64_t> Number(const std::string& text) {
  std::int64_t value = 0;
  std::string_view digits = Trimmed(text);
  auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), value);
  if (error != std::errc() || end != digits.data() + digits.size()) return std::nullopt;
  return value;
}

}  // namespace

std::string WithCrLf(std::string_view text) {
  std::string out;
  out.reserve(text.size() + text.size() / 16);
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (text[i] == '\n' && (i == 0 || text[i - 1] != '\r')) out.push_back('\r');
    out.push_back(text[i]);
  }
  return out;
}

CliSession::CliSession(CliSessionEnvironment environment, std::uint32_t agentId, bool loggedIn)
    : environment_(std::move(environment)), agentId_(agentId), mode_(kCliModeUserName) {
  if (!loggedIn) return;
  std::optional<CliAgent> agent = Agent();
  mode_ = agent && agent->telnetServer ? kCliModeTelnetShell : kCliModeUserExec;
}

HostBridge* CliSession::Host() const {
  return environment_.host ? environment_.host : InstalledHost();
}

std::optional<CliAgent> CliSession::Agent() const { return environment_.agents->Find(agentId_); }

std::string CliSession::Open() {
  if (mode_ != kCliModeUserName) return Prompt();
  return std::string(kCliBanner) + "\r\n" + Prompt();
}

std::string CliSession::Prompt() const {
  std::optional<CliAgent> agent = Agent();
  return environment_.prompts->Prompt(mode_, agent ? agent->deviceName : std::string());
}

LineEditor::Masking CliSession::Masking() const {
  if (mode_ == kCliModeLoginPassword) return LineEditor::Masking::kHidden;
  if (mode_ == kCliModeEnableSecret) return LineEditor::Masking::kStars;
  return LineEditor::Masking::kNone;
}

std::string CliSession::Reply(std::string text) const {
  text = WithCrLf(text);
  if (!text.empty() && !text.ends_with("\r\n")) text += "\r\n";
  return text + Prompt();
}

std::int32_t CliSession::NextMode(std::int32_t current, std::int32_t value, bool enableByTelnet) {
  if (current >= kCliModePrivilegedExec && value >= kCliModeUserExec) return value;
  if (current != kCliModeUserExec) return current;
  if (value == kCliModePrivilegedExec)
    return enableByTelnet ? kCliModeEnableSecret : kCliModePrivilegedExec;
  if (value == kCliModeClosing || value > kCliModeLastBuiltIn) return value;
  return current;
}

CliAnswer CliSession::Line(std::string_view line) {
  CliAnswer answer;
  switch (mode_) {
    case kCliModeUserName:
      if (!line.empty()) {
        userName_ = line;
        mode_ = kCliModeLoginPassword;
      }
      answer.text = Prompt();
      return answer;
    case kCliModeLoginPassword:
      return LoginPassword(line);
    case kCliModeEnableSecret:
      return EnableSecret(line);
    case kCliModeUserExec:
    case kCliModePrivilegedExec:
      line = Trimmed(line);
      break;
    default:
      break;
  }
  if (Trimmed(line).empty()) {
    answer.text = Prompt();
    return answer;
  }
  return Command(std::string(line));
}

CliAnswer CliSession::LoginPassword(std::string_view password) {
  CliAnswer answer;
  std::optional<CliAgent> agent = Agent();
  if (agent && userName_ == agent->userName && password == agent->password) {
    mode_ = agent->telnetServer ? kCliModeTelnetShell : kCliModeUserExec;
    answer.loggedIn = true;
    answer.text = Prompt();
    return answer;
  }
  userName_.clear();
  mode_ = kCliModeUserName;
  answer.close = ++loginFailures_ >= kAttempts;
  answer.text = std::string(kCliLoginFailed) + "\r\n";
  if (!answer.close) answer.text += "\r\n" + Prompt();
  return answer;
}

CliAnswer CliSession::EnableSecret(std::string_view secret) {
  CliAnswer answer;
  std::optional<CliAgent> agent = Agent();
  if (agent && secret == agent->enablePassword) {
    enableFailures_ = 0;
    mode_ = kCliModePrivilegedExec;
    answer.text = Prompt();
    return answer;
  }
  if (++enableFailures_ < kAttempts) {
    answer.text = Prompt();
    return answer;
  }
  enableFailures_ = 0;
  mode_ = kCliModeUserExec;
  answer.text = Reply(kCliBadSecrets);
  return answer;
}

CliHostQuery CliSession::Query(std::string_view line, const CliAgent& agent) const {
  return {std::string(line), mode_,           agent.hostText1, agent.hostText2, agent.hostText3,
          agent.hostText4,   agent.ipAddress, agent.port,      context_};
}

CliAnswer CliSession::Command(std::string line) {
  CliAnswer answer;
  std::optional<CliAgent> agent = Agent();
  HostBridge* host = Host();
  std::string text;
  if (agent && host) {
    HostAnswer reply = host->CliEnterResponse(Query(line, *agent));
    answer.answered = true;
    if (reply) ApplyReply(*reply, &text, &answer);
  }
  if (mode_ == kCliModeClosing) {
    answer.close = true;
    answer.text = WithCrLf(text);
    return answer;
  }
  answer.text = Reply(std::move(text));
  return answer;
}

void CliSession::ApplyReply(const std::vector<std::optional<std::string>>& reply, std::string* text,
                            CliAnswer* answer) {
  for (std::size_t i = 0; i < reply.size(); i += 2) {
    const std::string key = reply[i].value_or("");
    const std::string value = i + 1 < reply.size() ? reply[i + 1].value_or("") : std::string();
    Apply(key, value, text, answer);
  }
}

void CliSession::Apply(const std::string& key, const std::string& value, std::string* text,
                       CliAnswer* answer) {
  if (key == "level") {
    std::optional<std::int64_t> level = Number(value);
    std::optional<CliAgent> agent = Agent();
    if (level && *level >= INT32_MIN && *level <= INT32_MAX)
      mode_ = NextMode(mode_, static_cast<std::int32_t>(*level), agent && agent->enableByTelnet);
    if (mode_ <= kCliModeGlobalConfig) context_.clear();
    environment_.prompts->ClearOverride();
  } else if (key == "context") {
    context_ = value;
  } else if (key == "devicename") {
    environment_.agents->Update(agentId_, [&](CliAgent& agent) { agent.deviceName = value; });
  } else if (key == "history") {
    std::vector<std::string> lines =
        environment_.history ? environment_.history() : std::vector<std::string>{};
    for (const std::string& line : lines) *text += line + "\r\n";
  } else if (key == "historysize") {
    std::optional<std::int64_t> size = Number(value);
    if (size && *size >= 0) answer->historySize = static_cast<std::size_t>(*size);
  } else if (key == "timeout") {
    std::optional<std::int64_t> seconds = Number(value);
    if (seconds && *seconds >= 0 && *seconds <= UINT32_MAX) {
      environment_.agents->Update(agentId_, [&](CliAgent& agent) {
        agent.keepAliveSeconds = static_cast<std::uint32_t>(*seconds);
      });
      answer->keepAliveChanged = true;
    }
  } else if (key == "enablepassword") {
    std::size_t colon = value.find(':');
    environment_.agents->Update(agentId_, [&](CliAgent& agent) {
      agent.enablePassword = value.substr(0, colon);
      agent.enableByTelnet = colon != std::string::npos && value.substr(colon + 1) == "1";
    });
  } else if (key == "password") {
    environment_.agents->Update(agentId_, [&](CliAgent& agent) { agent.password = value; });
  } else if (key == "update" || key == "telnet") {
    // nothing the engine keeps
  } else {
    *text += value;  // "response", and any key the engine does not know
  }
}

CliAnswer CliSession::Help(std::string_view line) {
  CliAnswer answer;
  std::string help;
  std::optional<CliAgent> agent = Agent();
  HostBridge* host = Host();
  if (mode_ >= kCliModeUserExec && agent && host)
    help = WithCrLf(host->CliQuestionResponse(Query(line, *agent)).value_or(""));
  if (!help.empty() && !help.ends_with("\r\n")) help += "\r\n";
  answer.text = "\r\n" + help + Prompt();
  answer.showLine = true;
  return answer;
}

CliAnswer CliSession::Complete(std::string_view line) {
  CliAnswer answer;
  std::optional<CliAgent> agent = Agent();
  HostBridge* host = Host();
  if (mode_ < kCliModeUserExec || !agent || !host) return answer;
  std::optional<std::string> completed = host->CliTabResponse(Query(line, *agent));
  if (completed && !completed->empty() && completed->find_first_of("\r\n") == std::string::npos)
    answer.line = std::move(*completed);
  return answer;
}

// Ctrl-Z leaves any configuration mode for privileged EXEC; elsewhere it only asks again.
CliAnswer CliSession::Suspend() {
  CliAnswer answer;
  if (mode_ >= kCliModeGlobalConfig && mode_ != kCliModeClosing && mode_ != kCliModeTelnetShell) {
    mode_ = kCliModePrivilegedExec;
    context_.clear();
  }
  answer.text = Prompt();
  return answer;
}

}  // namespace tessel
