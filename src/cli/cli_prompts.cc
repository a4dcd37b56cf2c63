#include "cli/cli_prompts.h"

#include <strings.h>

#include <algorithm>
#include <cstdlib>
#include <fstream>

#include "base/log.h"

namespace tessel {
namespace {

constexpr std::size_t kLineLimit = 255;
constexpr std::string_view kDeviceNameField = "$DEVICENAME";

// The next line of a properties file that is not a comment, cut to the line limit.
bool NextEntry(std::istream& in, std::string* line) {
  while (std::getline(in, *line)) {
    if (line->size() > kLineLimit) line->resize(kLineLimit);
    if (!line->empty() && line->back() == '\r') line->pop_back();
    if (!line->empty() && (*line)[0] != '#') return true;
  }
  return false;
}

}  // namespace

std::vector<CliUserMode> ParseCliUserModes(std::istream& in) {
  std::vector<CliUserMode> modes;
  std::string line;
  while (NextEntry(in, &line)) {
    std::size_t equals = line.find('=');
    if (equals == std::string::npos) continue;
    long number = std::strtol(line.c_str() + equals + 1, nullptr, 10);
    if (number > kCliModeLastBuiltIn && number <= INT32_MAX)
      modes.push_back({static_cast<std::int32_t>(number), line.substr(0, equals)});
  }
  return modes;
}

std::vector<std::string> ParseCliUserPrompts(std::istream& in) {
  std::vector<std::string> prompts;
  std::string line;
  while (NextEntry(in, &line)) {
    std::size_t equals = line.find('=');
    if (equals == std::string::npos) continue;
    std::string prompt = line.substr(equals + 1);
    prompts.push_back(prompt.substr(0, prompt.find(';')));
  }
  return prompts;
}

void CliPrompts::SetLoginPrompt(std::string prompt) {
  std::lock_guard<std::mutex> lock(mutex_);
  loginPrompt_ = std::move(prompt);
}

void CliPrompts::SetPasswordPrompt(std::string prompt) {
  std::lock_guard<std::mutex> lock(mutex_);
  passwordPrompt_ = std::move(prompt);
}

void CliPrompts::SetPromptString(std::string prompt) {
  std::lock_guard<std::mutex> lock(mutex_);
  promptString_ = std::move(prompt);
}

void CliPrompts::SetOverride(std::string prompt) {
  std::lock_guard<std::mutex> lock(mutex_);
  override_ = std::move(prompt);
}

void CliPrompts::ClearOverride() { SetOverride({}); }

bool CliPrompts::ReadUserModes(const std::string& baseDirectory) {
  bool complete = true;
  std::string modesPath = baseDirectory + "conf/IosModes.prop";
  std::ifstream modesFile(modesPath);
  if (modesFile) {
    std::vector<CliUserMode> modes = ParseCliUserModes(modesFile);
    std::lock_guard<std::mutex> lock(mutex_);
    userModes_ = std::move(modes);
  } else {
    LOG_ERROR("Cannot Open file %s for reading\n", modesPath.c_str());
    LOG_ERROR("Error while reading and parsing CLI Modes and Numbers from file\n");
    complete = false;
  }
  std::string promptsPath = baseDirectory + "conf/IosPrompts.prop";
  std::ifstream promptsFile(promptsPath);
  if (promptsFile) {
    std::vector<std::string> prompts = ParseCliUserPrompts(promptsFile);
    std::lock_guard<std::mutex> lock(mutex_);
    userPrompts_ = std::move(prompts);
  } else {
    LOG_ERROR("Cannot Open file %s for reading\n", promptsPath.c_str());
    LOG_ERROR("Error while reading and parsing CLI prompts from file\n");
    complete = false;
  }
  return complete;
}

void CliPrompts::SetUserModes(std::vector<CliUserMode> modes, std::vector<std::string> prompts) {
  std::lock_guard<std::mutex> lock(mutex_);
  userModes_ = std::move(modes);
  userPrompts_ = std::move(prompts);
}

std::string CliPrompts::Prompt(std::int32_t mode, const std::string& deviceName) const {
  std::lock_guard<std::mutex> lock(mutex_);
  bool namedFirst =
      promptString_.size() >= kDeviceNameField.size() &&
      strncasecmp(promptString_.c_str(), kDeviceNameField.data(), kDeviceNameField.size()) == 0;
  switch (mode) {
    case kCliModeUserName:
      return loginPrompt_;
    case kCliModeLoginPassword:
    case kCliModeEnableSecret:
      return passwordPrompt_;
    case kCliModeUserExec:
      return namedFirst ? deviceName + promptString_.substr(kDeviceNameField.size())
                        : promptString_;
    case kCliModeGlobalConfig:
      return deviceName + "(config)#";
    case kCliModeInterface:
      return deviceName + "(config-if)#";
    case 10:
    case 13:
    case 14:
    case 15:
      return deviceName + "(config-router)#";
    case 11:
      return deviceName + "(config-line)#";
    case 12:
      return deviceName + "(config-vlan)#";
    case kCliModeTelnetShell:
      return namedFirst ? "[" + deviceName + "@" + deviceName + " " + deviceName + "]$ "
                        : promptString_;
    default:
      break;
  }
  if (mode > kCliModeLastBuiltIn) {
    if (!override_.empty()) return override_;
    auto user = std::find_if(userModes_.begin(), userModes_.end(),
                             [mode](const CliUserMode& entry) { return entry.number == mode; });
    auto position = static_cast<std::size_t>(user - userModes_.begin());
    if (user != userModes_.end() && position < userPrompts_.size())
      return deviceName + userPrompts_[position];
  }
  return deviceName + "#";
}

}  // namespace tessel
