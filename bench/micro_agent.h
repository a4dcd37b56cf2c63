// The small agent the micro-benchmarks run against: the system group and a four-row ifTable
// registered in the MIB tree (optionally after them a number of enterprise scalar groups, to give
// lookups a larger tree), values served by the in-memory host. Requests are encoded with the
// load generator's own codec, so the engine's codec is measured on bytes it did not write.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "engine/agent.h"
#include "support/memory_host.h"

namespace tessel::bench {

class MicroAgent {
 public:
  explicit MicroAgent(int extraGroups = 0);
  ~MicroAgent();
  MicroAgent(const MicroAgent&) = delete;
  MicroAgent& operator=(const MicroAgent&) = delete;

  const AgentSession& Session() const { return session_; }

 private:
  MemoryHost host_;
  AgentSession session_;
};

// A v2c request datagram with community "public" and request-id 2^24.
std::vector<std::uint8_t> EncodeMicroRequest(std::uint8_t pduType, const std::string& oid,
                                             int maxRepetitions = 0);

}  // namespace tessel::bench
