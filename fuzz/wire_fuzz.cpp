// Bytes as the body of a client's call: through sd-bus into values, back onto the wire and into values again.
#include <cstdint>
#include <string>

#include "platform/ipc/AuthenticationGate.h"
#include "platform/ipc/BusCodec.h"
#include "platform/ipc/MessageGate.h"
#include "platform/ipc/OneWayDecoder.h"
#include "tests/support/BusServer.h"
#include "tests/support/WireMessage.h"

namespace {

using namespace vesk;
using test::BusServer;

void require(bool condition) { BusServer::require(condition); }

/// What is read without sd-bus is what sd-bus reads.
void compareWays(const std::string& call, const Value& expected, bool isExpected) {
  static OneWayDecoder decoder(wire::kObjectPath);
  if (!OneWayDecoder::mayDecode(call, call.size())) return;
  auto read = decoder.decode(call);
  if (!read || read->arguments.size() != 1) return;
  const auto* dictionary = std::get_if<Dictionary>(&read->arguments.front());
  const auto* list = std::get_if<List>(&read->arguments.front());
  if (!dictionary && !list) return;
  Value value = dictionary ? Value(*dictionary) : Value(*list);
  require(isExpected && describe(value, 1 << 20) == describe(expected, 1 << 20));
}

void decode(BusServer& server, const std::string& signature, const std::string& body) {
  const std::string call = test::wireMessage("m", signature, body);
  BusMessageHandle message = server.read(call);
  if (!message) return compareWays(call, {}, false);  // refused by sd-bus
  BusDecoder decoder(message.get());
  Value value;
  bool isRead = decoder.read(value);
  compareWays(call, value, isRead);
  if (!isRead) return;

  sd_bus_message* raw = nullptr;
  require(sd_bus_message_new_method_call(server.bus(), &raw, nullptr, "/o", "i.f", "m") >= 0);
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
  static BusServer server;
  static const char* const kSignatures[] = {"v", "a{sv}", "av", "aa{sv}", "a(sv)", "(yv)", "as"};
  if (size < 1 || size > 65'536) return 0;
  std::string body(reinterpret_cast<const char*>(data + 1), size - 1);
  decode(server, kSignatures[data[0] % std::size(kSignatures)], body);
  passGates(body);
  return 0;
}
