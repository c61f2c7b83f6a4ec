// Values as D-Bus messages, in both directions and at their limits.
#include <gtest/gtest.h>

#include "platform/ipc/BusCodec.h"
#include "tests/support/BusServer.h"

namespace vesk {
namespace {

class WireCodec : public testing::Test {
 protected:
  void fresh() {
    sd_bus_message* raw = nullptr;
    ASSERT_GE(sd_bus_message_new_method_call(_server.bus(), &raw, nullptr, "/o", "i.f", "m"), 0);
    _message.reset(raw);
  }

  sd_bus_message* message() { return _message.get(); }
  void seal() { ASSERT_GE(sd_bus_message_seal(message(), 1, 0), 0); }

  void SetUp() override { fresh(); }
  template <class... Arguments>
  Value decoded(const char* types, Arguments... arguments) {
    fresh();
    EXPECT_GE(sd_bus_message_append(message(), types, arguments...), 0) << types;
    seal();
    BusDecoder decoder(message());
    Value value;
    EXPECT_TRUE(decoder.read(value)) << types << ": " << describe(decoder.result());
    return value;
  }

  test::BusServer _server;
  BusMessageHandle _message;
};

// wire_one_way_test.cpp has the others, as they come from our own encoder.
TEST_F(WireCodec, ReadsEveryOtherBasicTypeAsTheValueItMeans) {
  EXPECT_EQ(decoded("v", "y", 200), Value(200u));
  EXPECT_EQ(decoded("v", "q", 65535), Value(65535u));
  EXPECT_EQ(decoded("v", "u", 4294967295u), Value(4294967295u));
  EXPECT_EQ(decoded("v", "n", -32768), Value(-32768));
  EXPECT_EQ(decoded("v", "i", -5), Value(-5));
  EXPECT_EQ(decoded("v", "o", "/a/b"), Value("/a/b"));
  EXPECT_EQ(decoded("v", "g", "a{sv}"), Value("a{sv}"));
  EXPECT_EQ(decoded("v", "g", ""), Value());
  EXPECT_EQ(decoded("v", "(d)", 12.25), Value(Date{12.25}));
  EXPECT_EQ(decoded("s", "bare"), Value("bare"));
}

TEST_F(WireCodec, ReadsEveryContainerAsListDictionaryOrBytes) {
  EXPECT_EQ(decoded("v", "as", 2, "a", "b"), Value(List{"a", "b"}));
  EXPECT_EQ(decoded("v", "an", 2, 1, -1), Value(List{1, -1}));
  EXPECT_EQ(decoded("v", "aay", 2, 1, 65, 0), Value(List{Bytes("A"), Bytes()}));
  EXPECT_EQ(decoded("v", "(is)", 4, "x"), Value(List{4, "x"}));
  EXPECT_EQ(decoded("v", "a(ii)", 1, 3, 4), Value(List{Value(List{3, 4})}));
  EXPECT_EQ(decoded("v", "a{ss}", 1, "k", "v"), Value(Dictionary{{"k", "v"}}));
  EXPECT_EQ(decoded("v", "a{is}", 1, 9, "v"), Value(List{Value(List{9, "v"})}));
  EXPECT_EQ(decoded("v", "v", "v", "u", 1), Value(1u));
  EXPECT_EQ(decoded("av", 0), Value(List{}));
  EXPECT_EQ(decoded("a{sv}", 2, "k", "i", 1, "k", "i", 2), Value(Dictionary{{"k", 2}}))
      << "the last value of a key wins";
}

TEST_F(WireCodec, RefusesWhatHasNoValue) {
  ASSERT_GE(sd_bus_message_append(message(), "v", "h", 0), 0);
  seal();
  BusDecoder decoder(message());
  Value value;
  EXPECT_FALSE(decoder.read(value));
  EXPECT_EQ(decoder.result(), CodecResult::WrongType);
  bool more = false;
  EXPECT_FALSE(decoder.read(more)) << "a failure sticks";
}

TEST_F(WireCodec, RefusesMoreThanOneOfWhatMayBeAbsent) {
  ASSERT_GE(sd_bus_message_append(message(), "asaa{sv}", 2, "a", "b", 2, 0, 0), 0);
  seal();
  std::optional<std::string> text;
  BusDecoder texts(message());
  EXPECT_FALSE(texts.read(text));
  EXPECT_EQ(texts.result(), CodecResult::WrongType);
}

/// `depth` lists, or dictionaries, around a number.
Value nested(std::size_t depth, bool dictionaries) {
  Value value = 1;
  for (std::size_t i = 0; i < depth; ++i) {
    value = dictionaries ? Value(Dictionary{{"k", value}}) : Value(List{value});
  }
  return value;
}

TEST_F(WireCodec, TakesWhatIsAsDeepAsTheLimitAndNoDeeper) {
  auto decode = [&](std::size_t depth, bool dictionaries, CodecLimits limits) {
    fresh();
    BusEncoder encoder(message());
    const Value written = nested(depth, dictionaries);
    if (!(dictionaries ? encoder.append(*written.dictionary()) : encoder.append(*written.list()))) {
      return encoder.result();
    }
    seal();
    BusDecoder decoder(message(), limits);
    Value value;
    if (decoder.read(value)) {
      EXPECT_EQ(value, written);
    }
    return decoder.result();
  };
  for (bool dictionaries : {false, true}) {
    EXPECT_EQ(decode(20, dictionaries, {.depth = 20}), CodecResult::Ok);
    EXPECT_EQ(decode(21, dictionaries, {.depth = 20}), CodecResult::LimitExceeded);
    // sd-bus has room for fewer than the limit: a list takes two containers, a dictionary three.
    const std::size_t room = dictionaries ? 42 : 63;
    EXPECT_EQ(decode(room, dictionaries, {}), CodecResult::Ok);
    EXPECT_EQ(decode(room + 1, dictionaries, {}), CodecResult::LimitExceeded);
    EXPECT_EQ(decode(100, dictionaries, {}), CodecResult::LimitExceeded);
  }
}

TEST_F(WireCodec, UnwrapsVariantsInVariants) {
  for (int i = 0; i < 100; ++i)
    ASSERT_GE(sd_bus_message_open_container(message(), 'v', i < 99 ? "v" : "b"), 0);
  int one = 1;
  ASSERT_GE(sd_bus_message_append_basic(message(), 'b', &one), 0);
  for (int i = 0; i < 100; ++i) ASSERT_GE(sd_bus_message_close_container(message()), 0);
  seal();
  BusDecoder decoder(message());
  Value value;
  EXPECT_TRUE(decoder.read(value));
  EXPECT_EQ(value, Value(true));
}

TEST_F(WireCodec, CountsValuesAndContentOverAllArguments) {
  const std::string text(100, 'x');
  auto decode = [&](CodecLimits limits) {
    BusDecoder decoder(message(), limits);
    Dictionary first;
    Dictionary second;
    sd_bus_message_rewind(message(), true);
    static_cast<void>(decoder.read(first) && decoder.read(second));
    return decoder.result();
  };
  BusEncoder encoder(message());
  encoder.append(Dictionary{{"a", text}});
  encoder.append(Dictionary{{"b", text}});
  seal();
  // Two dictionaries of one value: 4 values at 8 bytes, 2 keys and 2 texts.
  EXPECT_EQ(decode({.content = 234}), CodecResult::Ok);
  EXPECT_EQ(decode({.content = 233}), CodecResult::LimitExceeded);
  EXPECT_EQ(decode({.nodes = 4}), CodecResult::Ok);
  EXPECT_EQ(decode({.nodes = 3}), CodecResult::LimitExceeded);
}

}  // namespace
}  // namespace vesk
