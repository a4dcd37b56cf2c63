#include "transport/udp.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <algorithm>
#include <fstream>

namespace tessel {
namespace {

// Every socket asks for a deep receive queue, so that a burst of Responses or requests is not
// dropped at the socket; the kernel doubles what it grants, up to net.core.rmem_max.
TEST(UdpTest, SocketsGetADeepReceiveQueue) {
  long systemMax = 0;
  std::ifstream("/proc/sys/net/core/rmem_max") >> systemMax;
  if (systemMax <= 0) GTEST_SKIP() << "no net.core.rmem_max to compare with";
  int error = 0;
  int socket = OpenUdpSocket("127.0.0.1", 0, false, {}, &error);
  ASSERT_GE(socket, 0) << error;
  int queue = 0;
  socklen_t length = sizeof queue;
  ASSERT_EQ(getsockopt(socket, SOL_SOCKET, SO_RCVBUF, &queue, &length), 0);
  CloseUdpSocket(socket);
  EXPECT_EQ(queue, 2 * std::min<long>(kUdpSocketReceiveQueue, systemMax));
}

}  // namespace
}  // namespace tessel
