// D-Bus messages: which are accepted, which are refused, and compatibility with other implementations.
#include <gtest/gtest.h>

#include <limits>

#include "platform/ipc/IPCIncomingCall.h"
#include "platform/ipc/IPCListener.h"
#include "platform/ipc/MessageWriter.h"
#include "platform/ipc/Signature.h"
#include "tests/support/BusServer.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TempDirectory.h"
#include "tests/support/WireMessage.h"

namespace vesk::test {
namespace {

using namespace std::string_literals;

constexpr char kObjectPath[] = "/test";
constexpr char kInterface[] = "test.Interface";
constexpr std::size_t kShown = 1 << 20;

// The deepest nesting inside a dictionary that receivers accept.
constexpr int kDeepest = 41;

Value nested(int depth) {
  Value value = 1;
  for (int i = 0; i < depth; ++i) value = Dictionary{{"d", value}};
  return value;
}

/// A value of every kind, with extremes of some.
Dictionary mixed() {
  return {{"none", Value()},
          {"no", false},
          {"yes", true},
          {"least", std::numeric_limits<std::int64_t>::min()},
          {"most", std::numeric_limits<std::uint64_t>::max()},
          {"real", -0.1},
          {"infinite", std::numeric_limits<double>::infinity()},
          {"text", "h\xc3\xa9llo"},
          {"", ""},
          {"bytes", Bytes(std::string("\0\xff", 2))},
          {"no bytes", Bytes()},
          {"date", Date{-12.25}},
          {"list", List{1, "a", List{}, Dictionary{{"ü", 1}}, Dictionary{}}},
          {"mixed", Dictionary{{"x", Dictionary{{"y", List{Date{1}, true}}}}}}};
}

const OutgoingHeader kHeader{.path = kObjectPath, .interfaceName = kInterface, .member = "m"};

std::string message(const OutgoingHeader& header, const std::vector<IPCArgument>& arguments) {
  std::string bytes;
  EXPECT_EQ(appendMessage(header, 7, arguments, bytes), CodecResult::Ok);
  return bytes;
}

/// Answers a call with its value.
class Echo final : public IPCExportedObject, public IPCListenerDelegate {
 public:
  Echo() {
    IPCListener::Options options;
    options.socketPath = socket();
    options.objectPath = kObjectPath;
    _listener = std::make_unique<IPCListener>(std::move(options));
    _listener->setDelegate(this);
    _listener->resume();
  }
  std::string socket() const { return _directory / "run/socket"; }
  const char* interfaceName() const override { return kInterface; }
  const char* introspection() const override { return "<interface name=\"test.Interface\"/>\n"; }
  void handle(IPCIncomingCall& call) override {
    Value value;
    if (call.read("v", value)) call.answer({List{value}});
  }
  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override {
    connection->resume({std::shared_ptr<IPCExportedObject>(this, [](auto*) {})});
    return true;
  }

 private:
  TempDirectory _directory;
  std::unique_ptr<IPCListener> _listener;
};

// GIO and libdbus send each type in both byte orders and compare the answers.
TEST(Wire, UnderstandsOtherImplementations) {
  Echo echo;
  ChildProcess peers({VESK_PYTHON, VESK_WIRE_PEERS, echo.socket()});
  EXPECT_EQ(peers.wait(), 0) << peers.output() << peers.errors();
}

// --- Against sd-bus

std::string described(std::vector<Value> values) { return describe(List(std::move(values)), kShown); }

/// All arguments of the message in `bytes`, or "refused".
std::string readHere(const std::string& bytes) {
  HeaderParser parser;
  const auto* header = parser.parse(bytes);
  if (!header || header->descriptors > 0) return "refused";
  MessageReader reader({header, parser.serial(), std::string_view(bytes).substr(parser.headerSize()), {}});
  std::vector<Value> values;
  for (std::string_view types = header->signature; !types.empty();
       types.remove_prefix(completeTypeLength(types))) {
    if (!reader.read(values.emplace_back())) return "refused";
  }
  return reader.finish() ? described(std::move(values)) : "refused";
}

std::string readBySdBus(BusServer& server, const std::string& bytes) {
  BusMessageHandle message = server.read(bytes);
  std::vector<Value> values;
  return message && test::readBySdBus(message.get(), values) ? described(std::move(values)) : "refused";
}

/// A call with values of several forms, in either byte order.
std::string handMade(bool bigEndian) {
  Marshalled texts(bigEndian);
  texts.text("a");
  texts.align(4);
  texts.text("h\xc3\xa9");
  const std::string elements = texts.take();
  Marshalled body(bigEndian);
  body.number(5);
  body.number(1);
  body.number(static_cast<std::uint32_t>(elements.size()));
  body.raw(elements);
  body.signature("(s)");
  body.align(8);
  body.text("v");
  body.signature("as");
  body.align(4);
  body.text("/a/b");
  return wireMessage("m", "ubasvgo", body.take(), {.bigEndian = bigEndian});
}

// For every changed bit of a message, both readers refuse it or read the same.
TEST(Wire, AgreesWithSdBusOnBrokenMessages) {
  BusServer server;
  int read = 0;
  int refused = 0;
  int lax = 0;
  auto compare = [&](const std::string& bytes, std::size_t at) {
    const auto size = messageSize(bytes);
    if (!size || *size != bytes.size()) return;  // another length: both wait, or end the connection
    const std::string here = readHere(bytes);
    const std::string there = readBySdBus(server, bytes);
    ++(here == "refused" ? refused : read);
    if (here == there) return;
    ++lax;
    // sd-bus accepts bodies without a signature, excess bytes, booleans above one, and nonzero padding.
    EXPECT_EQ(here, "refused") << "byte " << at << ": " << there;
  };
  const std::string ordinary =
      message(kHeader, {mixed(), std::optional<Dictionary>(Dictionary{{"k", "v"}}), List{"a", 2U}, true,
                        std::uint16_t{9}, "text"s, std::vector<std::string>{"a"}});
  for (const std::string& whole : {ordinary, handMade(false), handMade(true)}) {
    EXPECT_NE(readHere(whole), "refused");
    compare(whole, 0);
    for (std::size_t at = 0; at < whole.size() && !HasFailure(); ++at) {
      for (int bit = 0; bit < 8; ++bit) {
        std::string bytes = whole;
        bytes[at] = static_cast<char>(bytes[at] ^ (1 << bit));
        compare(bytes, at);
      }
    }
    for (std::size_t length = kFixedHeader; length < whole.size(); ++length) {
      EXPECT_GT(messageSize(whole.substr(0, length)), length) << "cut at " << length;
    }
  }
  EXPECT_GT(read, 1000);
  EXPECT_GT(refused, 1000);
  EXPECT_LT(lax, 300);
}

// --- Limits

TEST(Wire, WritesNothingThatNoReceiverTakes) {
  struct Case {
    const char* what;
    Value value;
    CodecResult result;
  };
  for (const Case& c : {
           Case{"not UTF-8", "\xff", CodecResult::Malformed},
           Case{"100,000 values", List(std::vector<Value>(100'000)), CodecResult::LimitExceeded},
           Case{"1 MiB", std::string(std::size_t{1} << 20, 'x'), CodecResult::LimitExceeded},
           Case{"too many containers", nested(kDeepest + 1), CodecResult::LimitExceeded},
           Case{"too long a message", List(std::vector<Value>(90'000, Date{})), CodecResult::LimitExceeded},
           Case{"the deepest", nested(kDeepest), CodecResult::Ok},
       }) {
    SCOPED_TRACE(c.what);
    std::string out = "before";
    EXPECT_EQ(appendCall(kObjectPath, {kInterface, "m", {Dictionary{{"k", c.value}}}}, out), c.result);
    EXPECT_EQ(out == "before", c.result != CodecResult::Ok);
  }
}

}  // namespace
}  // namespace vesk::test
