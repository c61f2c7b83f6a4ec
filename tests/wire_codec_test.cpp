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

}  // namespace
}  // namespace vesk
