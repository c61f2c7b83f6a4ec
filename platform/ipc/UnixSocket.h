// Stream sockets in the file system. Private to platform/ipc.
#pragma once

#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <cstdint>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/IPCConnection.h"

namespace vesk {

/// The address of a socket. A path that does not fit into one (108 bytes) is reached through a descriptor of
/// its directory, which this holds open.
class UnixSocketAddress {
 public:
  /// Throws std::system_error when the path is too long and its directory can't be opened.
  explicit UnixSocketAddress(const std::string& path);

  const sockaddr* get() const noexcept { return reinterpret_cast<const sockaddr*>(&_address); }
  socklen_t size() const noexcept { return sizeof _address; }

 private:
  sockaddr_un _address{};
  FileDescriptor _directory;
};

/// A connected socket that does not block. Throws std::system_error: ENOENT or ECONNREFUSED when nobody
/// serves it, EAGAIN when too many wait to be accepted.
FileDescriptor connectUnixSocket(const std::string& path);

/// A listening socket, open to every user, in a directory that is made when it is missing. Removes the socket
/// that a dead server has left; throws std::system_error (EADDRINUSE) when a live one answers, or whatever
/// failed.
FileDescriptor listenOnUnixSocket(const std::string& path);

/// Who connected, as the kernel noted it then.
IPCPeer peerOfSocket(int socket);

}  // namespace vesk
