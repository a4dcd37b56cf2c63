#include "tl1/tl1_session_input.h"

#include <utility>

namespace tessel {

Tl1SessionInput::Tl1SessionInput(bool interactive, LineEditor::Completion completion)
    : interactive_(interactive), editor_(kTl1Prompt, std::move(completion)) {}

std::string Tl1SessionInput::Open() {
  if (!interactive_) return {};
  return telnet_.Open() + kTl1Prompt;
}

Tl1InputResult Tl1SessionInput::Feed(std::string_view bytes) {
  Tl1InputResult result;
  if (interactive_) {
    FeedInteractive(bytes, &result);
  } else {
    FeedRaw(bytes, &result);
  }
  return result;
}

void Tl1SessionInput::FeedRaw(std::string_view bytes, Tl1InputResult* result) {
  std::size_t start = 0;
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    char c = bytes[i];
    if (c == '"') inQuotes_ = !inQuotes_;
    if (c == ';' && !inQuotes_) {
      message_.append(bytes.substr(start, i + 1 - start));
      result->events.push_back({Tl1InputEvent::Kind::kMessage, std::move(message_)});
      message_.clear();
      start = i + 1;
      continue;
    }
    if (message_.size() + (i + 1 - start) > kMessageLimit) {
      // The rest of this read belongs to the message being dropped.
      result->events.push_back({Tl1InputEvent::Kind::kOverflow, {}});
      message_.clear();
      inQuotes_ = false;
      return;
    }
  }
  message_.append(bytes.substr(start));
}

void Tl1SessionInput::FeedInteractive(std::string_view bytes, Tl1InputResult* result) {
  TelnetFeed feed = telnet_.Feed(bytes);
  result->reply = std::move(feed.replies);
  editor_.SetEcho(telnet_.ServerEchoes());
  LineEditor::Result edited = editor_.Feed(feed.data);
  result->reply += EscapeTelnetData(edited.output);
  for (std::string& line : edited.lines) {
    if (line.empty()) {
      result->events.push_back({Tl1InputEvent::Kind::kEmptyLine, {}});
    } else {
      result->events.push_back({Tl1InputEvent::Kind::kMessage, std::move(line)});
    }
  }
}

}  // namespace tessel
