// A server's sd-bus that is fed with bytes.
#pragma once

#include <sys/socket.h>
#include <systemd/sd-bus.h>

#include <cstdlib>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/ipc/BusHandles.h"

namespace vesk::test {

/// Its client is authenticated and may send descriptors. Aborts on what can't happen.
class BusServer {
 public:
  BusServer() {
    using namespace std::string_literals;
    int ends[2];
    require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0);
    _client = FileDescriptor(ends[1]);
    sd_bus* raw = nullptr;
    require(sd_bus_new(&raw) >= 0 && sd_bus_set_fd(raw, ends[0], ends[0]) >= 0);
    _bus.reset(raw);
    require(sd_bus_set_server(raw, 1, sd_id128_t{{1}}) >= 0);
    require(sd_bus_start(raw) >= 0);
    write("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s);
    receive();
    require(sd_bus_is_ready(raw) > 0);
  }

  static void require(bool condition) {
    if (!condition) std::abort();
  }

  sd_bus* bus() { return _bus.get(); }

  /// The message that `bytes` are to sd-bus; null when they are none.
  BusMessageHandle read(const std::string& bytes) {
    write(bytes);
    return receive();
  }

 private:
  void write(const std::string& bytes) {
    require(::send(_client.get(), bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size()));
  }
  BusMessageHandle receive() {
    sd_bus_message* message = nullptr;
    while (sd_bus_process(_bus.get(), &message) > 0 && !message) {
    }
    return BusMessageHandle(message);
  }

  FileDescriptor _client;
  BusHandle _bus;
};

}  // namespace vesk::test
