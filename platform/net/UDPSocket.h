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
#include "platform/result/Result.h"

namespace vesk {

/// An IPv4 address with a port, both in host order.
struct IPv4Endpoint {
  std::uint32_t address = 0;
  std::uint16_t port = 0;

  /// Four decimal numbers separated by dots ("127.0.0.1"), at most 15 characters; otherwise returns nullopt.
  static std::optional<IPv4Endpoint> parse(std::string_view dotted, std::uint16_t port);
  /// "127.0.0.1:40312"
  std::string text() const;
  friend bool operator==(const IPv4Endpoint&, const IPv4Endpoint&) = default;
};

/// One socket, which never blocks and never raises SIGPIPE. Errors have the system's number; on a closed
/// socket it is EBADF. Not thread-safe, except that one thread may send while another receives.
class UDPSocket {
 public:
  /// Doesn't open a socket.
  UDPSocket() noexcept = default;
  Result<void> open();
  Result<void> bind(const IPv4Endpoint& local);
  /// Binds to the wildcard address and a port chosen by the system.
  Result<void> bindToAnyPort() { return bind({}); }
  /// From now on, receives datagrams only from this peer.
  Result<void> connect(const IPv4Endpoint& peer);

  /// Connects again, from an address that the system has now: a connection keeps its original address. After
  /// a failure, no datagrams are received until a later call succeeds.
  Result<void> reconnect(const IPv4Endpoint& peer);

  enum class Outcome : unsigned char {
    Sent,        ///< the whole datagram
    WouldBlock,  ///< the system has no room for it now
    NoRoute,     ///< cannot be sent from the connection's address; `reconnect` may find another
    Failed,
  };
  /// Sends to the connected peer.
  [[nodiscard]] Outcome send(std::string_view datagram) noexcept;
  [[nodiscard]] bool sendTo(const IPv4Endpoint& peer, std::string_view datagram) noexcept;
  /// Returns the size of one datagram, truncated to the buffer's size. Returns nullopt if none is available
  /// or the system reports an error, which this clears. `sender` may be null.
  [[nodiscard]] std::optional<std::size_t> receive(std::span<char> buffer,
                                                   IPv4Endpoint* sender = nullptr) noexcept;

  /// The address it is bound to; nullopt before that.
  std::optional<IPv4Endpoint> localEndpoint() const noexcept;
  int descriptor() const noexcept { return _descriptor ? _descriptor->get() : -1; }
  /// For a thread that watches it; the socket is closed with the last share. Null if it isn't open.
  std::shared_ptr<const FileDescriptor> sharedDescriptor() const noexcept { return _descriptor; }
  bool isOpen() const noexcept { return _descriptor != nullptr; }
  /// May be called twice.
  void close() noexcept { _descriptor.reset(); }

 private:
  /// Also releases a port that the system chose.
  Result<void> disconnect();

  std::shared_ptr<const FileDescriptor> _descriptor;
};

}  // namespace vesk
