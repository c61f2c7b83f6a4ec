// A server-side sd-bus connection that is fed with bytes, and the values it reads from a message.
#pragma once

#include <sys/socket.h>
#include <systemd/sd-bus.h>

#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/files/FileDescriptor.h"

namespace vesk::test {

struct BusMessageReleaser {
  void operator()(sd_bus_message* message) const noexcept { sd_bus_message_unref(message); }
};
using BusMessageHandle = std::unique_ptr<sd_bus_message, BusMessageReleaser>;

/// Its client is authenticated and may send descriptors. Aborts on unexpected failures.
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
    require(sd_bus_negotiate_fds(raw, 1) >= 0 && sd_bus_set_server(raw, 1, sd_id128_t{{1}}) >= 0);
    require(sd_bus_start(raw) >= 0);
    write("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"s);
    receive();
    require(sd_bus_is_ready(raw) > 0);
  }

  static void require(bool condition) {
    if (!condition) std::abort();
  }

  /// Parses `bytes` with sd-bus. Returns null if they are not a message.
  BusMessageHandle read(const std::string& bytes) {
    write(bytes);
    return receive();
  }

 private:
  struct Closer {
    void operator()(sd_bus* bus) const noexcept { sd_bus_close_unref(bus); }
  };

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
  std::unique_ptr<sd_bus, Closer> _bus;
};

/// Appends the rest of the container in `message`, as our values. Returns false if sd-bus finds an error.
inline bool readBySdBus(sd_bus_message* message, std::vector<Value>& out) {
  for (;;) {
    char type = 0;
    const char* contents = nullptr;
    const int found = sd_bus_message_peek_type(message, &type, &contents);
    if (found <= 0) return found == 0;
    if (type == 'h') return false;
    if (std::strchr("vare", type)) {
      const std::string inside = contents;
      std::vector<Value> values;
      if (sd_bus_message_enter_container(message, type, contents) < 0) return false;
      if (!readBySdBus(message, values) || sd_bus_message_exit_container(message) < 0) return false;
      if (type == 'v') {
        out.push_back(values.at(0));
      } else if (type == 'r' && inside == "d") {
        out.emplace_back(Date{*values.at(0).real()});
      } else if (type == 'a' && inside.starts_with("{s")) {
        MutableDictionary dictionary;
        for (const Value& entry : values) dictionary.append(*(*entry.list())[0].text(), (*entry.list())[1]);
        out.emplace_back(dictionary.shareUnique());
      } else if (type == 'a' && inside == "y") {
        std::string bytes;
        for (const Value& byte : values) bytes += static_cast<char>(*byte.unsignedInteger());
        out.emplace_back(Bytes(bytes));
      } else {
        out.emplace_back(List(std::move(values)));
      }
      continue;
    }
    union {
      std::uint8_t y;
      std::int16_t n;
      std::uint16_t q;
      std::int32_t i;
      std::uint32_t u;
      std::int64_t x;
      std::uint64_t t;
      double d;
      const char* s;
    } raw{};
    if (sd_bus_message_read_basic(message, type, &raw) <= 0) return false;
    out.push_back(type == 'b'                     ? Value(raw.i != 0)
                  : type == 'y'                   ? Value(std::uint64_t{raw.y})
                  : type == 'n'                   ? Value(std::int64_t{raw.n})
                  : type == 'q'                   ? Value(std::uint64_t{raw.q})
                  : type == 'i'                   ? Value(std::int64_t{raw.i})
                  : type == 'u'                   ? Value(std::uint64_t{raw.u})
                  : type == 'x'                   ? Value(raw.x)
                  : type == 't'                   ? Value(raw.t)
                  : type == 'd'                   ? Value(raw.d)
                  : type == 'g' && *raw.s == '\0' ? Value()
                                                  : Value(std::string(raw.s)));
  }
}

}  // namespace vesk::test
