// Wall-clock seconds and the engine clock base from which uptimes are counted.
#pragma once

#include <cstdint>

namespace tessel {

std::uint32_t GetCurrentSeconds();

// Records now as the engine clock base (the SNMP service start).
void SetClockBase();

// Whole seconds since the clock base; hundredths of a second in steps of 100 when hundredths is
// set. The milliseconds of either instant never contribute.
std::uint32_t GetUptime(bool hundredths);

// Whole seconds since the given wall-clock second, in the same units as GetUptime.
std::uint32_t UptimeSince(std::uint32_t startSeconds, bool hundredths);

void SleepMicroseconds(std::uint64_t microseconds);

}  // namespace tessel
