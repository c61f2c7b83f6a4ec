#include <gtest/gtest.h>

#include "platform/plist/PropertyList.h"

namespace vesk {
namespace {

using namespace std::string_literals;

/// A property list with the given objects. `root` is the index of its root; offsets and references take one
/// byte.
std::string document(const std::vector<std::string>& objects, std::size_t root = 0) {
  std::string bytes = "bplist00";
  std::string offsets;
  for (const auto& object : objects) {
    offsets += static_cast<char>(bytes.size());
    bytes += object;
  }
  const auto table = static_cast<char>(bytes.size());
  const auto tail = [](std::size_t number) { return std::string(7, '\0') + static_cast<char>(number); };
  return bytes + offsets + std::string(6, '\0') + "\x01\x01" + tail(objects.size()) + tail(root) +
         tail(static_cast<unsigned char>(table));
}

TEST(BinaryPropertyList, ReadsTheRarerForms) {
  const struct {
    std::string object;
    Value value;
  } cases[] = {
      {"\x00"s, Value()},
      {"\x14"s + std::string(8, '\0') + std::string(7, '\0') + "\x05", 5},
      {"\x14"s + std::string(15, '\xFF') + "\xFD", -3},
      {"\x22\x3F\xC0\x00\x00"s, 1.5},
      {"\x5F\x10\x02\x68\x69"s, "hi"},
      {"\x5F\x13\x00\x00\x00\x00\x00\x00\x00\x02\x68\x69"s, "hi"},
  };
  for (const auto& c : cases) {
    const auto outcome = parsePropertyList(document({c.object}));
    EXPECT_TRUE(outcome && *outcome == c.value) << describe(c.value);
  }
}

TEST(BinaryPropertyList, RefusesWhatIsWrong) {
  const struct {
    const char* what;
    std::string bytes;
  } cases[] = {
      {"magic number only", "bplist00"},
      {"root is no object", document({"\x09"}, 1)},
      {"trailing junk", document({"\x09"}) + "x"},
      {"integer beyond 64 bits", document({"\x14"s + std::string(7, '\0') + "\x01" + std::string(8, '\0')})},
      {"text over the end", document({"\x53\x61\x62"})},
      {"text of 2^63 bytes", document({"\x5F\x13\x80\x00\x00\x00\x00\x00\x00\x00"s})},
      {"list of 2^60 entries", document({"\xAF\x13\x10\x00\x00\x00\x00\x00\x00\x00"s})},
      {"byte above ASCII", document({"\x51\xE9"})},
      {"NUL in ASCII", document({"\x51\x00"s})},
      {"lone surrogate", document({"\x61\xD8\x3C"s})},
      {"key that is no text", document({"\xD1\x01\x01", "\x09"})},
      {"reference to no object", document({"\xA1\x07"})},
      {"list that holds itself", document({"\xA1\x00"s})},
      {"UID outside of an archive", document({"\x80\x01"})},
  };
  for (const auto& c : cases) {
    const auto outcome = parsePropertyList(c.bytes);
    ASSERT_FALSE(outcome) << c.what;
    EXPECT_FALSE(outcome.error().text.empty()) << c.what;
  }
}

/// `levels` nested lists, each of which contains the next one twice.
std::string doublings(std::size_t levels) {
  std::vector<std::string> objects;
  for (std::size_t i = 1; i <= levels; ++i) objects.push_back("\xA2" + std::string(2, static_cast<char>(i)));
  objects.push_back("\x09");
  return document(objects);
}

TEST(BinaryPropertyList, CountsSharedPartsAtEveryVisit) {
  EXPECT_TRUE(parsePropertyList(doublings(15)));
  EXPECT_EQ(parsePropertyList(doublings(17)).error().text, "more than 100000 values");
  std::vector<Value> copies(100, Value(std::string(500'000, 'x')));
  const auto bytes = writeBinaryPropertyList(List(std::move(copies)));
  ASSERT_TRUE(bytes && bytes->size() < 600'000);
  EXPECT_EQ(parsePropertyList(*bytes).error().text, "more than 16777216 bytes of content");
}

TEST(BinaryPropertyList, MeasuresTheDepthOfSharedPartsWhereTheyStand) {
  // A chain of lists. The shared part is met first near the root, then again at the bottom.
  const auto chain = [](std::size_t depth) {
    std::vector<std::string> objects = {"\xA2\x01\x02"};  // the root: the shared part, then the chain
    objects.push_back("\xA0");                            // the shared part is a list itself
    for (std::size_t i = 2; i < depth; ++i)
      objects.push_back("\xA1" + std::string(1, static_cast<char>(i + 1)));
    objects.back() = "\xA1\x01";
    return document(objects);
  };
  EXPECT_TRUE(parsePropertyList(chain(64)));
  EXPECT_EQ(parsePropertyList(chain(65)).error().text, "nested deeper than 64");
}

}  // namespace
}  // namespace vesk
