// Device addresses on a real interface: a veth pair between two network namespaces that each test
// creates and deletes, one for the devices and one for a manager. Needs root; skipped (with the
// reason) where namespaces cannot be made.
#include <arpa/inet.h>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sched.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <set>
#include <string>

#include "vip/rtnetlink.h"
#include "vip/virtual_ips.h"

namespace tessel {
namespace {

bool Shell(const std::string& command) {
  return std::system((command + " 2>/dev/null").c_str()) == 0;
}

class NamespaceTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (geteuid() != 0) GTEST_SKIP() << "needs root to create network namespaces";
    static int serial = 0;
    devices_ = "tessel-vip-" + std::to_string(getpid()) + "-" + std::to_string(++serial);
    manager_ = devices_ + "-m";
    if (!Shell("ip netns add " + devices_) || !Shell("ip netns add " + manager_) ||
        !Shell("ip link add tv0 netns " + devices_ + " type veth peer name tv1 netns " +
               manager_) ||
        !Shell("ip -n " + devices_ + " link set tv0 up") ||
        !Shell("ip -n " + manager_ + " link set tv1 up")) {
      GTEST_SKIP() << "cannot create network namespaces with a veth pair here";
    }
    original_ = open("/proc/thread-self/ns/net", O_RDONLY | O_CLOEXEC);
    ASSERT_GE(original_, 0);
    Enter(devices_);
    kernel_ = new Rtnetlink;
    ips_ = std::make_unique<VirtualIps>(std::unique_ptr<AddressKernel>(kernel_));
    index_ = kernel_->InterfaceIndex("tv0").value_or(0);
    ASSERT_NE(index_, 0u);
  }
  void TearDown() override {
    ips_.reset();
    if (original_ >= 0) {
      setns(original_, CLONE_NEWNET);
      close(original_);
    }
    if (!devices_.empty()) {
      Shell("ip netns del " + devices_);
      Shell("ip netns del " + manager_);
    }
  }
  // This thread's sockets and netlink requests go to the namespace from now on.
  void Enter(const std::string& name) {
    int descriptor = open(("/run/netns/" + name).c_str(), O_RDONLY | O_CLOEXEC);
    ASSERT_GE(descriptor, 0);
    ASSERT_EQ(setns(descriptor, CLONE_NEWNET), 0) << std::strerror(errno);
    close(descriptor);
  }
  std::set<std::string> Present() {
    std::set<std::string> texts;
    for (const IpAddress& address : kernel_->Addresses(index_).value_or(std::vector<IpAddress>{})) {
      texts.insert(IpAddressText(address) + "/" + std::to_string(address.prefix));
    }
    return texts;
  }

  std::string devices_, manager_;
  int original_ = -1;
  Rtnetlink* kernel_ = nullptr;  // owned by ips_
  std::unique_ptr<VirtualIps> ips_;
  std::uint32_t index_ = 0;
};

TEST_F(NamespaceTest, ThousandsOfAddressesComeAndGoLeavingWhatWasThereBefore) {
  ASSERT_TRUE(Shell("ip -n " + devices_ + " addr add 10.9.0.1/24 dev tv0"));
  std::vector<std::string> addresses;
  std::vector<std::int32_t> isIPv6;
  for (int i = 0; i < 1000; ++i) {
    addresses.push_back("10.1." + std::to_string(i / 250) + "." + std::to_string(i % 250 + 1));
    isIPv6.push_back(0);
    char v6[40];
    std::snprintf(v6, sizeof v6, "fd00:1::%x", i + 1);
    addresses.push_back(v6);
    isIPv6.push_back(1);
  }
  addresses.push_back("10.9.0.1/24");  // there before: never the engine's
  isIPv6.push_back(0);
  std::vector<std::int32_t> statuses = ips_->Add(addresses, isIPv6, "tv0");
  EXPECT_EQ(std::count(statuses.begin(), statuses.end(), 1), 2000);
  EXPECT_EQ(statuses.back(), -2);
  std::set<std::string> present = Present();
  for (std::size_t i = 0; i < 2000; ++i) {
    EXPECT_EQ(present.count(addresses[i] + (isIPv6[i] ? "/128" : "/32")), 1u) << addresses[i];
  }
  // Names that are no interface here, or no interface name at all, add nothing.
  EXPECT_EQ(ips_->Add(addresses, isIPv6, "tv9")[0], -3);
  EXPECT_EQ(ips_->Add(addresses, isIPv6, "tv0; ip link del tv0")[0], 87);

  EXPECT_EQ(ips_->RemoveAll(), 2000u);
  present = Present();
  EXPECT_EQ(present.count("10.9.0.1/24"), 1u);
  EXPECT_EQ(std::count_if(present.begin(), present.end(),
                          [](const std::string& text) {
                            return text.starts_with("10.1.") || text.starts_with("fd00:1::");
                          }),
            0);
}

socklen_t SocketAddress(int family, const std::string& address, std::uint16_t port,
                        sockaddr_storage* storage) {
  *storage = {};
  if (family == AF_INET) {
    auto* v4 = reinterpret_cast<sockaddr_in*>(storage);
    v4->sin_family = AF_INET;
    v4->sin_port = htons(port);
    inet_pton(AF_INET, address.c_str(), &v4->sin_addr);
    return sizeof *v4;
  }
  auto* v6 = reinterpret_cast<sockaddr_in6*>(storage);
  v6->sin6_family = AF_INET6;
  v6->sin6_port = htons(port);
  inet_pton(AF_INET6, address.c_str(), &v6->sin6_addr);
  return sizeof *v6;
}

// A datagram from the manager's side of the veth to a device address and back.
void ExpectEcho(int family, const std::string& device, std::uint16_t port, int deviceSocket,
                int managerSocket) {
  sockaddr_storage target;
  socklen_t length = SocketAddress(family, device, port, &target);
  ASSERT_EQ(sendto(managerSocket, "ping", 4, 0, reinterpret_cast<sockaddr*>(&target), length), 4);
  char buffer[16];
  sockaddr_storage peer{};
  socklen_t peerLength = sizeof peer;
  ASSERT_EQ(recvfrom(deviceSocket, buffer, sizeof buffer, 0, reinterpret_cast<sockaddr*>(&peer),
                     &peerLength),
            4)
      << device << ": " << std::strerror(errno);
  ASSERT_EQ(sendto(deviceSocket, "pong", 4, 0, reinterpret_cast<sockaddr*>(&peer), peerLength), 4);
  ASSERT_EQ(recv(managerSocket, buffer, sizeof buffer, 0), 4) << device;
  EXPECT_EQ(std::string(buffer, 4), "pong");
}

int BoundSocket(int family, const std::string& address, std::uint16_t port) {
  int descriptor = socket(family, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  timeval timeout{5, 0};
  setsockopt(descriptor, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof timeout);
  sockaddr_storage local;
  socklen_t length = SocketAddress(family, address, port, &local);
  if (bind(descriptor, reinterpret_cast<sockaddr*>(&local), length) != 0) {
    ADD_FAILURE() << "bind " << address << ": " << std::strerror(errno);
  }
  return descriptor;
}

TEST_F(NamespaceTest, AnAddedAddressTakesABindAtOnceAndIsReachedAcrossTheLink) {
  ASSERT_TRUE(Shell("ip -n " + manager_ + " addr add 10.2.0.1/24 dev tv1"));
  ASSERT_TRUE(Shell("ip -n " + manager_ + " addr add fd00:2::1/64 dev tv1 nodad"));
  const std::vector<std::int32_t> isIPv6{0, 1};
  EXPECT_EQ(ips_->Add(std::vector<std::string>{"10.2.0.5/24", "fd00:2::5/64"}, isIPv6, "tv0"),
            (std::vector<std::int32_t>{1, 1}));
  // No wait for duplicate address detection: the bind succeeds right after the call returns.
  int device4 = BoundSocket(AF_INET, "10.2.0.5", 1161);
  int device6 = BoundSocket(AF_INET6, "fd00:2::5", 1161);
  Enter(manager_);
  int manager4 = BoundSocket(AF_INET, "10.2.0.1", 0);
  int manager6 = BoundSocket(AF_INET6, "fd00:2::1", 0);
  Enter(devices_);
  ExpectEcho(AF_INET, "10.2.0.5", 1161, device4, manager4);
  ExpectEcho(AF_INET6, "fd00:2::5", 1161, device6, manager6);
  for (int descriptor : {device4, device6, manager4, manager6}) close(descriptor);
  // The prefix the address was added with is the one it is removed with.
  EXPECT_EQ(ips_->RemoveAll(), 2u);
  EXPECT_EQ(Present().count("fd00:2::5/64"), 0u);
}

}  // namespace
}  // namespace tessel
