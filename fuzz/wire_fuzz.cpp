// Bytes from a client: as the body of a call, as a whole message, as authentication.
#include <cstdint>
#include <string>

#include "platform/ipc/MessageReader.h"
#include "platform/ipc/MessageWriter.h"
#include "platform/ipc/Sasl.h"
#include "tests/support/BusServer.h"
#include "tests/support/WireMessage.h"

namespace {

using namespace vesk;
using test::BusServer;

void require(bool condition) { BusServer::require(condition); }

/// Compares as text, since NaN differs from itself.
std::string described(const Value& value) { return describe(value, 1 << 20); }

bool readHere(const std::string& bytes, Value& value) {
  HeaderParser parser;
  const auto* header = parser.parse(bytes);
  if (!header) return false;
  MessageReader reader({header, parser.serial(), std::string_view(bytes).substr(parser.headerSize()), {}});
  return reader.read(value) && reader.finish();
}

/// Our reader and sd-bus must agree, and the values must survive being written and read again.
void readBody(BusServer& server, const std::string& signature, const std::string& body) {
  const std::string call = test::wireMessage("m", signature, body);
  Value value;
  if (!readHere(call, value)) return;
  std::vector<Value> bySdBus;
  const auto message = server.read(call);
  require(message && test::readBySdBus(message.get(), bySdBus) &&
          described(bySdBus.at(0)) == described(value));

  std::string again;
  const auto result = appendMessage({.path = "/o", .member = "m"}, 1, {List{value}}, again);
  // The values are valid text within the limits. Only nesting needs more room as variants.
  if (result != CodecResult::Ok) return require(result == CodecResult::LimitExceeded);
  Value same;
  require(readHere(again, same) && described(same) == described(List{value}));
}

void readMessage(std::string_view bytes) {
  if (bytes.size() < kFixedHeader || messageSize(bytes) != bytes.size()) return;
  HeaderParser parser;
  const auto* header = parser.parse(bytes);
  if (!header) return;
  require(parser.parse(bytes) == header);  // from the parser's cache
  MessageReader reader({header, parser.serial(), bytes.substr(parser.headerSize()), {}});
  Value value;
  while (reader.read(value)) {
  }
}

void authenticate(std::string_view bytes) {
  SaslServer server(1000);
  SaslClient client;
  require(server.step(bytes).taken <= bytes.size());
  require(client.step(bytes).taken <= bytes.size());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static BusServer server;
  static const char* const kSignatures[] = {"v", "a{sv}", "av", "aa{sv}", "a(sv)", "(yv)", "as"};
  if (size < 1 || size > 65'536) return 0;
  const std::string body(reinterpret_cast<const char*>(data + 1), size - 1);
  readBody(server, kSignatures[data[0] % std::size(kSignatures)], body);
  readMessage({reinterpret_cast<const char*>(data), size});
  authenticate(body);
  return 0;
}
