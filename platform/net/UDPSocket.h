// Datagrams over IPv4.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// An IPv4 address with a port, both in host order.
struct IPv4Endpoint {
  std::uint32_t address = 0;
  std::uint16_t port = 0;

  /// Four decimal numbers between dots ("127.0.0.1"), 15 characters at most; nothing else is understood.
  static std::optional<IPv4Endpoint> parse(std::string_view dotted, std::uint16_t port);
  /// "127.0.0.1:40312"
  std::string text() const;
  friend bool operator==(const IPv4Endpoint&, const IPv4Endpoint&) = default;
};

/// One socket, which never blocks and never raises SIGPIPE. Operations that can fail give the system's error
/// number, 0 for none. On a closed socket they fail with EBADF. Not synchronised, except that the kernel lets
/// one thread send while another receives.
class UDPSocket {
 public:
  /// Opens nothing.
  UDPSocket() noexcept = default;
  [[nodiscard]] int open();
  [[nodiscard]] int bind(const IPv4Endpoint& local) noexcept;
  /// To the wildcard address and a port that the system picks.
  [[nodiscard]] int bindToAnyPort() noexcept { return bind({}); }
  /// Only this peer's datagrams are received from now on.
  [[nodiscard]] int connect(const IPv4Endpoint& peer) noexcept;

  /// Once more, from an address that the system has now: a connection keeps the one that it was made with.
  /// After a failure nothing is received until a later one succeeds.
  [[nodiscard]] int reconnect(const IPv4Endpoint& peer) noexcept;

  enum class Outcome : unsigned char {
    Sent,        ///< the whole datagram
    WouldBlock,  ///< the system has no room for it at the moment
    NoRoute,     ///< not from the address that the connection has; `reconnect` may find another
    Failed,
  };
  /// To the connected peer.
  [[nodiscard]] Outcome send(std::string_view datagram) noexcept;
  [[nodiscard]] bool sendTo(const IPv4Endpoint& peer, std::string_view datagram) noexcept;
  /// One datagram, cut to the buffer's size; nothing when none is there or the system reports an error, which
  /// that clears. `sender` may be null.
  [[nodiscard]] std::optional<std::size_t> receive(std::span<char> buffer,
                                                   IPv4Endpoint* sender = nullptr) noexcept;

  /// What it is bound to; nothing before that.
  std::optional<IPv4Endpoint> localEndpoint() const noexcept;
  int descriptor() const noexcept { return _descriptor ? _descriptor->get() : -1; }
  /// For who watches it; the socket is closed with the last share. Null when it isn't open.
  std::shared_ptr<const FileDescriptor> sharedDescriptor() const noexcept { return _descriptor; }
  bool isOpen() const noexcept { return _descriptor != nullptr; }
  /// May be called twice.
  void close() noexcept { _descriptor.reset(); }

 private:
  /// Gives up a port that the system picked, too.
  int disconnect() noexcept;

  std::shared_ptr<const FileDescriptor> _descriptor;
};

}  // namespace vesk
