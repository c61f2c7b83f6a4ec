#include "tests/support/SocketFaults.h"

#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

using vesk::test::SocketFaults;

extern "C" ssize_t send(int socket, const void* data, size_t size, int flags) {
  int fault = 0;
  if (!SocketFaults::sends.empty()) {
    fault = SocketFaults::sends.front();
    SocketFaults::sends.pop_front();
  }
  if (fault == SocketFaults::kShort) return static_cast<ssize_t>(size) - 1;
  if (fault != 0) return SocketFaults::fail(fault);
  return ::sendto(socket, data, size, flags, nullptr, 0);
}

extern "C" int bind(int socket, const sockaddr* address, socklen_t size) noexcept {
  if (int error = SocketFaults::bindError) return SocketFaults::fail(error);
  return static_cast<int>(::syscall(SYS_bind, socket, address, size));
}

extern "C" int socket(int domain, int type, int protocol) noexcept {
  if (int error = SocketFaults::socketError) return SocketFaults::fail(error);
  return static_cast<int>(::syscall(SYS_socket, domain, type, protocol));
}
