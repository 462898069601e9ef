#include "platform/linux/RouteTable.h"

#include <linux/rtnetlink.h>
#include <net/if.h>
#include <netinet/in.h>
#include <sys/ioctl.h>

#include <cstddef>
#include <cstring>
#include <optional>

#include "platform/NetworkReachability.h"
#include "platform/base/FileDescriptor.h"

namespace qv::platform {
namespace {

struct Address {
  const void* bytes;
  unsigned char size;
};

std::optional<Address> bytesOf(const sockaddr& address) {
  if (address.sa_family == AF_INET) return Address{&reinterpret_cast<const sockaddr_in&>(address).sin_addr, 4};
  if (address.sa_family == AF_INET6) return Address{&reinterpret_cast<const sockaddr_in6&>(address).sin6_addr, 16};
  return std::nullopt;
}

struct Request {
  nlmsghdr header;
  rtmsg route;
  alignas(NLMSG_ALIGNTO) char attributes[RTA_SPACE(16)];
};

Request requestFor(int family, const Address& address) {
  Request request{};
  request.header.nlmsg_type = RTM_GETROUTE;
  request.header.nlmsg_flags = NLM_F_REQUEST;
  request.header.nlmsg_len = static_cast<uint32_t>(NLMSG_LENGTH(sizeof(rtmsg)) + RTA_LENGTH(address.size));
  request.route.rtm_family = static_cast<unsigned char>(family);
  request.route.rtm_dst_len = static_cast<unsigned char>(address.size * 8);
  rtattr attribute{};
  attribute.rta_type = RTA_DST;
  attribute.rta_len = static_cast<unsigned short>(RTA_LENGTH(address.size));
  std::memcpy(request.attributes, &attribute, sizeof attribute);
  std::memcpy(request.attributes + RTA_LENGTH(0), address.bytes, address.size);
  return request;
}

/// Whether the interface can carry packets now.
bool isRunning(int interface) {
  ifreq request{};
  if (::if_indextoname(static_cast<unsigned>(interface), request.ifr_name) == nullptr) return false;
  const FileDescriptor socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  if (::ioctl(socket.get(), SIOCGIFFLAGS, &request) != 0) return false;
  return (request.ifr_flags & IFF_UP) != 0 && (request.ifr_flags & IFF_RUNNING) != 0;
}

uint32_t flagsOfRoute(const nlmsghdr* message) {
  const auto* route = static_cast<const rtmsg*>(NLMSG_DATA(message));
  const bool leadsThere = route->rtm_type == RTN_UNICAST || route->rtm_type == RTN_LOCAL;
  if (!leadsThere) return 0;
  int interface = 0;
  auto length = static_cast<int>(RTM_PAYLOAD(message));
  for (const rtattr* attribute = RTM_RTA(route); RTA_OK(attribute, length); attribute = RTA_NEXT(attribute, length)) {
    if (attribute->rta_type == RTA_OIF && RTA_PAYLOAD(attribute) >= sizeof interface) {
      std::memcpy(&interface, RTA_DATA(attribute), sizeof interface);
    }
  }
  const bool hasLink = (route->rtm_flags & (RTNH_F_LINKDOWN | RTNH_F_DEAD)) == 0 && isRunning(interface);
  return hasLink ? reachability::kReachable : reachability::kReachable | reachability::kConnectionRequired;
}

}  // namespace

uint32_t reachabilityOfAddress(const sockaddr& address) {
  const auto bytes = bytesOf(address);
  if (!bytes) return 0;
  const FileDescriptor socket(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC, NETLINK_ROUTE));
  if (!socket.isValid()) return 0;
  const Request request = requestFor(address.sa_family, *bytes);
  if (::send(socket.get(), &request, request.header.nlmsg_len, 0) < 0) return 0;
  alignas(nlmsghdr) char buffer[4096];
  // The answer was queued before the send returned.
  const ssize_t size = ::recv(socket.get(), buffer, sizeof buffer, MSG_DONTWAIT);
  const auto* answer = reinterpret_cast<const nlmsghdr*>(buffer);
  if (size <= 0 || !NLMSG_OK(answer, static_cast<size_t>(size)) || answer->nlmsg_type != RTM_NEWROUTE) return 0;
  return flagsOfRoute(answer);
}

}  // namespace qv::platform
