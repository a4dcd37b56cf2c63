// tessel_tl1memory: the engine's own memory per idle TL1 agent, without the Java host. Registers
// and starts agents on a Tl1Service as the host does (one listener each, on consecutive loopback
// addresses) and reports the heap bytes the C library has handed out and the process's resident
// memory, for one agent and for all of them; what lies between, divided by the further agents, is
// what each agent costs.
//   tessel_tl1memory [--agents N] [--address A] [--port P]
// Prints "RESULT agents=.. heap_per_agent=.. rss_per_agent=.. registered_heap_per_agent=..".
#include <arpa/inet.h>
#include <malloc.h>
#include <sys/resource.h>

#include <cstdio>
#include <fstream>
#include <string>
#include <utility>

#include "options.h"
#include "tl1/tl1_service.h"

namespace {

using tessel::bench::ArgumentReader;

std::size_t HeapInUse() { return mallinfo2().uordblks + mallinfo2().hblkhd; }

std::size_t ResidentBytes() {
  std::ifstream status("/proc/self/status");
  std::string line;
  while (std::getline(status, line))
    if (line.rfind("VmRSS:", 0) == 0) return std::stoul(line.substr(6)) * 1024;
  return 0;
}

// Agent i (0-based) as the host registers it: id i + 1, named NEi+1, on its own address.
tessel::Tl1Agent AgentAt(int i, const sockaddr_in& address) {
  char text[INET_ADDRSTRLEN] = {};
  inet_ntop(AF_INET, &address.sin_addr, text, sizeof text);
  return {i + 1, "NE" + std::to_string(i + 1), text, ntohs(address.sin_port), "optical",
          "device" + std::to_string(i + 1), ""};
}

}  // namespace

int main(int argc, char** argv) {
  int agents = 10000;
  std::string address = "127.20.0.1";
  std::uint16_t port = 11402;
  ArgumentReader reader(argc, argv);
  std::string name;
  std::string value;
  while (reader.Next(&name)) {
    bool ok = reader.Value(&value);
    if (ok && name == "--agents") {
      ok = tessel::bench::ParseInt(value, 2, 100000, &agents);
    } else if (ok && name == "--address") {
      address = value;
    } else if (ok && name == "--port") {
      ok = tessel::bench::ParsePort(value, &port);
    } else {
      ok = false;
    }
    if (!ok) {
      std::fprintf(stderr, "usage: tessel_tl1memory [--agents N] [--address A] [--port P]\n");
      return 2;
    }
  }
  std::vector<sockaddr_in> addresses;
  if (!tessel::bench::ParseTargets(address + "+" + std::to_string(agents), port, &addresses)) {
    std::fprintf(stderr, "tessel_tl1memory: %s is not a loopback address range\n", address.c_str());
    return 2;
  }
  rlimit files{};
  getrlimit(RLIMIT_NOFILE, &files);
  files.rlim_cur = files.rlim_max;
  setrlimit(RLIMIT_NOFILE, &files);

  tessel::Tl1ServiceOptions options;
  options.status = [](const std::string&) {};
  tessel::Tl1Service service(std::move(options));
  for (const char* code : {"RTRV-HDR", "RTRV-ALM", "ACT-USER", "CANC-USER"})
    service.Registry().RegisterCmd(code);
  tessel::Tl1Agent one = AgentAt(0, addresses[0]);
  service.RegisterAgent(one, one.agentId);
  if (!service.StartAgent(one.ipAddress, one.port)) {
    std::fprintf(stderr, "tessel_tl1memory: cannot listen on %s port %u\n", address.c_str(), port);
    return 1;
  }
  std::size_t heapOne = HeapInUse();
  std::size_t residentOne = ResidentBytes();
  for (int i = 1; i < agents; ++i) {
    tessel::Tl1Agent agent = AgentAt(i, addresses[i]);
    service.RegisterAgent(agent, agent.agentId);
  }
  std::size_t heapRegistered = HeapInUse();
  for (int i = 1; i < agents; ++i) {
    tessel::Tl1Agent agent = AgentAt(i, addresses[i]);
    if (!service.StartAgent(agent.ipAddress, agent.port)) {
      std::fprintf(stderr, "tessel_tl1memory: agent %d cannot listen\n", i + 1);
      return 1;
    }
  }
  std::size_t heapAll = HeapInUse();
  std::size_t residentAll = ResidentBytes();
  double further = agents - 1;
  std::printf("RESULT agents=%d heap_per_agent=%.0f rss_per_agent=%.0f registered_heap_per_agent=%.0f\n",
              agents, (static_cast<double>(heapAll) - heapOne) / further,
              (static_cast<double>(residentAll) - residentOne) / further,
              (static_cast<double>(heapRegistered) - heapOne) / further);
  malloc_stats();
  service.Stop();
  return 0;
}
