#include "platform/linux/RouteReachability.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <functional>

#include "platform/base/FileDescriptor.h"
#include "platform/linux/RouteTable.h"
#include "tests/fakes/ManualExecutor.h"

namespace qv::platform {
namespace {

uint32_t flagsOf(const char* address) {
  sockaddr_in v4{};
  sockaddr_in6 v6{};
  v4.sin_family = AF_INET;
  v6.sin6_family = AF_INET6;
  if (::inet_pton(AF_INET, address, &v4.sin_addr) == 1) return reachabilityOfAddress(reinterpret_cast<sockaddr&>(v4));
  EXPECT_EQ(::inet_pton(AF_INET6, address, &v6.sin6_addr), 1);
  return reachabilityOfAddress(reinterpret_cast<sockaddr&>(v6));
}

/// In a network of its own, which has a loopback interface that is down and no routes. The exit code of `test`;
/// -1 where the machine allows no such network.
int inOwnNetwork(const std::function<int()>& test) {
  const pid_t child = ::fork();
  if (child == 0) ::_exit(::unshare(CLONE_NEWNET) == 0 ? test() : 255);
  int status = 0;
  ::waitpid(child, &status, 0);
  return WEXITSTATUS(status) == 255 ? -1 : WEXITSTATUS(status);
}

TEST(RouteTableTest, TellsWhetherARouteLeadsThere) {
  const int result = inOwnNetwork([] {
    if (flagsOf("192.0.2.1") != 0 || flagsOf("127.0.0.1") != 0 || flagsOf("2001:db8::1") != 0) return 1;
    ifreq loopback{};
    std::snprintf(loopback.ifr_name, sizeof loopback.ifr_name, "lo");
    loopback.ifr_flags = IFF_UP;
    const FileDescriptor socket(::socket(AF_INET, SOCK_DGRAM, 0));
    if (::ioctl(socket.get(), SIOCSIFFLAGS, &loopback) != 0) return 2;
    if (flagsOf("127.0.0.1") != reachability::kReachable) return 3;
    return flagsOf("192.0.2.1") == 0 ? 0 : 4;
  });
  if (result < 0) GTEST_SKIP() << "no network namespaces here";
  EXPECT_EQ(result, 0);
}

TEST(RouteReachabilityTest, AnswersFromTheNameAndTheRouteInBoundedTime) {
  RouteReachabilityService service(globalQueue());
  EXPECT_EQ(service.createProbe(""), nullptr);
  EXPECT_EQ(service.createProbe(std::string(254, 'a')), nullptr);
  EXPECT_EQ(service.createProbe("127.0.0.1")->flags(), reachability::kReachable);
  EXPECT_EQ(service.createProbe(std::string(64, 'a'))->flags(), 0u) << "no label is that long";
  // A resolver that does not answer: a second probe joins the first, and both give up.
  fakes::ManualExecutor never;
  RouteReachabilityService stuck(never, std::chrono::milliseconds(1));
  EXPECT_EQ(stuck.createProbe("127.0.0.1")->flags(), std::nullopt);
  EXPECT_EQ(stuck.createProbe("127.0.0.1")->flags(), std::nullopt);
  EXPECT_EQ(never.pending(), 1u);
  never.runUntilIdle();
  EXPECT_EQ(stuck.createProbe("127.0.0.1")->flags(), std::nullopt) << "asked anew";
  EXPECT_EQ(never.pending(), 1u);
  never.runUntilIdle();
}

}  // namespace
}  // namespace qv::platform
