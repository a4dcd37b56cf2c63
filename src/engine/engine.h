// The engine's lifecycle as the host drives it: initialisation, the agent registry's reset, the
// SNMP service start (on request or with the first started agent), the base loop that holds a
// host thread until a stop, and the two stop sequences. Lifecycle calls are serialised among
// themselves; BaseLoop may block on any number of host threads while they run.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "engine/agent_registry.h"

namespace tessel {

class Tl1Service;
class CliService;

struct EngineParams {
  bool consoleMode = false;
  std::uint8_t debugLevel = 0;
  std::string logFilePath;
  std::uint32_t maxLogFileSize = 0;
};

// Stores the settings, opens the log at a level above 0 and arms the base loop. False (and the
// host told) when the log file cannot be opened.
bool InitAgentParams(const EngineParams& params);
// Starts the agent registry empty (agents left from before are closed and dropped).
void InitAgentRegistry();
// Starts the SNMP service when it does not run, rebuilds the MIB search array and marks the
// service started.
bool InitSnmpThread();
// Registers and opens each agent; the result of FillAgentInfoAndStartAgent for each.
// Marks the service started; the service itself starts with InitSnmpThread.
std::vector<std::int64_t> StartSnmpNetwork(const std::vector<AgentRegistration>& agents);
// Opens a registered agent, then starts the SNMP service if it was not started.
bool StartAgentAndService(const std::string& address, std::int32_t port, std::uint32_t engineBoots);
// The engine's TL1 service, created on first use and never destroyed.
Tl1Service& TheTl1Service();
// The engine's CLI service, created on first use and never destroyed.
CliService& TheCliService();

// Blocks the calling thread until AdapterJniStopNetwork.
void BaseLoop();
// Stops the SNMP service and releases its agents and MIB tree.
bool AdapterJniStopSnmp();
// Stops everything, closes the log and ends every BaseLoop.
bool AdapterJniStopNetwork();

}  // namespace tessel
