#include "notify/notifier.h"

#include <arpa/inet.h>
#include <netdb.h>

#include <chrono>
#include <cstring>

#include "base/clock.h"
#include "engine/agent_registry.h"
#include "engine/host_bridge.h"
#include "engine/log.h"
#include "notify/inform_list.h"
#include "notify/notification_log.h"
#include "notify/trap_pdu.h"
#include "notify/v3_inform.h"
#include "notify/v3_notification.h"
#include "snmp/agent_sockets.h"
#include "snmp/message.h"
#include "snmp/pdu_dump.h"
#include "snmp/statistics.h"
#include "snmp/value_text.h"
#include "snmpv3/v3_message.h"
#include "transport/udp.h"

namespace tessel {
namespace {

constexpr std::int32_t kHostOctetStringType = 153;

std::uint64_t SteadyMilliseconds() {
  return static_cast<std::uint64_t>(std::chrono::duration_cast<std::chrono::milliseconds>(
                                        std::chrono::steady_clock::now().time_since_epoch())
                                        .count());
}

// Sends from the device's agent socket, held open for the send; false when the device no longer
// runs on it.
bool SendFromDevice(const DeviceEndpoint& device, const NotificationTarget& target,
                    const std::vector<std::uint8_t>& message) {
  std::optional<AgentSession> session = FindAgentSession(device.address, device.port);
  if (!session || session->socket == kNoSocket) return false;
  std::shared_ptr<const AgentSocket> socket = FindAgentSocket(static_cast<int>(session->socket));
  if (!socket || socket->Session().transport.localAddress != device.address ||
      ConfiguredPort(socket->Session().transport) != device.port)
    return false;
  TransportDomainInfo transport = socket->Session().transport;
  transport.peerSockAddr = target.managerSockAddr;
  transport.peerAddress = target.managerAddress;
  transport.peerPort = target.managerPort;
  if (!SendUdpPacket(transport, socket->Descriptor(), message.data(), message.size(), false))
    return false;
  CountSnmp(SnmpCounter::kOutMessages);
  CountSnmp(SnmpCounter::kOutTraps);
  return true;
}

InformReport ReportOf(const PendingInform& inform) {
  InformReport report;
  report.informId = inform.informId;
  report.requestId = inform.requestId;
  report.version = inform.target.version;
  report.community = inform.target.community;
  report.userName = inform.target.userName;
  report.contextName = inform.target.contextName;
  report.managerAddress = inform.target.managerAddress;
  report.managerPort = inform.target.managerPort;
  report.deviceAddress = inform.device.address;
  return report;
}

void ReportDropped(const PendingInform& inform) {
  if (LogEnabled(kLogInfo)) {
    LogWrite("Manager Information: \n\n");
    LogWrite("User Name\t\t\t= %s\n", inform.target.userName.c_str());
    LogWrite("Context Name\t\t\t= %s\n", inform.target.contextName.c_str());
    LogWrite("Manager Address\t\t= %s\n", inform.target.managerAddress.c_str());
    LogWrite("Manager Port Num\t\t= %d\n", inform.target.managerPort);
    LogWrite("\n Inform Id = %u \n", inform.informId);
  }
  InformReport report = ReportOf(inform);
  BindingsToHostTexts(inform.bindings, &report);
  if (HostBridge* host = InstalledHost()) host->StoreDroppedInformMessage(report);
}

InformList& Informs() {
  static InformList* informs = new InformList(  // never destroyed: its timer may outlive exit
      [](const PendingInform& inform) {
        return SendFromDevice(inform.device, inform.target, inform.message);
      },
      ReportDropped);
  return *informs;
}

V3InformSender& V3Informs() {
  static V3InformSender* sender =  // never destroyed, as the inform list it feeds
      new V3InformSender(Informs(), ReportDropped, SteadyMilliseconds);
  return *sender;
}

// An SNMPv3 inform goes to the sender's thread, which discovers the manager first.
NotifyOutcome QueueV3Inform(const SnmpPdu& pdu, const NotificationTarget& target,
                            const AgentSession& device) {
  V3Refusal refusal = V3Refusal::kNone;
  std::optional<UsmUser> user = V3Principal(pdu, target, &refusal);
  if (!user) return {NotifyResult::kRefused};
  V3InformJob job;
  job.pdu = pdu;
  job.target = target;
  job.device = {device.transport.localAddress, ConfiguredPort(device.transport)};
  job.ipv6 = device.transport.isIPv6 != 0;
  job.user = std::move(*user);
  job.informId = Informs().ReserveInformId();
  std::uint32_t informId = job.informId;
  V3Informs().Queue(std::move(job));
  return {NotifyResult::kSent, informId};
}

// A message of another engine that reaches a device: the Response to one of its SNMPv3 informs
// when it names the inform's msgID and is authentic at the inform's level. Whatever else names
// that msgID (a Report of the manager's) is taken too, and leaves the inform waiting: it is no
// request of the agent's to answer.
bool ReceiveV3Message(const std::uint8_t* message, std::size_t length, const AgentSession& agent) {
  V3Received header;
  ParseV3Message(message, length, nullptr, &header);
  ResponseOrigin origin;
  origin.device = {agent.transport.localAddress, ConfiguredPort(agent.transport)};
  origin.manager = agent.transport.peerSockAddr;
  std::optional<V3InformSecurity> security = Informs().FindV3(origin, header.msgId);
  if (!security) return false;
  V3Received received;
  if (!ParseV3Message(message, length, &security->user, &received) ||
      received.level != security->level || received.engineId != security->engineId ||
      received.pdu.type != kGetResponse) {
    LOG_ERROR("The answer to an SNMPv3 inform is not its authentic Response\n");
    return true;
  }
  AcknowledgeInform(Informs(), received.pdu, agent);
  return true;
}

std::optional<Oid> OidFromText(const std::string& text) {
  Oid oid;
  std::string dotted = !text.empty() && text[0] == '.' ? text : "." + text;
  if (ParseDottedText(&oid, dotted, false) <= 0) return std::nullopt;
  return oid;
}

std::optional<VarBindList> BindingsFromTexts(const NotificationBindingTexts& texts,
                                             NotifyResult* failure) {
  VarBindList bindings;
  if (!texts.oids && !texts.types && !texts.values) return bindings;
  if (!texts.oids || !texts.types || !texts.values || texts.oids->size() != texts.types->size() ||
      texts.oids->size() != texts.values->size()) {
    LOG_ERROR("error:arrays are of different sizes \n");
    *failure = NotifyResult::kBadArrays;
    return std::nullopt;
  }
  for (std::size_t i = 0; i < texts.oids->size(); ++i) {
    std::int32_t type = (*texts.types)[i];
    if (type == kHostOctetStringType) type = kAsnOctetString;
    std::optional<Oid> name = OidFromText((*texts.oids)[i]);
    std::optional<VarValue> value =
        type < 0 || type > 0xFF
            ? std::nullopt
            : TextToVarValue(static_cast<std::uint8_t>(type), "", (*texts.values)[i]);
    if (!name || !value) {
      LOG_ERROR("Parse var option is failed ..... binding %zu (%s)\n", i + 1,
                (*texts.oids)[i].c_str());
      *failure = NotifyResult::kBadBinding;
      return std::nullopt;
    }
    VarBind binding;
    binding.name = std::move(*name);
    binding.value = std::move(*value);
    bindings.push_back(std::move(binding));
  }
  return bindings;
}

std::optional<SnmpPdu> BuildPdu(const NotificationRequest& request, VarBindList bindings,
                                const AgentSession& device, NotifyResult* failure) {
  std::uint32_t upTime = UptimeSince(device.agentInfo->startTime, true);
  if (request.pduType == kTrapV1) {
    std::optional<Oid> enterprise = OidFromText(request.enterprise);
    if (!enterprise) {
      LOG_ERROR("The enterprise OID %s is not valid\n", request.enterprise.c_str());
      *failure = NotifyResult::kBadBinding;
      return std::nullopt;
    }
    return BuildV1Trap(*enterprise, AgentAddressOf(device.transport.localAddress),
                       request.genericTrap, request.specificTrap, upTime, std::move(bindings));
  }
  std::optional<Oid> trapOid = OidFromText(request.trapOid);
  if (!trapOid) {
    LOG_ERROR("The snmpTrapOID %s is not valid\n", request.trapOid.c_str());
    *failure = NotifyResult::kBadBinding;
    return std::nullopt;
  }
  return BuildV2Notification(request.pduType, upTime, *trapOid, std::move(bindings));
}

}  // namespace

bool ResolveNotificationTarget(const std::string& host, std::uint16_t port,
                               NotificationTarget* target) {
  PeerSocketAddress address{};
  if (host.find(':') != std::string::npos) {
    std::string bare = host.size() > 2 && host.front() == '[' && host.back() == ']'
                           ? host.substr(1, host.size() - 2)
                           : host;
    address.v6.sin6_family = AF_INET6;
    address.v6.sin6_port = htons(port);
    if (inet_pton(AF_INET6, bare.c_str(), &address.v6.sin6_addr) != 1) return false;
    target->managerAddress = bare;
  } else {
    addrinfo hints{};
    hints.ai_family = AF_INET;
    hints.ai_socktype = SOCK_DGRAM;
    addrinfo* found = nullptr;
    if (getaddrinfo(host.c_str(), nullptr, &hints, &found) != 0 || found == nullptr) return false;
    std::memcpy(&address.v4, found->ai_addr, sizeof address.v4);
    freeaddrinfo(found);
    address.v4.sin_port = htons(port);
    char text[INET_ADDRSTRLEN] = {};
    inet_ntop(AF_INET, &address.v4.sin_addr, text, sizeof text);
    target->managerAddress = text;
  }
  target->managerSockAddr = address;
  target->managerPort = port;
  return true;
}

NotifyOutcome DeliverNotification(const SnmpPdu& built, const NotificationTarget& target,
                                  const AgentSession& device) {
  std::optional<SnmpPdu> pdu =
      NotificationForVersion(built, target.version, AgentAddressOf(device.transport.localAddress));
  if (!pdu) {
    LOG_ERROR("The notification has no form for an SNMP version %d manager\n", target.version);
    return {NotifyResult::kNoForm};
  }
  pdu->community = target.version == kSnmpV3 ? "" : target.community;
  pdu->requestId = NextNotificationRequestId();
  if (target.version == kSnmpV3 && pdu->type == kInformRequest)
    return QueueV3Inform(*pdu, target, device);
  DumpNotification(target, *pdu);
  V3Refusal refusal = V3Refusal::kNone;
  std::vector<std::uint8_t> message = target.version == kSnmpV3
                                          ? EncodeV3Trap(*pdu, target, device, &refusal)
                                          : EncodeNotification(*pdu);
  if (refusal != V3Refusal::kNone && refusal != V3Refusal::kNotEncoded)
    return {NotifyResult::kRefused};
  if (message.empty()) return {NotifyResult::kNoForm};
  DeviceEndpoint endpoint{device.transport.localAddress, ConfiguredPort(device.transport)};
  if (pdu->type != kInformRequest) {
    LOG_TRACE("\nSending Traps ...\n");
    if (SendFromDevice(endpoint, target, message)) return {NotifyResult::kSent};
    LOG_ERROR("The trap of %s could not be sent\n", endpoint.address.c_str());
    return {NotifyResult::kNotSent};
  }
  PendingInform inform;
  inform.requestId = pdu->requestId;
  inform.device = endpoint;
  inform.target = target;
  inform.message = std::move(message);
  inform.bindings = pdu->requestVarBinds;
  InformList::Added added = Informs().Add(std::move(inform), SteadyMilliseconds());
  return {added.sent ? NotifyResult::kSent : NotifyResult::kNotSent, added.informId};
}

NotifyOutcome SendNotification(const NotificationRequest& request) {
  NotifyResult failure = NotifyResult::kSent;
  std::optional<VarBindList> bindings = BindingsFromTexts(request.bindings, &failure);
  if (!bindings) return {failure};
  NotificationTarget target;
  target.version = request.version;
  target.community = request.community;
  target.userName = request.userName;
  target.contextName = request.contextName;
  target.timeout = request.timeout;
  target.retries = request.retries;
  if (!ResolveNotificationTarget(request.managerHost,
                                 static_cast<std::uint16_t>(request.managerPort), &target)) {
    LOG_ERROR("Unable to resolve host : %s\n", request.managerHost.c_str());
    LOG_ERROR("Hence trap cannot be sent ..... \n");
    return {NotifyResult::kUnresolved};
  }
  std::optional<AgentSession> device = FindStartedAgentById(request.agentId);
  if (!device) {
    LOG_ERROR("Could not get td info for %s\n", request.agentText.c_str());
    return {NotifyResult::kNoDevice};
  }
  std::optional<SnmpPdu> pdu = BuildPdu(request, std::move(*bindings), *device, &failure);
  if (!pdu) return {failure};
  return DeliverNotification(*pdu, target, *device);
}

bool AcknowledgeInform(InformList& informs, const SnmpPdu& pdu, const AgentSession& agent) {
  ResponseOrigin origin;
  origin.device = {agent.transport.localAddress, ConfiguredPort(agent.transport)};
  origin.manager = agent.transport.peerSockAddr;
  origin.community = pdu.community;
  std::optional<PendingInform> answered = informs.Acknowledge(origin, pdu.requestId);
  if (!answered) {
    LOG_TRACE("No inform is outstanding: the response is dropped\n");
    return false;
  }
  DumpPdu(pdu);
  LOG_INFO("Inform received!\n");
  InformReport report = ReportOf(*answered);
  report.errorStatus = pdu.errorStatus;
  report.errorIndex = pdu.errorIndex;
  BindingsToHostTexts(pdu.requestVarBinds, &report);
  if (HostBridge* host = InstalledHost()) host->LogResponseMessage(report);
  LOG_INFO("\n Inform Id = %u \n", answered->informId);
  return true;
}

bool ReceiveResponse(const SnmpPdu& pdu, const AgentSession& agent) {
  return AcknowledgeInform(Informs(), pdu, agent);
}

void InitNotifications() {
  InstallResponseReceiver(ReceiveResponse);
  InstallV3MessageReceiver(ReceiveV3Message);
  Informs().StartTimer(SteadyMilliseconds);
}

void StopNotifications() {
  V3Informs().Stop();
  Informs().StopTimer();
  Informs().Clear();
}

std::size_t PendingInforms() { return Informs().Pending(); }

}  // namespace tessel
