#include "tl1/tl1_engine.h"

#include <array>
#include <utility>

#include "base/log.h"

namespace tessel {
namespace {

bool IsCommand(const Tl1InputCmd& cmd, std::string_view verb, std::string_view modifier) {
  return cmd.verb == verb && cmd.modifier1 == modifier && !cmd.modifier2;
}

std::optional<std::string> NullUnlessBothSet(const std::string& text, const std::string& other) {
  if (text.empty() || other.empty()) return std::nullopt;
  return text;
}

Tl1HostQuery MakeHostQuery(const Tl1InputCmd& cmd, const Tl1Agent& agent) {
  Tl1HostQuery query;
  query.verb = cmd.verb;
  query.modifier1 = cmd.modifier1;
  query.modifier2 = cmd.modifier2;
  query.aidText = cmd.aidText;
  if (!cmd.payloadBlocks.empty()) query.parameters = cmd.payloadBlocks.front().params;
  query.agentId = agent.agentId;
  query.agentAddress = agent.ipAddress;
  query.agentPort = agent.port;
  query.hostText1 = NullUnlessBothSet(agent.hostText1, agent.hostText2);
  query.hostText2 = NullUnlessBothSet(agent.hostText2, agent.hostText1);
  query.hostText3 = agent.hostText3;
  query.hostText2Again = agent.hostText2;
  return query;
}

// The host's error codes that stand for a standard error of the table, with its two lines.
constexpr std::array<std::pair<std::string_view, int>, 4> kStandardHostErrors{
    {{"IIAC", kErrorIiac}, {"IIDT", kErrorIidt}, {"IISP", kErrorIisp}, {"IITA", kErrorIita}}};

int HostErrorElements(const std::vector<std::optional<std::string>>& answer,
                      std::vector<Tl1TextElement>* elements) {
  std::string code = answer.size() > 1 ? answer[1].value_or("") : "";
  if (code.empty()) return kDeny;
  for (auto [name, number] : kStandardHostErrors) {
    if (code == name) {
      OutputErrorFormatter(elements, number);
      return kDeny;
    }
  }
  elements->push_back({kTl1PlainLine, code});
  if (answer.size() > 2 && answer[2]) elements->push_back({kTl1QuotedLine, *answer[2]});
  return kDeny;
}

// Each element after the completion code is "T TEXT": T 0 quoted, 1 plain, 2 comment, else quoted.
void HostLineElements(const std::vector<std::optional<std::string>>& answer,
                      std::vector<Tl1TextElement>* elements) {
  for (std::size_t i = 1; i < answer.size(); ++i) {
    if (!answer[i] || answer[i]->empty()) continue;
    const std::string& line = *answer[i];
    std::uint8_t type = line[0] == '1'   ? kTl1PlainLine
                        : line[0] == '2' ? kTl1CommentLine
                                         : kTl1QuotedLine;
    elements->push_back({type, line.size() > 2 ? line.substr(2) : ""});
  }
}

// The completion code of a host's response block, its lines put into elements.
int InterpretHostAnswer(const HostAnswer& answer, std::vector<Tl1TextElement>* elements) {
  if (!answer || answer->empty() || !(*answer)[0]) return kDeny;
  const std::string& first = *(*answer)[0];
  if (first == "ErrorCode") return HostErrorElements(*answer, elements);
  if (first.size() != 1 || first[0] < '1' || first[0] > '5') {
    LOG_ERROR("\n\tTL1 host answered the completion code \"%s\"\n", first.c_str());
    return kDeny;
  }
  HostLineElements(*answer, elements);
  return first[0] - '0';
}

void ReplaceCtag(std::vector<Tl1TextElement>* elements, const std::string& ctag) {
  static constexpr std::string_view kPlaceholder = "{CTAG}";
  for (Tl1TextElement& element : *elements) {
    for (std::size_t at = element.text.find(kPlaceholder); at != std::string::npos;
         at = element.text.find(kPlaceholder, at + ctag.size())) {
      element.text.replace(at, kPlaceholder.size(), ctag);
    }
  }
}

std::string UpperCase(std::string_view text) {
  std::string upper(text);
  for (char& c : upper) {
    if (c >= 'a' && c <= 'z') c = static_cast<char>(c - 'a' + 'A');
  }
  return upper;
}

}  // namespace

std::string RedactForLog(std::string_view text) {
  if (UpperCase(text.substr(0, text.find(':'))) != "ACT-USER") return std::string(text);
  std::size_t colon = 0;
  for (int field = 0; field < 4; ++field) {
    colon = text.find(':', colon);
    if (colon == std::string_view::npos) return std::string(text);
    ++colon;
  }
  return std::string(text.substr(0, colon)) + "...";
}

Tl1Engine::Tl1Engine(const Tl1CommandRegistry* registry, Tl1PendingList* pending, HostBridge* host,
                     Tl1LocalTime localTime)
    : registry_(registry), pending_(pending), host_(host), localTime_(std::move(localTime)) {}

HostBridge* Tl1Engine::Host() const { return host_ ? host_ : InstalledHost(); }

void Tl1Engine::Respond(const Tl1SessionContext& session, const std::optional<std::string>& ctag,
                        int completionCode, const std::vector<Tl1TextElement>& elements,
                        Tl1EngineResult* result) const {
  std::string_view sid = session.agent ? std::string_view(session.agent->sid) : "";
  for (std::string& text : OutputFormattor(sid, localTime_(), ctag, completionCode, elements)) {
    result->outputs.push_back({std::move(text), Tl1OutputKind::kResponse});
  }
}

Tl1EngineResult Tl1Engine::Deny(const Tl1SessionContext& session,
                                const std::optional<std::string>& ctag, int errorNumber) const {
  Tl1EngineResult result{{}, session.loggedIn, false};
  std::vector<Tl1TextElement> elements;
  OutputErrorFormatter(&elements, errorNumber);
  Respond(session, ctag, kDeny, elements, &result);
  return result;
}

Tl1EngineResult Tl1Engine::Schedule(const Tl1InputCmd& cmd, const std::string& text,
                                    const Tl1SessionContext& session) const {
  if (!pending_ || !pending_->AddToPendingbuffer(cmd, session.sessionId, RedactForLog(text))) {
    return Deny(session, cmd.ctag, kErrorSaas);
  }
  Tl1EngineResult result{{}, session.loggedIn, false};
  Respond(session, cmd.ctag, kDelay, {}, &result);
  return result;
}

Tl1EngineResult Tl1Engine::TL1Engine(std::string_view message,
                                     const Tl1SessionContext& session) const {
  std::size_t start = message.find_first_not_of("\r\n");
  if (start == std::string_view::npos) return {{}, session.loggedIn, false};
  std::string text(message.substr(start));
  if (int ack = PrepareTL1Message(&text)) {
    LOG_TRACE("\n\tTL1 session %llu: message of %zu bytes answered %s\n",
              static_cast<unsigned long long>(session.sessionId), message.size(), AckCodeWord(ack));
    return {{{AckFormatter(ack, "0"), Tl1OutputKind::kAcknowledgment}}, session.loggedIn, false};
  }
  LOG_TRACE("\n\tTL1 session %llu: %s\n", static_cast<unsigned long long>(session.sessionId),
            RedactForLog(text).c_str());
  Tl1InputCmd cmd;
  int errorNumber = kErrorIicm;
  if (!InputCmdParser(&cmd, text, &errorNumber)) return Deny(session, cmd.ctag, errorNumber);
  if (session.loginRequired && !session.loggedIn && !IsCommand(cmd, "ACT", "USER")) {
    return Deny(session, cmd.ctag, kErrorPlna);
  }
  if (!registry_->FindTL1Command(cmd)) return Deny(session, cmd.ctag, kErrorScnf);
  // A command for another system is refused before it waits, not when it runs.
  if (session.agent && cmd.tid && *cmd.tid != session.agent->sid) {
    return Deny(session, cmd.ctag, kErrorIita);
  }
  if (cmd.generalBlock) return Schedule(cmd, text, session);
  return ExecuteCommand(cmd, session);
}

Tl1EngineResult Tl1Engine::ExecuteCommand(const Tl1InputCmd& cmd,
                                          const Tl1SessionContext& session) const {
  Tl1EngineResult result{{}, session.loggedIn, false};
  HostBridge* host = Host();
  if (!session.agent || !host) {
    Respond(session, cmd.ctag, kDeny, {}, &result);
    return result;
  }
  if (cmd.tid && *cmd.tid != session.agent->sid) return Deny(session, cmd.ctag, kErrorIita);
  Tl1HostQuery query = MakeHostQuery(cmd, *session.agent);
  std::int32_t ack = host->Tl1GetAck(query);
  std::string ctag = cmd.ctag.value_or("0");
  if (AckCodeWord(ack)) {
    result.outputs.push_back({AckFormatter(ack, ctag), Tl1OutputKind::kAcknowledgment});
    if (ack > 2) return result;  // NA, RL, OK and NG end the command
  }
  std::vector<Tl1TextElement> elements;
  int completionCode = InterpretHostAnswer(host->Tl1GetResponseBlock(query), &elements);
  ReplaceCtag(&elements, ctag);
  Respond(session, cmd.ctag, completionCode, elements, &result);
  if (completionCode == kCompld && IsCommand(cmd, "ACT", "USER")) result.loggedIn = true;
  if (completionCode == kCompld && IsCommand(cmd, "CANC", "USER")) {
    result.loggedIn = false;
    result.closeSession = true;
  }
  return result;
}

}  // namespace tessel
