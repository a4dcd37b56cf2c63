// The engine's log (base/log.h) and the status lines the engine shows its user.
#pragma once

#include <string>

#include "base/log.h"

namespace tessel {

// A status line for the user: standard output in console mode, else the host's printStatus.
void PrintStatus(const std::string& text);
void SetConsoleMode(bool consoleMode);

}  // namespace tessel
