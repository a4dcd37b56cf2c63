#include "cli/cli_input.h"

#include <utility>

#include "base/log.h"

namespace tessel {
namespace {

LineEditor::Options CommandLineEditing() {
  LineEditor::Options options;
  options.echoCompletedLines = true;
  options.handOffRequests = true;
  return options;
}

CliInputEvent::Kind KindOf(LineEditor::Request::Kind kind) {
  switch (kind) {
    case LineEditor::Request::Kind::kComplete:
      return CliInputEvent::Kind::kComplete;
    case LineEditor::Request::Kind::kHelp:
      return CliInputEvent::Kind::kHelp;
    case LineEditor::Request::Kind::kSuspend:
      break;
  }
  return CliInputEvent::Kind::kSuspend;
}

}  // namespace

CliInput::CliInput(bool telnet)
    : telnet_(telnet), editor_("", LineEditor::Completion(), CommandLineEditing()) {}

std::string CliInput::Open() { return telnet_ ? telnetInput_.OpenAskingTerminalType() : ""; }

bool CliInput::Negotiated() const {
  return !telnet_ || telnetInput_.NegotiationState() == TelnetInput::Negotiation::kNegotiated;
}

std::string CliInput::Feed(std::string_view bytes) {
  std::string replies;
  std::string data;
  if (telnet_) {
    TelnetFeed feed = telnetInput_.Feed(bytes);
    replies = std::move(feed.replies);
    data = std::move(feed.data);
  } else {
    data = bytes;
  }
  std::size_t room = kTypedAheadLimit - std::min(kTypedAheadLimit, typedAhead_.size());
  if (data.size() > room) LOG_ERROR("CLI input beyond %zu bytes typed ahead dropped\n", room);
  typedAhead_.append(data, 0, std::min(room, data.size()));
  return replies;
}

void CliInput::GiveUpNegotiation() { telnetInput_.GiveUpNegotiation(); }

std::optional<CliInputEvent> CliInput::Next(std::string* output) {
  if (outstanding_) return std::nullopt;
  if (!opened_) {
    if (telnet_ && telnetInput_.NegotiationState() == TelnetInput::Negotiation::kPending)
      return std::nullopt;
    opened_ = outstanding_ = true;
    return CliInputEvent{CliInputEvent::Kind::kOpen, {}};
  }
  editor_.SetEcho(!telnet_ || telnetInput_.ServerEchoes());
  LineEditor::Result read = editor_.Feed(typedAhead_);
  typedAhead_.erase(0, read.consumed);
  *output += Escaped(std::move(read.output));
  if (!read.lines.empty()) {
    outstanding_ = true;
    return CliInputEvent{CliInputEvent::Kind::kLine, std::move(read.lines.front())};
  }
  if (read.request) {
    outstanding_ = true;
    return CliInputEvent{KindOf(read.request->kind), std::move(read.request->line)};
  }
  return std::nullopt;
}

void CliInput::Answered(LineEditor::Masking masking, std::string prompt) {
  outstanding_ = false;
  editor_.SetMasking(masking);
  editor_.SetPrompt(std::move(prompt));
}

std::string CliInput::SetLine(std::string_view text) { return Escaped(editor_.SetLine(text)); }

std::string CliInput::ShowLine() { return Escaped(editor_.ShowLine()); }

std::string CliInput::Escaped(std::string text) const {
  return telnet_ ? EscapeTelnetData(text) : text;
}

}  // namespace tessel
