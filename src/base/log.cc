#include "base/log.h"

#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>

namespace tessel {
namespace {

struct LogState {
  std::mutex mutex;  // guards everything below and every write
  std::FILE* file = nullptr;
  std::string path;
  std::uint32_t maxFileSize = 0;
};

LogState& State() {
  static LogState state;
  return state;
}

std::atomic<std::uint8_t> debugLevel{0};
std::atomic<bool> logErrorFlag{false};

// Opens (truncating) the state's path. Caller holds the mutex.
bool OpenLocked(LogState& state) {
  if (state.file) std::fclose(state.file);
  state.file = std::fopen(state.path.c_str(), "w+");
  if (state.file == nullptr) {
    std::fprintf(stderr, "fopen error %s: %s\n", state.path.c_str(), std::strerror(errno));
    logErrorFlag = true;
    return false;
  }
  logErrorFlag = false;
  return true;
}

// Restarts the file when the message would take it to the size limit. Caller holds the mutex.
void CheckLogFileSize(LogState& state, std::size_t messageLength) {
  if (state.maxFileSize == 0) return;
  std::string name = state.path.find(':') != std::string::npos ? state.path : "./" + state.path;
  if (!state.path.empty() && state.path[0] == '/') name = state.path;
  struct stat info {};
  if (::stat(name.c_str(), &info) != 0) return;
  if (static_cast<std::uint64_t>(info.st_size) + messageLength >= state.maxFileSize) {
    OpenLocked(state);
  }
}

}  // namespace

bool OpenEngineLog(const LogSettings& settings) {
  LogState& state = State();
  std::lock_guard<std::mutex> lock(state.mutex);
  state.path = settings.path;
  state.maxFileSize = settings.maxFileSize;
  debugLevel = settings.debugLevel;
  logErrorFlag = false;
  if (settings.debugLevel == 0) return true;
  return OpenLocked(state);
}

void CloseEngineLog() {
  LogState& state = State();
  std::lock_guard<std::mutex> lock(state.mutex);
  if (state.file) std::fclose(state.file);
  state.file = nullptr;
}

void SwitchLogFile(const std::string& path) {
  LogState& state = State();
  std::lock_guard<std::mutex> lock(state.mutex);
  state.path = path;
  if (debugLevel.load() > 0) OpenLocked(state);
}

std::uint8_t DebugLevel() { return debugLevel.load(std::memory_order_relaxed); }
bool LogErrorFlag() { return logErrorFlag.load(); }

std::string LogFilePath() {
  LogState& state = State();
  std::lock_guard<std::mutex> lock(state.mutex);
  return state.path;
}

void LogWrite(const char* format, ...) {
  char buffer[4096];
  va_list args;
  va_start(args, format);
  int length = std::vsnprintf(buffer, sizeof buffer, format, args);
  va_end(args);
  if (length < 0) return;
  std::size_t size = std::min(static_cast<std::size_t>(length), sizeof buffer - 1);
  LogState& state = State();
  std::lock_guard<std::mutex> lock(state.mutex);
  if (state.file == nullptr) return;
  CheckLogFileSize(state, size);
  if (state.file == nullptr) return;
  std::fwrite(buffer, 1, size, state.file);
  std::fflush(state.file);
}

void LogBytes(const std::uint8_t* bytes, std::size_t length) {
  std::string text;
  text.reserve(length * 5 + 1);
  char item[8];
  for (std::size_t i = 0; i < length; ++i) {
    std::snprintf(item, sizeof item, "0x%02x\t", bytes[i]);
    text += item;
  }
  LogWrite("%s\n", text.c_str());
}

}  // namespace tessel
