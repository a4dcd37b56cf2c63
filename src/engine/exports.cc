// The JNI exports: thin functions that convert their arguments, call the engine's operation and
// convert its result. Null texts and arrays from the host are handled, never dereferenced, and
// no C++ exception leaves an export (running out of memory gives the failure result).
#include <jni.h>

#include <algorithm>
#include <new>

#include "engine/engine.h"
#include "engine/engine_state.h"
#include "engine/exports_marshal.h"
#include "engine/jni_host.h"
#include "engine/log.h"
#include "notify/notifier.h"
#include "snmp/mib_tree.h"
#include "snmp/service.h"
#include "snmp/statistics.h"
#include "snmpv3/v3_config.h"
#include "snmpv3/vacm.h"
#include "vip/virtual_ips.h"

namespace tessel {
namespace {

constexpr std::size_t kMaxAgentsPerCall = 32767;
constexpr std::size_t kMaxStringArray = 65535;


// A null text arrives as the empty text.
std::string Text(JNIEnv* env, jstring text) {
  return JniHost::Instance().ToCpp(env, text).value_or("");
}

std::vector<std::string> Texts(JNIEnv* env, jobjectArray array) {
  return StringsFromJava(env, array).value_or(std::vector<std::string>{});
}

jstring OptionalText(JNIEnv* env, const std::optional<std::string>& text) {
  return text ? StringToJava(env, *text) : nullptr;
}

// The host's handle of an agent socket: 0 for an agent not opened, -1 when memory ran out.
jint HostSocketHandle(std::int64_t socket) {
  if (socket == kOutOfMemory) return -1;
  return socket == kNoSocket ? 0 : static_cast<jint>(socket);
}

// The host's arrays for one startSnmpNetwork call; every array must cover every agent.
struct NetworkArrays {
  std::vector<std::int32_t> agentIds, ports, engineBoots, ipv6Flags;
  std::vector<std::string> tableNames, addresses, readCommunities, writeCommunities;

  std::size_t AgentCount() const { return std::min(agentIds.size(), kMaxAgentsPerCall); }
  bool CoverAgents() const {
    std::size_t n = AgentCount();
    return ports.size() >= n && engineBoots.size() >= n && ipv6Flags.size() >= n &&
           tableNames.size() >= n && addresses.size() >= n && readCommunities.size() >= n &&
           writeCommunities.size() >= n;
  }
  AgentRegistration Agent(std::size_t i, const std::string& databaseName) const {
    AgentRegistration agent;
    agent.agentId = agentIds[i];
    agent.address = addresses[i];
    agent.port = static_cast<std::uint16_t>(ports[i]);  // ports are 16-bit: the low bits count
    agent.readCommunities = {readCommunities[i]};
    agent.writeCommunities = {writeCommunities[i]};
    agent.engineBoots = static_cast<std::uint32_t>(engineBoots[i]);
    agent.databaseName = databaseName;
    agent.tableName = tableNames[i];
    agent.ipv6Flag = ipv6Flags[i];
    return agent;
  }
};

// The first count elements, or nothing when the array holds fewer.
std::optional<std::vector<std::string>> FirstTexts(JNIEnv* env, jobjectArray array, jint count) {
  std::optional<std::vector<std::string>> texts = StringsFromJava(env, array);
  if (!texts || count < 0 || texts->size() < static_cast<std::size_t>(count)) return std::nullopt;
  texts->resize(static_cast<std::size_t>(count));
  return texts;
}

// The bindings of a notification as the host passed them; absent arrays stay absent.
NotificationBindingTexts BindingTexts(JNIEnv* env, jobjectArray oids, jintArray types,
                                      jobjectArray values) {
  return {StringsFromJava(env, oids), IntsFromJava(env, types), StringsFromJava(env, values)};
}

// The manager, device and bindings every notification export passes.
NotificationRequest Notification(JNIEnv* env, jstring host, jint port, jstring community,
                                 jobjectArray oids, jintArray types, jobjectArray values,
                                 jint agentId, jstring agentText) {
  NotificationRequest request;
  request.managerHost = Text(env, host);
  request.managerPort = port;
  request.community = Text(env, community);
  request.bindings = BindingTexts(env, oids, types, values);
  request.agentId = agentId;
  request.agentText = Text(env, agentText);
  return request;
}

void SendV1(JNIEnv* env, jstring host, jint port, jstring community, jstring enterprise,
            jint generic, jint specific, jobjectArray oids, jintArray types, jobjectArray values,
            jint agentId, jstring agentText) {
  GuardedVoid([&] {
    NotificationRequest request =
        Notification(env, host, port, community, oids, types, values, agentId, agentText);
    request.pduType = kTrapV1;
    request.version = kSnmpV1;
    request.enterprise = Text(env, enterprise);
    request.genericTrap = generic;
    request.specificTrap = specific;
    SendNotification(request);
  });
}

// selector 1 sends an SNMPv2-Trap, any other value an InformRequest.
void SendV2(JNIEnv* env, jstring host, jint port, jstring community, jstring trapOid,
            jobjectArray oids, jintArray types, jobjectArray values, jint agentId,
            jstring agentText, jint selector) {
  GuardedVoid([&] {
    NotificationRequest request =
        Notification(env, host, port, community, oids, types, values, agentId, agentText);
    request.pduType = selector == 1 ? kTrapV2 : kInformRequest;
    request.version = kSnmpV2c;
    request.trapOid = Text(env, trapOid);
    SendNotification(request);
  });
}

void SendV3(std::uint8_t pduType, JNIEnv* env, jstring host, jint port, jstring community,
            jstring trapOid, jstring userName, jstring contextName, jobjectArray oids,
            jintArray types, jobjectArray values, jint agentId, jstring agentText) {
  GuardedVoid([&] {
    NotificationRequest request =
        Notification(env, host, port, community, oids, types, values, agentId, agentText);
    request.pduType = pduType;
    request.version = kSnmpV3;
    request.trapOid = Text(env, trapOid);
    request.userName = Text(env, userName);
    request.contextName = Text(env, contextName);
    SendNotification(request);
  });
}

}  // namespace
}  // namespace tessel

using namespace tessel;

extern "C" {

// ---- com.kestrelon.simulator.tessel.NetworkSimulator ----

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_NetworkSimulator_nativeInitAgentParams(
    JNIEnv* env, jobject self, jboolean consoleMode, jbyte debugLevel, jstring logFile,
    jint /*reserved*/, jint maxLogFileSize) {
  return Guarded<jboolean>(JNI_FALSE, [&]() -> jboolean {
    JniHost& host = JniHost::Instance();
    if (!host.BindNetworkSimulator(env, self)) return JNI_FALSE;
    InstallHost(&host);
    EngineParams params{consoleMode == JNI_TRUE, static_cast<std::uint8_t>(debugLevel),
                        Text(env, logFile), static_cast<std::uint32_t>(maxLogFileSize)};
    return ToJboolean(InitAgentParams(params));
  });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_NetworkSimulator_jniBaseLoop(JNIEnv*, jobject) {
  BaseLoop();
  return JNI_TRUE;
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_NetworkSimulator_AdapterJniStopSnmp(JNIEnv*, jobject) {
  return Guarded<jboolean>(JNI_FALSE, [] { return ToJboolean(AdapterJniStopSnmp()); });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_NetworkSimulator_AdapterJniStopNetwork(JNIEnv*, jobject) {
  return Guarded<jboolean>(JNI_FALSE, [] { return ToJboolean(AdapterJniStopNetwork()); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_NetworkSimulator_dropV1V2Requests(
    JNIEnv*, jobject, jshort flag) {
  gv_dropV1V2Requests = flag;
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_NetworkSimulator_processV1RequestsOnly(
    JNIEnv*, jobject, jshort flag) {
  gv_processV1Only = flag;
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_NetworkSimulator_processV2RequestsOnly(
    JNIEnv*, jobject, jshort flag) {
  gv_processV2Only = flag;
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_NetworkSimulator_scramblePdu(JNIEnv*,
                                                                                        jobject,
                                                                                        jint flag) {
  gv_scramblePdu = flag;
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_NetworkSimulator_jniGetEngineBootCounts(JNIEnv*, jobject) {
  return static_cast<jint>(gv_engineBoots.load());
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_NetworkSimulator_GetIPv6InterfaceIndex(JNIEnv*, jobject) {
  // The adapter is selected at first need; its index scopes IPv6 link-local binds.
  std::int32_t index = gv_ipv6InterfaceIndex.load();
  if (index == 0) {
    index = Guarded<std::int32_t>(0, [] {
      std::optional<NetworkInterface> adapter = TheVirtualIps().Adapter();
      return adapter ? static_cast<std::int32_t>(adapter->index) : 0;
    });
    gv_ipv6InterfaceIndex = index;
  }
  LOG_TRACE("Value from GetIPv6InterfaceIndex .... [%d] ", index);
  return index;
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_NetworkSimulator_GetTL1AgentID(JNIEnv*,
                                                                                          jobject) {
  return 0;
}

// ---- com.kestrelon.simulator.tessel.snmp.SnmpHandler ----

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_jniJVMparams(JNIEnv* env, jobject self) {
  return Guarded<jboolean>(JNI_FALSE, [&]() -> jboolean {
    JniHost& host = JniHost::Instance();
    if (!host.BindSnmpHandler(env, self)) return JNI_FALSE;
    InstallHost(&host);
    InitSnmpParams();
    InitAgentRegistry();
    return JNI_TRUE;
  });
}

JNIEXPORT jintArray JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_startSnmpNetwork(
    JNIEnv* env, jobject, jintArray agentIds, jobjectArray tableNames, jobjectArray addresses,
    jintArray ports, jobjectArray readCommunities, jobjectArray writeCommunities,
    jintArray engineBoots, jstring databaseName, jintArray ipv6Flags) {
  return Guarded<jintArray>(nullptr, [&]() -> jintArray {
    auto ids = IntsFromJava(env, agentIds), portList = IntsFromJava(env, ports),
         boots = IntsFromJava(env, engineBoots), ipv6 = IntsFromJava(env, ipv6Flags);
    auto tables = StringsFromJava(env, tableNames), addressList = StringsFromJava(env, addresses),
         reads = StringsFromJava(env, readCommunities),
         writes = StringsFromJava(env, writeCommunities);
    if (!ids || !portList || !boots || !ipv6 || !tables || !addressList || !reads || !writes) {
      LOG_ERROR("unable to allocate memory cArray \n");
      return nullptr;
    }
    NetworkArrays arrays{*ids, *portList, *boots, *ipv6, *tables, *addressList, *reads, *writes};
    if (!arrays.CoverAgents()) {
      LOG_ERROR("startSnmpNetwork: an agent array is shorter than the agent ids\n");
      return nullptr;
    }
    std::string database = Text(env, databaseName);
    std::vector<AgentRegistration> agents;
    for (std::size_t i = 0; i < arrays.AgentCount(); ++i)
      agents.push_back(arrays.Agent(i, database));
    std::vector<std::int32_t> results;
    for (std::int64_t socket : StartSnmpNetwork(agents))
      results.push_back(HostSocketHandle(socket));
    return IntsToJava(env, results);
  });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_nativePassOneAgentInfo(
    JNIEnv* env, jobject, jstring databaseName, jstring tableName, jstring /*ignored1*/,
    jstring address, jshort port, jobjectArray readCommunities, jobjectArray writeCommunities,
    jstring /*ignored2*/, jint agentId, jint ipv6Flag) {
  return Guarded<jint>(-1, [&] {
    AgentRegistration agent;
    agent.agentId = agentId;
    agent.address = Text(env, address);
    agent.port = static_cast<std::uint16_t>(port);
    agent.readCommunities = Texts(env, readCommunities);
    agent.writeCommunities = Texts(env, writeCommunities);
    agent.databaseName = Text(env, databaseName);
    agent.tableName = Text(env, tableName);
    agent.ipv6Flag = ipv6Flag;
    return RegisterAgentInfo(agent);
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_startAgent(
    JNIEnv* env, jobject, jstring address, jint port, jint engineBoots) {
  return Guarded<jboolean>(JNI_FALSE, [&]() -> jboolean {
    return ToJboolean(
        StartAgentAndService(Text(env, address), port, static_cast<std::uint32_t>(engineBoots)));
  });
}

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_stopAgent(
    JNIEnv* env, jobject, jstring address, jint port) {
  return Guarded<jboolean>(
      JNI_FALSE, [&]() -> jboolean { return ToJboolean(StopAgent(Text(env, address), port)); });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_restartAgent(JNIEnv*, jobject, jint index) {
  return Guarded<jboolean>(JNI_FALSE,
                           [&]() -> jboolean { return ToJboolean(RestartAgent(index)); });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_initSnmpThread(JNIEnv*, jobject) {
  return Guarded<jboolean>(JNI_FALSE, [] { return ToJboolean(InitSnmpThread()); });
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_jnistoreTreeCellReferences(JNIEnv*, jobject) {
  return Guarded<jint>(0, [] { return StoreTreeCellsRefInArray(); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_setCommunitiesValue(
    JNIEnv* env, jobject, jstring address, jobjectArray read, jobjectArray write, jint mode) {
  GuardedVoid(
      [&] { SetCommunitiesValue(Text(env, address), Texts(env, read), Texts(env, write), mode); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_SetTrapPort(JNIEnv*,
                                                                                        jobject,
                                                                                        jint port) {
  gv_trapPort = static_cast<std::uint16_t>(port);
}

JNIEXPORT void JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_setEngineBootCount(JNIEnv*, jobject, jint) {}

JNIEXPORT jstring JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_GetNextGroupOid(
    JNIEnv* env, jobject, jstring oid) {
  return Guarded<jstring>(nullptr,
                          [&] { return OptionalText(env, GetNextGroupOid(Text(env, oid))); });
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_SendV1TimerTrap(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring enterprise,
    jint generic, jint specific, jobjectArray oids, jintArray types, jobjectArray values,
    jint agentId, jstring agentText) {
  SendV1(env, host, port, community, enterprise, generic, specific, oids, types, values, agentId,
         agentText);
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpHandler_SendV2TimerTrap(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring trapOid,
    jobjectArray oids, jintArray types, jobjectArray values, jint agentId, jstring agentText,
    jint selector) {
  SendV2(env, host, port, community, trapOid, oids, types, values, agentId, agentText, selector);
}

// ---- com.kestrelon.simulator.tessel.snmp.SnmpTrapService ----

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpTrapService_SendV1Trap(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring enterprise,
    jint generic, jint specific, jobjectArray oids, jintArray types, jobjectArray values,
    jint agentId, jstring agentText) {
  SendV1(env, host, port, community, enterprise, generic, specific, oids, types, values, agentId,
         agentText);
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpTrapService_SendV2Trap(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring trapOid,
    jobjectArray oids, jintArray types, jobjectArray values, jint agentId, jstring agentText,
    jint selector) {
  SendV2(env, host, port, community, trapOid, oids, types, values, agentId, agentText, selector);
}

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpTrapService_SendV3Trap(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring trapOid,
    jstring userName, jstring contextName, jobjectArray oids, jintArray types, jobjectArray values,
    jint agentId, jstring agentText) {
  SendV3(kTrapV2, env, host, port, community, trapOid, userName, contextName, oids, types, values,
         agentId, agentText);
}

// ---- com.kestrelon.simulator.tessel.snmp.SnmpInformInterfaceImpl ----

JNIEXPORT void JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpInformInterfaceImpl_SendV2Inform(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring trapOid,
    jobjectArray oids, jintArray types, jobjectArray values, jint agentId, jstring agentText,
    jint selector) {
  SendV2(env, host, port, community, trapOid, oids, types, values, agentId, agentText, selector);
}

JNIEXPORT void JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpInformInterfaceImpl_SendV3Inform(
    JNIEnv* env, jobject, jstring host, jint port, jstring community, jstring trapOid,
    jstring userName, jstring contextName, jobjectArray oids, jintArray types, jobjectArray values,
    jint agentId, jstring agentText) {
  SendV3(kInformRequest, env, host, port, community, trapOid, userName, contextName, oids, types,
         values, agentId, agentText);
}

// ---- com.kestrelon.simulator.tessel.snmp.SnmpRegister ----

JNIEXPORT jboolean JNICALL Java_com_kestrelon_simulator_tessel_snmp_SnmpRegister_JniCreateTreeCell(
    JNIEnv* env, jobject, jstring label, jstring /*unused*/, jstring version, jstring oid,
    jint count, jobjectArray subIds, jobjectArray dataTypes, jobjectArray access, jboolean isTable,
    jint rowStatusColumn, jobjectArray syntaxes) {
  return Guarded<jboolean>(JNI_FALSE, [&]() -> jboolean {
    auto subIdTexts = FirstTexts(env, subIds, count), typeTexts = FirstTexts(env, dataTypes, count),
         accessTexts = FirstTexts(env, access, count);
    std::optional<std::vector<std::string>> syntaxTexts;
    if (syntaxes != nullptr) syntaxTexts = FirstTexts(env, syntaxes, count);
    if (!subIdTexts || !typeTexts || !accessTexts || (syntaxes != nullptr && !syntaxTexts)) {
      LOG_ERROR("JniCreateTreeCell: fewer columns given than the count %d\n", count);
      return JNI_FALSE;
    }
    TreeCellRegistration cell{Text(env, label),    Text(env, version), Text(env, oid),
                              *subIdTexts,         *typeTexts,         *accessTexts,
                              isTable == JNI_TRUE, rowStatusColumn,    syntaxTexts};
    CreateAndRegisterCell(cell);
    return JNI_TRUE;
  });
}

JNIEXPORT jboolean JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SnmpRegister_isAlreadyRegistered(JNIEnv*, jobject,
                                                                          jstring) {
  return JNI_TRUE;
}

// ---- com.kestrelon.simulator.tessel.snmp.GetModeInfoImpl ----

JNIEXPORT jstring JNICALL Java_com_kestrelon_simulator_tessel_snmp_GetModeInfoImpl_GetModeInfo(
    JNIEnv* env, jobject, jstring address, jstring port) {
  return Guarded<jstring>(
      nullptr, [&] { return OptionalText(env, GetModeInfo(Text(env, address), Text(env, port))); });
}

JNIEXPORT jint JNICALL Java_com_kestrelon_simulator_tessel_snmp_GetModeInfoImpl_GetAgentID(
    JNIEnv* env, jobject, jstring address, jstring) {
  return Guarded<jint>(-1, [&] { return GetAgentID(Text(env, address)); });
}

// ---- com.kestrelon.simulator.tessel.utils.DebugScheduler ----

JNIEXPORT void JNICALL Java_com_kestrelon_simulator_tessel_utils_DebugScheduler_setDebugFile(
    JNIEnv* env, jobject, jstring path) {
  if (path == nullptr) return;
  GuardedVoid([&] { SwitchLogFile(Text(env, path)); });
}

// ---- com.kestrelon.simulator.tessel.snmp.SerToCConverter ----

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SerToCConverter_nativeAddUsmUserEntry(
    JNIEnv* env, jobject, jstring userName, jstring authProtocol, jstring authPassword,
    jstring privProtocol, jstring privPassword, jint discoveryTimeFlag) {
  return Guarded<jint>(99, [&] {
    return AddUsmUserFromHost(Text(env, userName), Text(env, authProtocol), Text(env, authPassword),
                              Text(env, privProtocol), Text(env, privPassword), discoveryTimeFlag);
  });
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SerToCConverter_nativeAddContextEntry(
    JNIEnv* env, jobject, jstring contextName) {
  return Guarded<jint>(
      99, [&] { return CreateAndAddSnmpVacmContextTableEntry(Text(env, contextName)); });
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SerToCConverter_nativeAddSecurityToGroupEntry(
    JNIEnv* env, jobject, jint securityModel, jstring securityName, jstring groupName,
    jint /*ignored*/, jint storageType) {
  return Guarded<jint>(99, [&] {
    return CreateAndAddSnmpVacmSecurityToGroupTableEntry(securityModel, Text(env, securityName),
                                                         Text(env, groupName), storageType);
  });
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SerToCConverter_nativeAddAccessEntry(
    JNIEnv* env, jobject, jstring groupName, jstring contextPrefix, jint securityModel,
    jint securityLevel, jint contextMatch, jstring readView, jstring writeView, jstring notifyView,
    jint storageType, jint /*ignored*/) {
  return Guarded<jint>(99, [&] {
    return CreateAndAddNewSnmpVacmAccessTableEntry(
        Text(env, groupName), Text(env, contextPrefix), securityModel, securityLevel, contextMatch,
        Text(env, readView), Text(env, writeView), Text(env, notifyView), storageType);
  });
}

JNIEXPORT jint JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SerToCConverter_nativeAddViewTreeEntry(
    JNIEnv* env, jobject, jstring viewName, jstring subtree, jstring mask, jint type,
    jint storageType, jint /*ignored*/) {
  return Guarded<jint>(99, [&] {
    return CreateAndAddSnmpVacmViewTreeFamilyTableEntry(Text(env, viewName), Text(env, subtree),
                                                        Text(env, mask), type, storageType);
  });
}

JNIEXPORT void JNICALL
Java_com_kestrelon_simulator_tessel_snmp_SerToCConverter_nativeCreateLCDVectors(JNIEnv*, jobject) {
  GuardedVoid([] {
    CreateLCDVacmAccessTable();
    CreateLCDVacmViewTreeFamilyTable();
  });
}

// ---- com.kestrelon.simulator.nqx.ReportsUI ----

JNIEXPORT jintArray JNICALL
Java_com_kestrelon_simulator_nqx_ReportsUI_getReportOverviewDetails(JNIEnv* env, jobject) {
  return Guarded<jintArray>(nullptr, [&] { return IntsToJava(env, GetReportOverviewDetails()); });
}

JNIEXPORT jintArray JNICALL Java_com_kestrelon_simulator_nqx_ReportsUI_getErrorLogs(JNIEnv* env,
                                                                                    jobject) {
  return Guarded<jintArray>(nullptr, [&] { return IntsToJava(env, GetErrorLogs()); });
}

JNIEXPORT jobjectArray JNICALL Java_com_kestrelon_simulator_nqx_ReportsUI_getIpAddrArr(JNIEnv* env,
                                                                                       jobject,
                                                                                       jint n) {
  return Guarded<jobjectArray>(nullptr, [&] {
    std::size_t size = std::min(static_cast<std::size_t>(std::max(n, 0)), kMaxStringArray);
    return StringsToJava(env, GetIpAddrArr(n), size);
  });
}

}  // extern "C"
