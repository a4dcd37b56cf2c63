// The SNMP service: the receive threads (one for the agents' own sockets, one for the engine's
// wildcard sockets), the five received-message queues with seven workers each, and the path of
// a reply back to its manager. Every thread blocks until there is work or a stop: an idle
// service uses no CPU, and a stop wakes and joins every thread before it returns. Started and
// stopped by the engine lifecycle, from one host thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "engine/agent.h"

namespace tessel {

inline constexpr int kRequestQueues = 5;
inline constexpr int kWorkersPerQueue = 7;

// Starts the service; false when it cannot run.
bool InitSnmpGeneralServices();
// Stops whatever InitSnmpGeneralServices started; harmless when nothing runs.
void StopSnmpGeneralServices();

// Queues one received datagram of an agent (round robin over the queues). viaWildcard: the
// datagram came in on a wildcard socket, so the reply must name the agent's address as source.
bool CreateRcvdInfo(const AgentSession& session, const std::uint8_t* data, std::size_t length,
                    bool viaWildcard);

// Processes one request and sends its reply; false when the request was dropped.
bool ProcessRcvdSnmpReq(const std::uint8_t* data, std::size_t length, const AgentSession& session,
                        bool viaWildcard);

// Live workers of each pool (for observation).
std::vector<int> LiveWorkerCounts();

// Opens the SessionOpener/SessionCloser of the agent registry on the UDP transport.
void InitSnmpParams();

}  // namespace tessel
