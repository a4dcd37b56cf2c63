#include "engine/engine.h"

#include <sys/resource.h>

#include <cstdio>
#include <memory>
#include <mutex>

#include "base/stop_signal.h"
#include "cli/cli_service.h"
#include "engine/engine_state.h"
#include "engine/log.h"
#include "notify/notifier.h"
#include "notify/standard_traps.h"
#include "snmp/handlers.h"
#include "snmp/mib_tree.h"
#include "snmp/service.h"
#include "snmpv3/engine_id.h"
#include "snmpv3/v3_config.h"
#include "tl1/tl1_service.h"
#include "transport/ssh_server.h"

namespace tessel {
namespace {

struct Lifecycle {
  std::mutex mutex;              // serialises the lifecycle calls
  bool servicesRunning = false;  // InitSnmpGeneralServices ran and was not stopped since
  StopSignal baseLoopStop;
};

Lifecycle& TheLifecycle() {
  static Lifecycle lifecycle;
  return lifecycle;
}

// The service may already run: startSnmpNetwork marks it started before initSnmpThread.
// The search array is rebuilt before the threads start: a request already waiting in a socket
// must find every registered cell.
bool StartServicesLocked(Lifecycle& lifecycle) {
  if (!lifecycle.servicesRunning) InitSnmpV3Params();
  StoreTreeCellsRefInArray();
  if (!lifecycle.servicesRunning) {
    if (!InitSnmpGeneralServices()) return false;
    InitNotifications();
    lifecycle.servicesRunning = true;
  }
  gv_snmpServiceStarted = 1;
  return true;
}

void StopSnmpLocked(Lifecycle& lifecycle) {
  if (lifecycle.servicesRunning) {
    StopSnmpGeneralServices();
    StopNotifications();
    lifecycle.servicesRunning = false;
  }
  FreeSnmpV3Resources();
  if (gv_snmpServiceStarted.load() == 0) return;
  FreeSimulatorResources();
  FreeTreeCells();
}

// Every started agent holds a socket: the engine raises its descriptor limit as far as the system
// allows (root may raise the hard limit too), else to the hard limit.
void RaiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  rlim_t systemMaximum = 1048576;
  if (std::FILE* file = std::fopen("/proc/sys/fs/nr_open", "r")) {
    unsigned long value = 0;
    if (std::fscanf(file, "%lu", &value) == 1 && value > 0) systemMaximum = value;
    std::fclose(file);
  }
  if (limit.rlim_max < systemMaximum) {
    rlimit raised{systemMaximum, systemMaximum};
    if (setrlimit(RLIMIT_NOFILE, &raised) == 0) return;
  }
  if (limit.rlim_cur >= limit.rlim_max) return;
  limit.rlim_cur = limit.rlim_max;
  if (setrlimit(RLIMIT_NOFILE, &limit) != 0) LOG_ERROR("Unable to raise the descriptor limit\n");
}

}  // namespace

// Status lines are printed outside the lifecycle lock: the host's printStatus may call back.
bool InitAgentParams(const EngineParams& params) {
  Lifecycle& lifecycle = TheLifecycle();
  bool opened = false;
  {
    std::lock_guard<std::mutex> lock(lifecycle.mutex);
    SetConsoleMode(params.consoleMode);
    RaiseDescriptorLimit();
    SetDefaultCellHandlers(ScalarProcessReadReq, ScalarProcessWriteReq, TableProcessReadReq,
                           TableProcessWriteReq);
    lifecycle.baseLoopStop.Arm();
    gv_snmpv3Configured = false;
    opened = OpenEngineLog({params.debugLevel, params.logFilePath, params.maxLogFileSize});
  }
  if (!opened) {
    PrintStatus("Error in opening the Log file : " + params.logFilePath);
    return false;
  }
  LOG_TRACE("\n\t@@@@@ Inside nativeInitAgentParams() @@@@@ \n");
  return true;
}

void InitAgentRegistry() {
  LOG_TRACE("\n\t@@@@@ Inside jniJVMparams() @@@@@ \n");
  FreeSimulatorResources();
  ClearTrapSinks();  // the host gives a new network's sinks after this
  // SNMPv3 rows may arrive before the service starts; they are kept under this engine ID.
  ReadFromSnmpV3ConfFile();
}

bool InitSnmpThread() {
  LOG_TRACE("\n\t@@@@@ Inside initSnmpThread() @@@@@ \n");
  Lifecycle& lifecycle = TheLifecycle();
  std::lock_guard<std::mutex> lock(lifecycle.mutex);
  return StartServicesLocked(lifecycle);
}

std::vector<std::int64_t> StartSnmpNetwork(const std::vector<AgentRegistration>& agents) {
  LOG_TRACE("\n\t@@@@@ Inside startSnmpNetwork() @@@@@ \n");
  std::vector<std::int64_t> sockets;
  sockets.reserve(agents.size());
  for (const AgentRegistration& agent : agents)
    sockets.push_back(FillAgentInfoAndStartAgent(agent));
  gv_snmpServiceStarted = 1;
  return sockets;
}

bool StartAgentAndService(const std::string& address, std::int32_t port,
                          std::uint32_t engineBoots) {
  if (!StartAgent(address, port, engineBoots)) return false;
  Lifecycle& lifecycle = TheLifecycle();
  std::lock_guard<std::mutex> lock(lifecycle.mutex);
  if (gv_snmpServiceStarted.load() == 0) StartServicesLocked(lifecycle);
  return true;
}

Tl1Service& TheTl1Service() {
  static auto* service = [] {
    Tl1ServiceOptions options;
    options.status = [](const std::string& text) { PrintStatus(text); };
    return new Tl1Service(std::move(options));
  }();
  return *service;
}

CliService& TheCliService() {
  static auto* service = [] {
    CliServiceOptions options;
    options.status = [](const std::string& text) { PrintStatus(text); };
    options.sshServer = [](TcpSessionEvents* events, CliPasswordCheck check,
                           const std::string& keyDirectory) -> std::unique_ptr<StreamServer> {
      SshServerOptions ssh;
      ssh.hostKeyDirectory = keyDirectory;
      ssh.authenticate = std::move(check);
      return std::make_unique<SshServer>(events, std::move(ssh));
    };
    return new CliService(std::move(options));
  }();
  return *service;
}

void BaseLoop() {
  LOG_TRACE("\n\t@@@@@ Inside BaseLoop() @@@@@ \n");
  TheLifecycle().baseLoopStop.Wait();
}

namespace {

// Stops the SNMP side and tells the host with the given status line.
void StopSnmpAndReport(Lifecycle& lifecycle, const char* status) {
  {
    std::lock_guard<std::mutex> lock(lifecycle.mutex);
    StopSnmpLocked(lifecycle);
    gv_virtualIpBase = 100;
    gv_snmpServiceStarted = 0;
  }
  LOG_TRACE("%s\n", status);
  PrintStatus(status);
}

}  // namespace

bool AdapterJniStopSnmp() {
  LOG_TRACE("\n\t@@@@@ Inside AdapterJniStopSnmp() @@@@@ \n");
  StopSnmpAndReport(TheLifecycle(), "SNMP resources cleared Successfully");
  return true;
}

bool AdapterJniStopNetwork() {
  LOG_TRACE("\n\t@@@@@ Inside AdapterJniStopNetwork() @@@@@ \n");
  Lifecycle& lifecycle = TheLifecycle();
  TheTl1Service().Stop();
  TheCliService().Stop();
  StopSnmpAndReport(lifecycle, "Network resources cleared Successfully");
  std::lock_guard<std::mutex> lock(lifecycle.mutex);
  CloseEngineLog();
  lifecycle.baseLoopStop.Stop();
  return true;
}

}  // namespace tessel
