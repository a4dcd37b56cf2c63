// The SNMP service: one service thread per agent-socket shard (one per CPU the process may run
// on), each waiting on its shard's epoll, reading what a ready agent socket holds in one batch,
// running every request through SNMP message processing on the same thread and sending the
// replies in one batch. The engine's wildcard sockets are served by the first thread. Every
// thread blocks until there is work or a stop: an idle service uses no CPU, and a stop wakes
// and joins every thread before it returns. Started and stopped by the engine lifecycle, from
// one host thread at a time.
#pragma once

#include <cstddef>
#include <cstdint>

#include "engine/agent.h"

namespace tessel {

// Starts the service; false when it cannot run.
bool InitSnmpGeneralServices();
// Stops whatever InitSnmpGeneralServices started; harmless when nothing runs.
void StopSnmpGeneralServices();

// Service threads running now (for observation).
int LiveServiceThreads();

// How the agent sockets have been read since the process started (for observation): wake-ups
// that found more ready sockets than are read one by one, and io_uring batches that read one
// request from each of many sockets.
struct ServiceReadCounts {
  std::uint64_t manySocketWakeups = 0;
  std::uint64_t socketBatches = 0;
};
ServiceReadCounts ServiceReads();

// Opens the SessionOpener/SessionCloser of the agent registry on the UDP transport.
void InitSnmpParams();

}  // namespace tessel
