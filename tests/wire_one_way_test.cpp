// One-way calls that the client encodes itself: what arrives, and what is refused.
#include <gtest/gtest.h>
#include <poll.h>

#include <future>
#include <limits>

#include "platform/ipc/BusClient.h"
#include "platform/ipc/IPCIncomingCall.h"
#include "platform/ipc/IPCListener.h"
#include "platform/ipc/OneWayEncoder.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

constexpr char kObjectPath[] = "/test";
constexpr char kInterface[] = "test.Interface";
constexpr char kMember[] = "take";
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

/// Hands over what the first call brought.
class Taker final : public IPCExportedObject, public IPCListenerDelegate {
 public:
  const char* interfaceName() const override { return kInterface; }
  void handle(IPCIncomingCall& call) override {
    Arguments a;
    EXPECT_FALSE(call.expectsReply());
    EXPECT_TRUE(call.read(kSignature, a.flag, a.number, a.real, a.text, a.dictionary, a.list,
                          a.maybeDictionary, a.maybeText, a.texts, a.maybeTexts));
    taken.set_value(a);
  }
  bool shouldAcceptNewConnection(const std::shared_ptr<IPCConnection>& connection) override {
    connection->setExportedObject(std::shared_ptr<IPCExportedObject>(this, [](auto*) {}));
    connection->resume();
    return true;
  }
  std::promise<Arguments> taken;
};

Arguments carried(const Arguments& sent) {
  TempDirectory directory;
  Taker taker;
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
  EXPECT_EQ(bus.add(sent.call()), BusClient::SendResult::Sent);
  EXPECT_EQ(bus.queuedMessages(), 1U);
  EXPECT_EQ(bus.write(), BusClient::Progress::Connected);
  EXPECT_EQ(bus.queuedMessages(), 0U);
  return taker.taken.get_future().get();
}

TEST(WireOneWay, EveryArgumentArrivesAsItWas) {
  Arguments all;
  all.flag = true;
  all.number = 65535;
  all.real = -1.5;
  all.text = "h\xc3\xa9llo, longer than eight";
  all.dictionary = {{"none", Value()},
                    {"no", false},
                    {"yes", true},
                    {"least", std::numeric_limits<std::int64_t>::min()},
                    {"most", std::numeric_limits<std::uint64_t>::max()},
                    {"real", 0.1},
                    {"text", ""},
                    {"bytes", Bytes(std::string("\0\xff", 2))},
                    {"no bytes", Bytes()},
                    {"date", Date{12.25}},
                    {"list", List{1, "a", List{}, Dictionary{}}},
                    {"mixed", Dictionary{{"x", Dictionary{{"y", List{Date{1}, true}}}}}},
                    {"deepest", nested(kDeepest)}};
  all.list = {"a", 2U, Bytes("b")};
  all.maybeDictionary = Dictionary{{"k", "v"}};
  all.maybeText = "t";
  all.texts = {"a", "", "bcd"};
  all.maybeTexts = {{"x", "y"}};
  for (const Arguments& sent : {all, Arguments{}}) EXPECT_EQ(carried(sent), sent);

  // Every alignment that a text can leave behind itself.
  for (int length = 0; length < 9; ++length) {
    Arguments padded;
    padded.text = std::string(static_cast<std::size_t>(length), 'x');
    padded.dictionary = {{padded.text, length}, {"d", 1.5}};
    EXPECT_EQ(carried(padded), padded);
  }
}

TEST(WireOneWay, RefusesWhatNoReceiverTakesAndLeavesNothingBehind) {
  struct Case {
    const char* what;
    Value value;
    CodecResult result;
  };
  Value lists = 1;
  for (int i = 0; i < 63; ++i) lists = List{lists};
  for (const Case& c : {
           Case{"not UTF-8", "\xff", CodecResult::Malformed},
           Case{"not UTF-8 after much that is", "12345678\xc3", CodecResult::Malformed},
           Case{"an overlong form", "\xc0\x80", CodecResult::Malformed},
           Case{"a surrogate", "\xed\xa0\x80", CodecResult::Malformed},
           Case{"a NUL", std::string("12345678\0", 9), CodecResult::Malformed},
           Case{"a NUL in eight", std::string("1234567\0", 8), CodecResult::Malformed},
           Case{"a bad key", Dictionary{{"\xff", 1}}, CodecResult::Malformed},
           Case{"one container too many", nested(kDeepest + 1), CodecResult::LimitExceeded},
           Case{"lists nested too deeply", lists, CodecResult::LimitExceeded},
           Case{"too many values", List(std::vector<Value>(100'001)), CodecResult::LimitExceeded},
           Case{"too much content", std::string(1'100'000, 'x'), CodecResult::LimitExceeded},
           Case{"too long only on the wire", List(std::vector<Value>(90'000, Date{})),
                CodecResult::LimitExceeded},
           Case{"an emoji", "\xf0\x9f\x98\x80", CodecResult::Ok},
       }) {
    SCOPED_TRACE(c.what);
    OneWayEncoder encoder(kObjectPath);
    IPCOutgoingCall call{kInterface, kMember, {Dictionary{{"k", c.value}}}};
    std::string out = "before";
    EXPECT_EQ(encoder.append(call, 1, out), c.result);
    EXPECT_EQ(out == "before", c.result != CodecResult::Ok);
  }
}

}  // namespace
}  // namespace vesk::test
