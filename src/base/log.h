// The engine's log: one text file whose detail is chosen by the debug level (0 none; 1..3 the
// file is open; a message of class c is written when c <= level <= 3), restarted from empty when
// it would pass the host's size limit, switchable at run time. Every line is flushed before the
// call returns. Safe from any thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace tessel {

inline constexpr int kLogInfo = 1;
inline constexpr int kLogError = 2;
inline constexpr int kLogTrace = 3;

struct LogSettings {
  std::uint8_t debugLevel = 0;
  std::string path;
  std::uint32_t maxFileSize = 0;
};

// Stores the settings and, at a level above 0, opens (truncates) the file. False when it cannot.
bool OpenEngineLog(const LogSettings& settings);
// Closes the file; the level stays.
void CloseEngineLog();
// Switches to another file (the level decides whether it is opened now).
void SwitchLogFile(const std::string& path);
std::uint8_t DebugLevel();
bool LogErrorFlag();
std::string LogFilePath();

inline bool LogEnabled(int messageClass) {
  std::uint8_t level = DebugLevel();
  return level <= 3 && messageClass <= level;
}

void LogWrite(const char* format, ...) __attribute__((format(printf, 1, 2)));
// Bytes as "0x%02x\t" each, then a line end.
void LogBytes(const std::uint8_t* bytes, std::size_t length);

}  // namespace tessel

#define TESSEL_LOG(messageClass, ...)                                        \
  do {                                                                       \
    if (::tessel::LogEnabled(messageClass)) ::tessel::LogWrite(__VA_ARGS__); \
  } while (0)
#define LOG_TRACE(...) TESSEL_LOG(::tessel::kLogTrace, __VA_ARGS__)
#define LOG_ERROR(...) TESSEL_LOG(::tessel::kLogError, __VA_ARGS__)
#define LOG_INFO(...) TESSEL_LOG(::tessel::kLogInfo, __VA_ARGS__)
