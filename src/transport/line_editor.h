// The line editor of an interactive session: keys in (already free of telnet commands), the
// bytes that redraw the client's line and the completed lines out. It keeps the line with its
// cursor, a history of the last 40 lines and the password field of ACT-USER hidden; completion
// of the first word asks the caller's callback. A command-line session instead hands TAB, '?'
// and Ctrl-Z to its caller with the line typed so far and takes one line or request per feed,
// so that the caller can answer it (and say how the next line is echoed) before the keys typed
// ahead are read. A pure state machine: one per session, used by one thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace tessel {

struct LineEditorOptions {
  // A completed line is written back even when the client echoes itself (echo off), so that
  // what a client reads always holds each line before its answer.
  bool echoCompletedLines = false;
  // TAB, '?' and Ctrl-Z end the feed with a request to the caller instead of completing the
  // first word, and a feed stops after the first completed line or request.
  bool handOffRequests = false;
};

class LineEditor {
 public:
  static constexpr std::size_t kHistorySize = 40;
  // A line that grows to this length is dropped with the rest of it, and the prompt shown again.
  static constexpr std::size_t kLineLimit = 4094;

  // The candidates that complete a prefix of the first word (case as they should be shown).
  using Completion = std::function<std::vector<std::string>(std::string_view prefix)>;

  using Options = LineEditorOptions;

  // How the characters of the line are shown: as typed, not at all, or each as '*'.
  enum class Masking : std::uint8_t { kNone, kHidden, kStars };

  struct Request {
    enum class Kind : std::uint8_t { kComplete, kHelp, kSuspend };
    Kind kind = Kind::kComplete;
    std::string line;  // the line typed so far (nothing for kSuspend: the line is dropped)
  };

  struct Result {
    std::string output;              // echo and redraw for the client
    std::vector<std::string> lines;  // each completed line in order, an empty one included
    std::optional<Request> request;  // handing off: the request that ended the feed
    std::size_t consumed = 0;        // keys read; handing off, the rest waits for the next feed
  };

  LineEditor(std::string prompt, Completion completion, Options options = {});

  // The text shown before the line when it is drawn again (after a completion list).
  void SetPrompt(std::string prompt) { prompt_ = std::move(prompt); }
  // Off when the client echoes and edits itself: nothing is drawn, TAB and '?' are plain input,
  // lines are still completed.
  void SetEcho(bool echo) { echo_ = echo; }
  // Applies to the line being typed and the next ones; a masked line is kept out of the history.
  void SetMasking(Masking masking) { masking_ = masking; }
  void SetHistorySize(std::size_t size);
  std::vector<std::string> History() const { return {history_.begin(), history_.end()}; }

  Result Feed(std::string_view keys);
  // The line becomes text (a completion's answer), redrawn in place; the redraw is returned.
  std::string SetLine(std::string_view text);
  // The line as typed so far, drawn after a prompt that the caller has just written.
  std::string ShowLine();

 private:
  enum class Escape : std::uint8_t { kNone, kStarted, kControlSequence, kCursorKey };

  void ReadKey(std::uint8_t key, Result* result);
  void ReadEscape(std::uint8_t key, Result* result);
  void RunControlSequence(char final);
  void RunControlKey(std::uint8_t key, Result* result);
  void Insert(char c, Result* result);
  void CompleteLine(Result* result);
  void ClearLine();
  void Complete(Result* result);
  void WalkHistory(bool towardsOlder);
  void MoveCursor(std::size_t position) { cursor_ = position; }
  void Erase(std::size_t from, std::size_t count);
  void ReplaceLine(std::string_view text);
  void DropLongLine(Result* result);

  bool PasswordFieldOpen() const;
  bool MayComplete() const;
  void HandOff(Request::Kind kind, Result* result);
  char Shown(std::size_t index) const;
  std::string VisibleLine(std::size_t* cursorColumn) const;
  void Redraw(std::string* output);

  std::string prompt_;
  Completion completion_;
  Options options_;
  bool echo_ = true;
  Masking masking_ = Masking::kNone;
  std::size_t historySize_ = kHistorySize;

  std::string line_;
  std::vector<bool> hidden_;  // per character of line_: typed into the password field
  std::size_t cursor_ = 0;
  std::string shown_;  // what the client's screen holds of the line
  std::size_t shownColumn_ = 0;
  bool appended_ = false;  // the last key only added a character at the end of the line

  std::deque<std::string> history_;  // oldest first
  std::size_t historyPosition_ = 0;  // 0 the line being typed, n the n-th newest entry
  std::string typedLine_;            // the line being typed while the history is walked

  Escape escape_ = Escape::kNone;
  std::string escapeParameters_;
  bool afterCr_ = false;       // an LF right after a CR ends no second line
  bool droppingLine_ = false;  // the rest of a line past the limit is ignored up to its end
};

}  // namespace tessel
