#include "engine/log.h"

#include <atomic>
#include <cstdio>

#include "engine/host_bridge.h"

namespace tessel {
namespace {

std::atomic<bool> consoleMode{false};

}  // namespace

void SetConsoleMode(bool mode) { consoleMode = mode; }

void PrintStatus(const std::string& text) {
  if (consoleMode.load()) {
    std::printf("%s\n", text.c_str());
    std::fflush(stdout);
    return;
  }
  if (HostBridge* host = InstalledHost()) host->PrintStatus(text);
}

}  // namespace tessel
