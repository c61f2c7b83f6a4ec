// Calls on the wire, with sd-bus and without: what arrives, what is refused, and what is left to sd-bus.
#include <gtest/gtest.h>
#include <malloc.h>
#include <poll.h>

#include <future>
#include <limits>

#include "platform/ipc/BusClient.h"
#include "platform/ipc/IPCIncomingCall.h"
#include "platform/ipc/IPCListener.h"
#include "platform/ipc/MessageGate.h"
#include "platform/ipc/OneWayDecoder.h"
#include "platform/ipc/OneWayEncoder.h"
#include "tests/support/BusServer.h"
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

TEST(Wire, NothingIsWrittenThatNoReceiverTakes) {
  struct Case {
    const char* what;
    Value value;
    CodecResult result;
  };
  Value lists = 1;
  for (int i = 0; i < 63; ++i) lists = List{lists};
  BusServer server;
  for (const Case& c : {
           Case{"not UTF-8", "\xff", CodecResult::Malformed},
           Case{"a NUL", std::string("12345678\0", 9), CodecResult::Malformed},
           Case{"a bad key", Dictionary{{"\xff", 1}}, CodecResult::Malformed},
           Case{"100,000 values", List(std::vector<Value>(100'000)), CodecResult::LimitExceeded},
           Case{"1 MiB", std::string(std::size_t{1} << 20, 'x'), CodecResult::LimitExceeded},
           Case{"text", "\x01 \u00e9", CodecResult::Ok},
       }) {
    SCOPED_TRACE(c.what);
    const Dictionary written{{"k", c.value}};
    OneWayEncoder oneWay(kObjectPath);
    std::string out = "before";
    EXPECT_EQ(oneWay.append({kInterface, kMember, {written}}, 1, out), c.result);
    EXPECT_EQ(out == "before", c.result != CodecResult::Ok);
    sd_bus_message* raw = nullptr;
    ASSERT_GE(sd_bus_message_new_method_call(server.bus(), &raw, nullptr, "/o", "i.f", "m"), 0);
    BusMessageHandle message(raw);
    BusEncoder encoder(raw);
    EXPECT_EQ(encoder.append(written), c.result == CodecResult::Ok);
    EXPECT_EQ(encoder.result(), c.result);
  }
  // What sd-bus refuses by itself: containers within containers, and lengths on the wire.
  for (const Value& value : {nested(kDeepest + 1), lists, Value(List(std::vector<Value>(90'000, Date{})))}) {
    OneWayEncoder encoder(kObjectPath);
    std::string out = "before";
    EXPECT_EQ(encoder.append({kInterface, kMember, {Dictionary{{"k", value}}}}, 1, out),
              CodecResult::LimitExceeded);
    EXPECT_EQ(out, "before");
  }
}

// --- What the daemon reads itself

std::string encoded(std::vector<IPCArgument> arguments) {
  std::string bytes;
  OneWayEncoder encoder(kObjectPath);
  EXPECT_EQ(encoder.append({kInterface, kMember, std::move(arguments)}, 7, bytes), CodecResult::Ok);
  return bytes;
}

std::optional<OneWayCall> readHere(OneWayDecoder& decoder, const std::string& bytes) {
  auto size = MessageGate::messageSize(bytes);
  if (!size || *size != bytes.size() || !OneWayDecoder::mayDecode(bytes, *size)) return std::nullopt;
  auto call = decoder.decode(bytes);
  // As the router does.
  return call && call->interfaceName == kInterface ? call : std::nullopt;
}

/// All that a call says, as text: a NaN is not equal to itself.
std::string described(std::string_view member, const Dictionary& dictionary,
                      const std::optional<Dictionary>& maybe, const List& list, bool flag,
                      std::uint16_t number) {
  auto text = [](const Value& value) { return describe(value, 1 << 20) + "; "; };
  return std::string(member) + " " + text(dictionary) + text(maybe ? Value(*maybe) : Value()) + text(list) +
         std::to_string(flag) + std::to_string(number);
}

constexpr char kMixedSignature[] = "a{sv}aa{sv}avbq";

std::string describedBySdBus(BusServer& server, const std::string& bytes) {
  BusMessageHandle message = server.read(bytes);
  if (!message || sd_bus_message_has_signature(message.get(), kMixedSignature) <= 0) return "refused";
  BusDecoder decoder(message.get());
  Dictionary dictionary;
  std::optional<Dictionary> maybe;
  List list;
  bool flag = false;
  std::uint16_t number = 0;
  decoder.read(dictionary) && decoder.read(maybe) && decoder.read(list) && decoder.read(flag) &&
      decoder.read(number);
  if (!decoder.ok()) return "refused";
  return described(sd_bus_message_get_member(message.get()), dictionary, maybe, list, flag, number);
}

TEST(WireOneWay, WhateverIsReadWithoutSdBusIsReadAsSdBusReadsIt) {
  const std::string whole = encoded(
      {mixed(), std::optional<Dictionary>(Dictionary{{"k", "v"}}), List{"a", 2U}, true, std::uint16_t{9}});
  BusServer server;
  OneWayDecoder decoder(kObjectPath);
  int read = 0;
  auto compare = [&](const std::string& bytes) {
    auto call = readHere(decoder, bytes);
    if (!call || call->signature != kMixedSignature) return;
    ++read;
    auto& a = call->arguments;
    EXPECT_EQ(described(call->member, std::get<Dictionary>(a[0]), std::get<std::optional<Dictionary>>(a[1]),
                        std::get<List>(a[2]), std::get<bool>(a[3]), std::get<std::uint16_t>(a[4])),
              describedBySdBus(server, bytes));
  };
  compare(whole);
  ASSERT_EQ(read, 1);
  for (std::size_t at = 0; at < whole.size(); ++at) {
    for (int bit = 0; bit < 8; ++bit) {
      std::string bytes = whole;
      bytes[at] = static_cast<char>(bytes[at] ^ (1 << bit));
      compare(bytes);
    }
  }
  // Texts and numbers with a bit changed are texts and numbers.
  EXPECT_GT(read, 500);
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
TEST(WireOneWay, AnEventKeepsLittleMoreThanWhatIsCounted) {
  const Dictionary payload{{"a", "b"}, {"l", List{Dictionary{{"c", 1}}}}};
  const std::string bytes = encoded({Dictionary{{"payload", payload}, {"stray", std::string(7'900, 'x')}}});
  OneWayDecoder decoder(kObjectPath);
  std::vector<Dictionary> kept;
  const std::size_t before = ::mallinfo2().uordblks;
  for (int i = 0; i < 1000; ++i) {
    kept.push_back(*std::get<Dictionary>(readHere(decoder, bytes)->arguments[0]).dictionary("payload"));
  }
  EXPECT_EQ(kept.back(), payload);
  EXPECT_LT(::mallinfo2().uordblks - before, 1000 * (approximateMemory(kept[0]) + 1024) * 11 / 10);
}
#endif

TEST(WireOneWay, LeavesToSdBusWhatIsOutOfTheOrdinary) {
  auto changed = [](std::size_t at, char byte) {
    std::string bytes = encoded({Dictionary{{"k", 1}}});
    bytes[at] = byte;
    return bytes;
  };
  auto longer = [&](std::size_t by) {
    std::string bytes = changed(0, 'l');
    bytes[4] = static_cast<char>(static_cast<std::size_t>(bytes[4]) + by);
    return bytes.append(by, '\0');
  };
  Value deep = 1;
  for (int i = 0; i < 17; ++i) deep = List{deep};
  struct Case {
    const char* what;
    std::string bytes;
    bool isRead;
  };
  for (const Case& c : {
           Case{"the ordinary", changed(0, 'l'), true},
           Case{"the other byte order", changed(0, 'B'), false},
           Case{"a signal", changed(1, 4), false},
           Case{"a call that wants an answer", changed(2, 0), false},
           Case{"bytes behind the arguments", longer(4), false},
           Case{"a text", encoded({std::string("s")}), false},
           Case{"deep lists", encoded({Dictionary{{"k", deep}}}), false},
           Case{"a long one", encoded({Dictionary{{"k", std::string(9000, 'x')}}}), false},
           Case{"no arguments", encoded({}), true},
       }) {
    SCOPED_TRACE(c.what);
    OneWayDecoder decoder(kObjectPath);
    EXPECT_EQ(readHere(decoder, c.bytes).has_value(), c.isRead);
    OneWayDecoder elsewhere("/elsewhere");
    EXPECT_FALSE(readHere(elsewhere, c.bytes));
  }
}

}  // namespace
}  // namespace vesk::test
