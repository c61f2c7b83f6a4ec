#include "platform/net/NetworkMonitor.h"

#include <linux/netlink.h>
#include <linux/rtnetlink.h>
#include <sys/socket.h>

#include <cerrno>

namespace vesk {

NetworkMonitor::NetworkMonitor()
    : _socket(::socket(AF_NETLINK, SOCK_RAW | SOCK_CLOEXEC | SOCK_NONBLOCK, NETLINK_ROUTE)) {
  sockaddr_nl address{};
  address.nl_family = AF_NETLINK;
  address.nl_groups = RTMGRP_IPV4_ROUTE | RTMGRP_IPV6_ROUTE;
  if (_socket && ::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    _socket.reset();
  }
}

bool NetworkMonitor::takeChange() noexcept {
  bool changed = false;
  alignas(nlmsghdr) char events[8192];
  for (;;) {
    const ssize_t size = ::recv(_socket.get(), events, sizeof events, 0);
    if (size < 0 && errno == EINTR) continue;
    if (size < 0 && errno == ENOBUFS) {
      changed = true;
      continue;
    }
    if (size <= 0) return changed;
    auto left = static_cast<unsigned>(size);
    for (auto* event = reinterpret_cast<nlmsghdr*>(events); NLMSG_OK(event, left);
         event = NLMSG_NEXT(event, left)) {
      changed = changed || event->nlmsg_type == RTM_NEWROUTE;
    }
  }
}

}  // namespace vesk
