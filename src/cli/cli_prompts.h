// The prompts of CLI sessions: the login and password prompts and the prompt string the host
// sets, the prompt override, and the user-added modes (numbers above 15, each with its prompt
// suffix) read from conf/IosModes.prop and conf/IosPrompts.prop below the base directory. Prompt
// gives the prompt of a mode for a device name. Thread-safe.
#pragma once

#include <cstdint>
#include <istream>
#include <mutex>
#include <string>
#include <vector>

namespace tessel {

// Modes of a CLI session.
inline constexpr std::int32_t kCliModeUserName = 0;
inline constexpr std::int32_t kCliModeLoginPassword = 1;
inline constexpr std::int32_t kCliModeEnableSecret = 2;
inline constexpr std::int32_t kCliModeUserExec = 5;
inline constexpr std::int32_t kCliModePrivilegedExec = 6;
inline constexpr std::int32_t kCliModeGlobalConfig = 7;
inline constexpr std::int32_t kCliModeClosing = 8;
inline constexpr std::int32_t kCliModeInterface = 9;
inline constexpr std::int32_t kCliModeLastBuiltIn = 15;
inline constexpr std::int32_t kCliModeTelnetShell = 23;

struct CliUserMode {
  std::int32_t number = 0;
  std::string name;
  bool operator==(const CliUserMode&) const = default;
};

// name=number lines; numbers of 15 or less are left out. '#' starts a comment line.
std::vector<CliUserMode> ParseCliUserModes(std::istream& in);
// key=prompt lines, the prompt ending at ';' or the line's end, one per line in file order.
std::vector<std::string> ParseCliUserPrompts(std::istream& in);

class CliPrompts {
 public:
  void SetLoginPrompt(std::string prompt);
  void SetPasswordPrompt(std::string prompt);
  void SetPromptString(std::string prompt);
  // Shown in user-added modes instead of their own prompt until ClearOverride.
  void SetOverride(std::string prompt);
  void ClearOverride();
  // Reads both files below baseDirectory (which ends in '/'); the lists stay as they were when
  // a file cannot be read. False when either could not.
  bool ReadUserModes(const std::string& baseDirectory);
  void SetUserModes(std::vector<CliUserMode> modes, std::vector<std::string> prompts);

  std::string Prompt(std::int32_t mode, const std::string& deviceName) const;

 private:
  mutable std::mutex mutex_;
  std::string loginPrompt_ = "Username: ";
  std::string passwordPrompt_ = "Password: ";
  std::string promptString_ = "$DEVICENAME>";
  std::string override_;
  std::vector<CliUserMode> userModes_;
  std::vector<std::string> userPrompts_;
};

}  // namespace tessel
