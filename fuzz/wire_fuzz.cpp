// Bytes as the body of a client's call: through sd-bus into values, back onto the wire and into values again.
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "platform/ipc/AuthenticationGate.h"
#include "platform/ipc/BusCodec.h"
#include "platform/ipc/BusHandles.h"
#include "platform/ipc/MessageGate.h"

namespace {

using namespace vesk;
using namespace std::string_literals;

void require(bool condition) {
  if (!condition) std::abort();
}

/// A server's bus whose client is authenticated and speaks through `client`.
struct Server {
  Server() {
    int ends[2];
    require(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends) == 0);
    client = ends[1];
    sd_bus* raw = nullptr;
    require(sd_bus_new(&raw) >= 0 && sd_bus_set_fd(raw, ends[0], ends[0]) >= 0);
    bus.reset(raw);
    require(sd_bus_set_server(raw, 1, sd_id128_t{{1}}) >= 0);
    require(sd_bus_start(raw) >= 0);
    write("\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"s);
    while (sd_bus_process(raw, nullptr) > 0) {
    }
    require(sd_bus_is_ready(raw) > 0);
  }

  void write(const std::string& bytes) {
    require(::send(client, bytes.data(), bytes.size(), 0) == static_cast<ssize_t>(bytes.size()));
  }

  BusMessageHandle receive() {
    sd_bus_message* message = nullptr;
    while (sd_bus_process(bus.get(), &message) > 0 && !message) {
    }
    return BusMessageHandle(message);
  }

  BusHandle bus;
  int client = -1;
};

void appendNumber(std::string& bytes, std::size_t number) {
  for (int i = 0; i < 4; ++i) bytes += static_cast<char>(number >> (8 * i));
}

std::string callWith(const std::string& signature, const std::string& body) {
  std::string fields;
  auto field = [&](char code, char type, const std::string& value) {
    fields.resize((fields.size() + 7) / 8 * 8);
    fields += std::string{code, 1, type, 0};
    if (type == 'g') {
      fields += static_cast<char>(value.size());
    } else {
      appendNumber(fields, value.size());
    }
    fields.append(value).append(1, '\0');
  };
  field(1, 'o', "/o");
  field(3, 's', "m");
  field(8, 'g', signature);
  std::string bytes = {'l', 1, 1, 1};
  appendNumber(bytes, body.size());
  appendNumber(bytes, 1);
  appendNumber(bytes, fields.size());
  bytes += fields;
  bytes.resize((bytes.size() + 7) / 8 * 8);
  return bytes + body;
}

void decode(Server& server, const std::string& signature, const std::string& body) {
  server.write(callWith(signature, body));
  BusMessageHandle message = server.receive();
  if (!message) return;  // refused by sd-bus
  BusDecoder decoder(message.get());
  Value value;
  if (!decoder.read(value)) return;

  sd_bus_message* raw = nullptr;
  require(sd_bus_message_new_method_call(server.bus.get(), &raw, nullptr, "/o", "i.f", "m") >= 0);
  BusMessageHandle again(raw);
  BusEncoder encoder(raw);
  if (!encoder.append(value)) {
    // What was read is valid text within the limits; only nesting takes more room as variants.
    require(encoder.result() == CodecResult::LimitExceeded);
    return;
  }
  require(sd_bus_message_seal(raw, 1, 0) >= 0);
  BusDecoder second(raw);
  Value same;
  // Not a number is not equal to itself, so equal descriptions will do.
  require(second.read(same) && describe(same, 1 << 20) == describe(value, 1 << 20));
}

void passGates(const std::string& bytes) {
  MessageGate messages(4096);
  auto passed = messages.pass(bytes);
  require(passed.passed <= bytes.size() && (!passed.lastStart || *passed.lastStart < passed.passed + 1));
  AuthenticationGate authentication(1000);
  require(authentication.pass(bytes).taken <= bytes.size());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static Server server;
  static const char* const kSignatures[] = {"v", "a{sv}", "av", "aa{sv}", "a(sv)", "(yv)", "as"};
  if (size < 1 || size > 65'536) return 0;
  std::string body(reinterpret_cast<const char*>(data + 1), size - 1);
  decode(server, kSignatures[data[0] % std::size(kSignatures)], body);
  passGates(body);
  return 0;
}
