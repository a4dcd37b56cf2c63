// Seconds to add and then remove COUNT device addresses on an interface through the engine's
// address manager, inside an existing network namespace (bench/vip.sh makes one).
//   tessel_vip_bench NAMESPACE INTERFACE COUNT 4|6
#include <fcntl.h>
#include <sched.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "vip/virtual_ips.h"

namespace {

double SecondsSince(std::chrono::steady_clock::time_point start) {
  return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

std::string Address(std::size_t i, bool isIPv6) {
  char text[48];
  if (isIPv6) {
    std::snprintf(text, sizeof text, "fd00:%zx::%zx", 1 + i / 60000, 1 + i % 60000);
  } else {
    std::snprintf(text, sizeof text, "10.%zu.%zu.%zu", 1 + i / 62500, i % 62500 / 250, 1 + i % 250);
  }
  return text;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 5) {
    std::fprintf(stderr, "usage: %s NAMESPACE INTERFACE COUNT 4|6\n", argv[0]);
    return 2;
  }
  const std::string path = std::string("/run/netns/") + argv[1];
  int descriptor = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (descriptor < 0 || setns(descriptor, CLONE_NEWNET) != 0) {
    std::perror(path.c_str());
    return 2;
  }
  close(descriptor);
  const std::size_t count = std::strtoul(argv[3], nullptr, 10);
  const bool isIPv6 = std::string(argv[4]) == "6";
  std::vector<std::string> addresses;
  for (std::size_t i = 0; i < count; ++i) addresses.push_back(Address(i, isIPv6));
  const std::vector<std::int32_t> flags(count, isIPv6 ? 1 : 0);

  tessel::VirtualIps& ips = tessel::TheVirtualIps();
  auto start = std::chrono::steady_clock::now();
  std::vector<std::int32_t> statuses = ips.Add(addresses, flags, argv[2]);
  const double added = SecondsSince(start);
  const auto ok = std::count(statuses.begin(), statuses.end(), tessel::kVipAdded);
  start = std::chrono::steady_clock::now();
  const std::size_t removed = ips.RemoveAll();
  const double removing = SecondsSince(start);
  std::printf("IPv%c %zu addresses: added %ld in %.3f s, removed %zu in %.3f s\n", isIPv6 ? '6' : '4',
              count, static_cast<long>(ok), added, removed, removing);
  return ok == static_cast<long>(count) && removed == count ? 0 : 1;
}
