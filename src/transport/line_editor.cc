#include "transport/line_editor.h"

#include <algorithm>
#include <cctype>
#include <utility>

namespace tessel {
namespace {

constexpr std::uint8_t kEscape = 0x1b;
constexpr std::uint8_t kHome = 0x01;  // Ctrl-A
constexpr std::uint8_t kEnd = 0x05;   // Ctrl-E
constexpr std::uint8_t kBackspace = 0x08;
constexpr std::uint8_t kTab = 0x09;
constexpr std::uint8_t kKillLine = 0x15;  // Ctrl-U
constexpr std::uint8_t kSuspend = 0x1a;   // Ctrl-Z
constexpr std::uint8_t kDelete = 0x7f;
constexpr std::size_t kMaxEscapeParameters = 8;
constexpr std::string_view kEraseToEnd = "\x1b[0K";
constexpr std::string_view kPasswordCommand = "act-user";

bool SameLetter(char a, char b) {
  return std::tolower(static_cast<unsigned char>(a)) == std::tolower(static_cast<unsigned char>(b));
}

// Cursor moves on the client's screen: ESC [ D / ESC [ C, with a count when more than one.
void AppendCursorMove(std::string* output, std::size_t from, std::size_t to) {
  if (from == to) return;
  std::size_t count = from > to ? from - to : to - from;
  output->append("\x1b[");
  if (count > 1) output->append(std::to_string(count));
  output->push_back(from > to ? 'D' : 'C');
}

// The longest prefix the candidates share, letters compared without case, taken from the first.
std::string_view CommonPrefix(const std::vector<std::string>& candidates) {
  std::string_view common = candidates.front();
  for (const std::string& candidate : candidates) {
    std::size_t length = 0;
    while (length < common.size() && length < candidate.size() &&
           SameLetter(common[length], candidate[length]))
      ++length;
    common = common.substr(0, length);
  }
  return common;
}

}  // namespace

LineEditor::LineEditor(std::string prompt, Completion completion, Options options)
    : prompt_(std::move(prompt)), completion_(std::move(completion)), options_(options) {}

LineEditor::Result LineEditor::Feed(std::string_view keys) {
  Result result;
  for (char c : keys) {
    ++result.consumed;
    auto key = static_cast<std::uint8_t>(c);
    bool lineEnd = key == '\r' || key == '\n';
    bool skip = droppingLine_ && !lineEnd;
    if (!skip && escape_ != Escape::kNone) {
      ReadEscape(key, &result);
    } else if (!skip) {
      ReadKey(key, &result);
    }
    afterCr_ = key == '\r';
    if (options_.handOffRequests && (result.request || !result.lines.empty())) break;
  }
  return result;
}

void LineEditor::SetHistorySize(std::size_t size) {
  historySize_ = size;
  while (history_.size() > historySize_) history_.pop_front();
  historyPosition_ = 0;
}

std::string LineEditor::SetLine(std::string_view text) {
  ReplaceLine(text.substr(0, kLineLimit - 1));
  std::string output;
  if (echo_) Redraw(&output);
  return output;
}

std::string LineEditor::ShowLine() {
  shown_.clear();
  shownColumn_ = 0;
  appended_ = false;
  std::string output;
  if (echo_) Redraw(&output);
  return output;
}

void LineEditor::ReadKey(std::uint8_t key, Result* result) {
  appended_ = false;
  if (key == kEscape) {
    escape_ = Escape::kStarted;
  } else if (key == '?' && options_.handOffRequests && masking_ == Masking::kNone) {
    HandOff(Request::Kind::kHelp, result);
  } else if (key == '?' && echo_ && !options_.handOffRequests && !PasswordFieldOpen()) {
    Complete(result);
  } else if (key >= 0x20 && key != kDelete) {
    Insert(static_cast<char>(key), result);
  } else {
    RunControlKey(key, result);
  }
  if (echo_) Redraw(&result->output);
}

// ESC [ params final (ESC O final for the cursor keys of some terminals). A control byte inside
// a sequence abandons it and counts as a key of its own.
void LineEditor::ReadEscape(std::uint8_t key, Result* result) {
  Escape stage = escape_;
  escape_ = Escape::kNone;
  if (key < 0x20 || key >= kDelete) {
    ReadKey(key, result);
  } else if (stage == Escape::kStarted) {
    if (key == '[') escape_ = Escape::kControlSequence;
    if (key == 'O') escape_ = Escape::kCursorKey;
    escapeParameters_.clear();
  } else if (stage == Escape::kControlSequence && key < 0x40) {
    if (escapeParameters_.size() < kMaxEscapeParameters) escapeParameters_.push_back(key);
    escape_ = Escape::kControlSequence;
  } else {
    RunControlSequence(static_cast<char>(key));
    if (echo_) Redraw(&result->output);
  }
}

void LineEditor::RunControlSequence(char final) {
  const std::string& parameters = escapeParameters_;
  if (final == 'A' || final == 'B') {
    WalkHistory(final == 'A');
  } else if (final == 'C') {
    MoveCursor(std::min(cursor_ + 1, line_.size()));
  } else if (final == 'D') {
    MoveCursor(cursor_ > 0 ? cursor_ - 1 : 0);
  } else if (final == 'H' || (final == '~' && parameters == "1")) {
    MoveCursor(0);
  } else if (final == 'F' || (final == '~' && parameters == "4")) {
    MoveCursor(line_.size());
  } else if (final == 'K' && (parameters.empty() || parameters == "0")) {
    Erase(cursor_, line_.size() - cursor_);
  } else if (final == '~' && parameters == "3") {
    Erase(cursor_, cursor_ < line_.size() ? 1 : 0);
  }
}

void LineEditor::RunControlKey(std::uint8_t key, Result* result) {
  switch (key) {
    case '\r':
    case '\n':
      if (key == '\n' && afterCr_) break;  // CR LF is one line end
      CompleteLine(result);
      break;
    case kHome:
      MoveCursor(0);
      break;
    case kEnd:
      MoveCursor(line_.size());
      break;
    case kBackspace:
    case kDelete:
      if (cursor_ > 0) Erase(cursor_ - 1, 1);
      break;
    case kKillLine:
      Erase(0, line_.size());
      break;
    case kTab:
      if (options_.handOffRequests) {
        if (masking_ == Masking::kNone) HandOff(Request::Kind::kComplete, result);
      } else if (echo_) {
        Complete(result);
      }
      break;
    case kSuspend:
      if (options_.handOffRequests && masking_ == Masking::kNone)
        HandOff(Request::Kind::kSuspend, result);
      break;
    default:
      break;  // other control characters mean nothing here
  }
}

void LineEditor::Insert(char c, Result* result) {
  appended_ = cursor_ == line_.size() && shownColumn_ == shown_.size();
  hidden_.insert(hidden_.begin() + static_cast<std::ptrdiff_t>(cursor_),
                 c != ';' && PasswordFieldOpen());
  line_.insert(cursor_, 1, c);
  ++cursor_;
  if (line_.size() >= kLineLimit) DropLongLine(result);
}

void LineEditor::Erase(std::size_t from, std::size_t count) {
  line_.erase(from, count);
  auto first = hidden_.begin() + static_cast<std::ptrdiff_t>(from);
  hidden_.erase(first, first + static_cast<std::ptrdiff_t>(count));
  if (cursor_ > from) cursor_ = cursor_ >= from + count ? cursor_ - count : from;
}

// The text is put in as if typed, so that a recalled ACT-USER keeps its password hidden.
void LineEditor::ReplaceLine(std::string_view text) {
  line_.clear();
  hidden_.clear();
  cursor_ = 0;
  for (char c : text) {
    hidden_.push_back(c != ';' && PasswordFieldOpen());
    line_.push_back(c);
  }
  cursor_ = line_.size();
}

void LineEditor::CompleteLine(Result* result) {
  if (droppingLine_) {
    droppingLine_ = false;  // the end of a line already answered with the prompt
    return;
  }
  if (!echo_ && options_.echoCompletedLines) result->output.append(VisibleLine(nullptr));
  if (echo_ || options_.echoCompletedLines) result->output.append("\r\n");
  if (!line_.empty() && masking_ == Masking::kNone && historySize_ > 0) {
    history_.push_back(line_);
    if (history_.size() > historySize_) history_.pop_front();
  }
  result->lines.push_back(std::move(line_));
  ClearLine();
}

void LineEditor::ClearLine() {
  line_.clear();
  hidden_.clear();
  cursor_ = 0;
  shown_.clear();
  shownColumn_ = 0;
  historyPosition_ = 0;
  typedLine_.clear();
}

// The caller answers the request; a suspended line is dropped, and a help request leaves the
// '?' on the screen before the caller's help.
void LineEditor::HandOff(Request::Kind kind, Result* result) {
  result->request = Request{kind, kind == Request::Kind::kSuspend ? std::string() : line_};
  if (kind == Request::Kind::kSuspend) {
    if (echo_) result->output.append("^Z\r\n");
    ClearLine();
  } else if (kind == Request::Kind::kHelp && echo_) {
    result->output.push_back('?');
  }
}

// A line this long is no command: it is dropped, with whatever of it is still to come, and the
// client gets the prompt to start again.
void LineEditor::DropLongLine(Result* result) {
  line_.clear();
  hidden_.clear();
  cursor_ = 0;
  shown_.clear();
  shownColumn_ = 0;
  appended_ = false;
  droppingLine_ = true;
  result->output.append("\r\n").append(prompt_);
}

void LineEditor::WalkHistory(bool towardsOlder) {
  if (masking_ != Masking::kNone) return;  // no secret is drawn from the history
  if (towardsOlder && historyPosition_ < history_.size()) {
    if (historyPosition_ == 0) typedLine_ = line_;
    ++historyPosition_;
  } else if (!towardsOlder && historyPosition_ > 0) {
    --historyPosition_;
  } else {
    return;  // at either end the line stays as it is
  }
  ReplaceLine(historyPosition_ == 0 ? std::string_view(typedLine_)
                                    : history_[history_.size() - historyPosition_]);
}

// The first word is completed by the callback's candidates: one completes it, several complete
// their common prefix and are listed before the prompt and the line are drawn again.
void LineEditor::Complete(Result* result) {
  if (!MayComplete()) return;
  std::string_view prefix = line_;
  prefix.remove_prefix(std::min(line_.find_first_not_of(' '), line_.size()));
  std::vector<std::string> candidates = completion_(prefix);
  if (candidates.empty()) return;
  std::string_view common = CommonPrefix(candidates);
  if (common.size() >= prefix.size() && common.size() < kLineLimit) ReplaceLine(common);
  if (candidates.size() == 1) return;
  std::string& output = result->output;
  for (const std::string& candidate : candidates) output.append("\r\n").append(candidate);
  output.append("\r\n").append(prompt_);
  shown_.clear();
  shownColumn_ = 0;
}

bool LineEditor::MayComplete() const {
  if (!completion_ || PasswordFieldOpen()) return false;
  if (std::find(hidden_.begin(), hidden_.end(), true) != hidden_.end()) return false;
  std::size_t word = line_.find_first_not_of(' ');
  return word == std::string::npos || line_.find(' ', word) == std::string::npos;
}

// ACT-USER:TID:UID:CTAG::PASSWORD — what is typed after the fifth ':' and before a ';'.
bool LineEditor::PasswordFieldOpen() const {
  if (options_.handOffRequests) return false;
  if (line_.size() < kPasswordCommand.size() ||
      !std::equal(kPasswordCommand.begin(), kPasswordCommand.end(), line_.begin(), SameLetter))
    return false;
  return line_.find(';') == std::string::npos && std::count(line_.begin(), line_.end(), ':') == 5;
}

// Brings the client's screen from what it shows to the line as it is now: from the first
// character that differs, the rest is written again (and what is left over erased), then the
// cursor is put in place. Hidden characters take no room on the screen.
// The character shown for line_[index]; '\0' when it takes no room on the screen.
char LineEditor::Shown(std::size_t index) const {
  if (hidden_[index] || masking_ == Masking::kHidden) return '\0';
  return masking_ == Masking::kStars ? '*' : line_[index];
}

std::string LineEditor::VisibleLine(std::size_t* cursorColumn) const {
  std::string visible;
  std::size_t column = 0;
  for (std::size_t i = 0; i < line_.size(); ++i) {
    char shown = Shown(i);
    if (shown == '\0') continue;
    visible.push_back(shown);
    if (i < cursor_) ++column;
  }
  if (cursorColumn != nullptr) *cursorColumn = column;
  return visible;
}

void LineEditor::Redraw(std::string* output) {
  if (appended_) {  // typing at the end, the common case, costs no pass over the line
    appended_ = false;
    char shown = Shown(line_.size() - 1);
    if (shown == '\0') return;
    output->push_back(shown);
    shown_.push_back(shown);
    ++shownColumn_;
    return;
  }
  std::size_t column = 0;
  std::string visible = VisibleLine(&column);
  if (visible != shown_) {
    auto differ = std::mismatch(visible.begin(), visible.end(), shown_.begin(), shown_.end());
    auto common = static_cast<std::size_t>(differ.first - visible.begin());
    AppendCursorMove(output, shownColumn_, common);
    output->append(visible, common);
    if (visible.size() < shown_.size()) output->append(kEraseToEnd);
    shownColumn_ = visible.size();
    shown_ = std::move(visible);
  }
  AppendCursorMove(output, shownColumn_, column);
  shownColumn_ = column;
}

}  // namespace tessel
