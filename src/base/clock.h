// The engine's clock: seconds on the monotonic clock, which a change of the wall-clock time never
// steps, and the clock base from which uptimes are counted. Every elapsed time of the engine
// (uptimes, engine time) is measured on it; it tells no date. Safe from any thread.
#pragma once

#include <cstdint>

namespace tessel {

// Whole seconds on the monotonic clock: a start from which elapsed time is measured.
std::uint32_t GetCurrentSeconds();

// Records now as the engine clock base (the SNMP service start).
void SetClockBase();

// Whole seconds since the clock base; hundredths of a second in steps of 100 when hundredths is
// set. The fractions of a second of either instant never contribute.
std::uint32_t GetUptime(bool hundredths);

// Whole seconds since a start taken from GetCurrentSeconds, in the same units as GetUptime; a
// start ahead of now counts as no time elapsed.
std::uint32_t UptimeSince(std::uint32_t startSeconds, bool hundredths);

void SleepMicroseconds(std::uint64_t microseconds);

}  // namespace tessel
