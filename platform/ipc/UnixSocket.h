// Unix stream sockets with file-system paths. Private to platform/ipc.
#pragma once

#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <cstdint>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// The address of a socket. A path that is too long for an address (108 bytes) is reached through a
/// descriptor of its directory, which this holds open.
class UnixSocketAddress {
 public:
  /// Throws std::system_error if the path is too long and its directory can't be opened.
  explicit UnixSocketAddress(const std::string& path);

  const sockaddr* get() const noexcept { return reinterpret_cast<const sockaddr*>(&_address); }
  socklen_t size() const noexcept { return sizeof _address; }

 private:
  sockaddr_un _address{};
  FileDescriptor _directory;
};

/// Returns a connected, non-blocking socket. Throws std::system_error: ENOENT or ECONNREFUSED if there is no
/// server, EAGAIN if too many clients wait to be accepted.
FileDescriptor connectUnixSocket(const std::string& path);

/// Returns a listening socket that every user may connect to; creates its directory if missing. Removes the
/// stale socket of a dead server. Throws std::system_error: EADDRINUSE if a live server answers, otherwise
/// the error that occurred.
FileDescriptor listenOnUnixSocket(const std::string& path);

/// The peer, as the kernel recorded it at connection time.
IPCPeer peerOfSocket(int socket);

}  // namespace vesk
