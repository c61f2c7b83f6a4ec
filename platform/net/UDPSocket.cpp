#include "platform/net/UDPSocket.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstring>
#include <utility>

namespace vesk {

namespace {

constexpr std::size_t kLongestDotted = 15;

sockaddr_in addressOf(const IPv4Endpoint& endpoint) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(endpoint.port);
  address.sin_addr.s_addr = htonl(endpoint.address);
  return address;
}

IPv4Endpoint endpointOf(const sockaddr_in& address) {
  return {ntohl(address.sin_addr.s_addr), ntohs(address.sin_port)};
}

Result<void> resultOf(int status) { return status == 0 ? Result<void>() : systemError(errno); }

bool isWhole(ssize_t count, std::string_view datagram) {
  return count >= 0 && static_cast<std::size_t>(count) == datagram.size();
}

UDPSocket::Outcome outcomeOf(int error) {
  switch (error) {
    case EAGAIN:
      return UDPSocket::Outcome::WouldBlock;
    case ENETUNREACH:
    case EADDRNOTAVAIL:
    case EINVAL:
    case EDESTADDRREQ:  // a `reconnect` has failed
      return UDPSocket::Outcome::NoRoute;
    default:
      return UDPSocket::Outcome::Failed;
  }
}

}  // namespace

std::optional<IPv4Endpoint> IPv4Endpoint::parse(std::string_view dotted, std::uint16_t port) {
  if (dotted.size() > kLongestDotted || dotted.find('\0') != std::string_view::npos) return std::nullopt;
  in_addr address{};
  if (::inet_pton(AF_INET, std::string(dotted).c_str(), &address) != 1) return std::nullopt;
  return IPv4Endpoint{ntohl(address.s_addr), port};
}

std::string IPv4Endpoint::text() const {
  std::string dotted;
  for (int shift = 24; shift >= 0; shift -= 8)
    dotted += std::to_string(address >> shift & 0xFF) + (shift > 0 ? "." : ":");
  return dotted + std::to_string(port);
}

Result<void> UDPSocket::open() {
  FileDescriptor descriptor(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!descriptor) return systemError(errno);
  _descriptor = std::make_shared<const FileDescriptor>(std::move(descriptor));
  return {};
}

Result<void> UDPSocket::bind(const IPv4Endpoint& local) {
  const sockaddr_in address = addressOf(local);
  return resultOf(::bind(descriptor(), reinterpret_cast<const sockaddr*>(&address), sizeof address));
}

Result<void> UDPSocket::connect(const IPv4Endpoint& peer) {
  const sockaddr_in address = addressOf(peer);
  return resultOf(::connect(descriptor(), reinterpret_cast<const sockaddr*>(&address), sizeof address));
}

Result<void> UDPSocket::disconnect() {
  sockaddr nobody{};
  nobody.sa_family = AF_UNSPEC;
  return resultOf(::connect(descriptor(), &nobody, sizeof nobody));
}

Result<void> UDPSocket::reconnect(const IPv4Endpoint& peer) {
  if (auto disconnected = disconnect(); !disconnected) return disconnected;
  auto connected = connect(peer);
  // A failed connection keeps its port, at which it would receive datagrams from anyone.
  if (!connected) static_cast<void>(disconnect());
  return connected;
}

UDPSocket::Outcome UDPSocket::send(std::string_view datagram) noexcept {
  const ssize_t count = ::send(descriptor(), datagram.data(), datagram.size(), MSG_NOSIGNAL);
  if (isWhole(count, datagram)) return Outcome::Sent;
  return count < 0 ? outcomeOf(errno) : Outcome::Failed;
}

bool UDPSocket::sendTo(const IPv4Endpoint& peer, std::string_view datagram) noexcept {
  const sockaddr_in address = addressOf(peer);
  return isWhole(::sendto(descriptor(), datagram.data(), datagram.size(), MSG_NOSIGNAL,
                          reinterpret_cast<const sockaddr*>(&address), sizeof address),
                 datagram);
}

std::optional<std::size_t> UDPSocket::receive(std::span<char> buffer, IPv4Endpoint* sender) noexcept {
  sockaddr_in address{};
  socklen_t size = sizeof address;
  const ssize_t count =
      ::recvfrom(descriptor(), buffer.data(), buffer.size(), 0, reinterpret_cast<sockaddr*>(&address), &size);
  if (count < 0) return std::nullopt;
  if (sender != nullptr) *sender = endpointOf(address);
  return static_cast<std::size_t>(count);
}

std::optional<IPv4Endpoint> UDPSocket::localEndpoint() const noexcept {
  sockaddr_in address{};
  socklen_t size = sizeof address;
  if (::getsockname(descriptor(), reinterpret_cast<sockaddr*>(&address), &size) != 0) return std::nullopt;
  if (address.sin_port == 0) return std::nullopt;
  return endpointOf(address);
}

}  // namespace vesk
