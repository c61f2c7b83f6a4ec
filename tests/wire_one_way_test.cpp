// Calls on the wire, with sd-bus and without: what arrives and what is refused.
#include <gtest/gtest.h>
#include <poll.h>

#include <future>
#include <limits>

#include "platform/ipc/BusClient.h"
#include "platform/ipc/IPCIncomingCall.h"
#include "platform/ipc/IPCListener.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

constexpr char kObjectPath[] = "/test";
constexpr char kInterface[] = "test.Interface";
constexpr char kMember[] = "take";
constexpr std::chrono::seconds kPatience{60};
constexpr char kSignature[] = "bqdsa{sv}avaa{sv}asasaas";

struct Arguments {
  bool flag = false;
  std::uint16_t number = 0;
  double real = 0;
  std::string text;
  Dictionary dictionary;
  List list;
  std::optional<Dictionary> maybeDictionary;
  std::optional<std::string> maybeText;
  std::vector<std::string> texts;
  std::optional<std::vector<std::string>> maybeTexts;

  friend bool operator==(const Arguments&, const Arguments&) = default;

  IPCOutgoingCall call() const {
    return {kInterface,
            kMember,
            {flag, number, real, text, dictionary, list, maybeDictionary, maybeText, texts, maybeTexts}};
  }
};

// Inside a dictionary: any more, and the receiver refuses the message.
constexpr int kDeepest = 41;

Value nested(int depth) {
  Value value = 1;
  for (int i = 0; i < depth; ++i) value = Dictionary{{"d", value}};
  return value;
}

/// A value of every kind, and the extremes of some.
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

/// Hands over what the first call brought.
class Taker final : public IPCExportedObject, public IPCListenerDelegate {
 public:
  const char* interfaceName() const override { return kInterface; }
  void handle(IPCIncomingCall& call) override {
    Arguments a;
    EXPECT_EQ(call.expectsReply(), expectsReply);
    EXPECT_TRUE(call.read(kSignature, a.flag, a.number, a.real, a.text, a.dictionary, a.list,
                          a.maybeDictionary, a.maybeText, a.texts, a.maybeTexts));
    taken.set_value(a);
  }
  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override {
    connection->setExportedObject(std::shared_ptr<IPCExportedObject>(this, [](auto*) {}));
    connection->resume();
    return true;
  }
  bool expectsReply = false;
  std::promise<Arguments> taken;
};

Arguments carried(const Arguments& sent, bool expectsReply = false) {
  TempDirectory directory;
  Taker taker;
  taker.expectsReply = expectsReply;
  IPCListener::Options options;
  options.socketPath = directory / "run/socket";
  options.objectPath = kObjectPath;
  IPCListener listener(std::move(options));
  listener.setDelegate(&taker);
  listener.resume();

  BusClient::Options client;
  client.socketPath = directory / "run/socket";
  client.objectPath = kObjectPath;
  BusClient bus(std::move(client));
  while (!bus.isReady()) {
    pollfd poll{bus.fd(), bus.events(), 0};
    ::poll(&poll, 1, bus.timeout());
    EXPECT_EQ(bus.process(), BusClient::Progress::Connected);
  }
  if (expectsReply) {
    EXPECT_EQ(bus.send(
                  sent.call(), [](BusAnswer&) {}, kPatience),
              BusClient::SendResult::Sent);
    EXPECT_EQ(bus.queuedMessages(), 0U);
    return taker.taken.get_future().get();
  }
  EXPECT_EQ(bus.add(sent.call()), BusClient::SendResult::Sent);
  EXPECT_EQ(bus.queuedMessages(), 1U);
  EXPECT_EQ(bus.write(), BusClient::Progress::Connected);
  EXPECT_EQ(bus.queuedMessages(), 0U);
  return taker.taken.get_future().get();
}

TEST(Wire, EveryArgumentArrivesAsItWas) {
  Arguments all;
  all.flag = true;
  all.number = 65535;
  all.real = -1.5;
  all.text = "h\xc3\xa9llo, longer than eight";
  all.dictionary = {{"mixed", mixed()}, {"deepest", nested(kDeepest)}};
  all.list = {"a", 2U, Bytes("b")};
  all.maybeDictionary = Dictionary{{"k", "v"}};
  all.maybeText = "t";
  all.texts = {"a", "", "bcd"};
  all.maybeTexts = {{"x", "y"}};
  for (const Arguments& sent : {all, Arguments{}})
    for (bool expectsReply : {false, true}) EXPECT_EQ(carried(sent, expectsReply), sent);

  // Every alignment that a text can leave behind itself.
  for (int length = 0; length < 9; ++length) {
    Arguments padded;
    padded.text = std::string(static_cast<std::size_t>(length), 'x');
    padded.dictionary = {{padded.text, length}, {"d", 1.5}};
    EXPECT_EQ(carried(padded), padded);
  }
}

}  // namespace
}  // namespace vesk::test
