// Fuzzes the path of a Response that reaches an agent while it has informs outstanding: message
// parsing, the match with the inform list, the traffic log and the bindings as the host's texts.
// Informs with request-ids 1 to 4 to the manager 127.0.0.1:162 stay outstanding (an answered one
// is sent again at once), so matching Responses are found as well as stray ones.
#include <arpa/inet.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include "notify/inform_list.h"
#include "notify/notifier.h"
#include "snmp/message.h"
#include "support/memory_host.h"

namespace {

using namespace tessel;

constexpr std::int32_t kOutstanding = 4;

PeerSocketAddress ManagerAddress() {
  PeerSocketAddress address{};
  address.v4.sin_family = AF_INET;
  address.v4.sin_port = htons(162);
  inet_pton(AF_INET, "127.0.0.1", &address.v4.sin_addr);
  return address;
}

InformList& Informs() {
  static InformList informs([](const PendingInform&) { return true; }, [](const PendingInform&) {});
  return informs;
}

AgentSession& Agent() {
  static AgentSession agent = [] {
    AgentSession session = LocalAgent(1);
    session.transport.peerSockAddr = ManagerAddress();
    return session;
  }();
  return agent;
}

void KeepOutstanding(std::int32_t requestId) {
  PendingInform inform;
  inform.requestId = requestId;
  inform.device = {Agent().transport.localAddress, ConfiguredPort(Agent().transport)};
  inform.target.managerSockAddr = ManagerAddress();
  inform.target.community = "public";
  Informs().Add(std::move(inform), 0);
}

bool Receive(const SnmpPdu& pdu, const AgentSession& agent) {
  if (!AcknowledgeInform(Informs(), pdu, agent)) return false;
  KeepOutstanding(pdu.requestId);
  return true;
}

bool SetUp() {
  static MemoryHost host;
  InstallHost(&host);
  InstallResponseReceiver(Receive);
  for (std::int32_t id = 1; id <= kOutstanding; ++id) KeepOutstanding(id);
  return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static bool ready = SetUp();
  static std::vector<std::uint8_t> reply(kMaxSnmpMessage);
  (void)ready;
  std::size_t replyLength = reply.size();
  ProcessSnmpMessage(data, size, reply.data(), &replyLength, Agent());
  if (Informs().Pending() != static_cast<std::size_t>(kOutstanding)) std::abort();
  return 0;
}
