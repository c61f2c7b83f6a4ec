#include <gtest/gtest.h>

#include "platform/plist/PropertyList.h"

namespace vesk {
namespace {

using namespace std::string_literals;

/// A list of the given objects, the first of which is the root; offsets and references take one byte.
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

Value archived(const std::string& bytes) {
  return parsePropertyList(bytes, PropertyListFlavor::KeyedArchive).value.value_or(Value("(refused)"));
}

// What plistlib writes is read in plist_oracle_test.cpp.
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
    EXPECT_EQ(outcome.value, c.value) << describe(c.value) << ": " << outcome.error;
  }
}

TEST(BinaryPropertyList, RefusesWhatIsWrong) {
  const struct {
    const char* what;
    std::string bytes;
  } cases[] = {
      {"magic number only", "bplist00"},
      {"no trailer", "bplist00\x09"},
      {"root is no object", document({"\x09"}, 1)},
      {"no objects", document({})},
      {"trailing junk", document({"\x09"}) + "x"},
      {"fill byte", document({"\x0F"})},
      {"integer of 32 bytes", document({"\x15" + std::string(32, '\0')})},
      {"integer beyond 64 bits", document({"\x14"s + std::string(7, '\0') + "\x01" + std::string(8, '\0')})},
      {"negative integer beyond 64 bits",
       document({"\x14"s + std::string(8, '\xFF') + "\x01" + std::string(7, '\0')})},
      {"real of 2 bytes", document({"\x21\x00\x00"s})},
      {"date of 4 bytes", document({"\x32\x00\x00\x00\x00"s})},
      {"text over the end", document({"\x53\x61\x62"})},
      {"text of 2^63 bytes", document({"\x5F\x13\x80\x00\x00\x00\x00\x00\x00\x00"s})},
      {"wide text of 2^63 units", document({"\x6F\x13\x80\x00\x00\x00\x00\x00\x00\x01"s})},
      {"list of 2^60 entries", document({"\xAF\x13\x10\x00\x00\x00\x00\x00\x00\x00"s})},
      {"length that is no integer", document({"\x5F\x51\x02\x68\x69"s})},
      {"length of 16 bytes", document({"\x5F\x14"s + std::string(15, '\0') + "\x01" + "x"})},
      {"byte above ASCII", document({"\x51\xE9"})},
      {"NUL in ASCII", document({"\x51\x00"s})},
      {"NUL in a wide text", document({"\x61\x00\x00"s})},
      {"lone surrogate", document({"\x61\xD8\x3C"s})},
      {"key that is no text", document({"\xD1\x01\x01", "\x09"})},
      {"reference to no object", document({"\xA1\x07"})},
      {"list that holds itself", document({"\xA1\x00"s})},
      {"lists that hold each other", document({"\xA1\x01", "\xA1\x00"s})},
      {"set", document({"\xC1\x01", "\x09"})},
      {"UID outside of an archive", document({"\x80\x01"})},
  };
  for (const auto& c : cases) {
    const auto outcome = parsePropertyList(c.bytes);
    EXPECT_FALSE(outcome.value) << c.what;
    EXPECT_FALSE(outcome.error.empty()) << c.what;
  }
}

/// `levels` lists, each of which holds the next one twice.
std::string doublings(std::size_t levels) {
  std::vector<std::string> objects;
  for (std::size_t i = 1; i <= levels; ++i) objects.push_back("\xA2" + std::string(2, static_cast<char>(i)));
  objects.push_back("\x09");
  return document(objects);
}

TEST(BinaryPropertyList, CountsSharedPartsAtEveryVisit) {
  EXPECT_TRUE(parsePropertyList(doublings(15)).value);
  EXPECT_EQ(parsePropertyList(doublings(17)).error, "more than 100000 values");
  EXPECT_EQ(parsePropertyList(doublings(50)).error, "more than 100000 values");
}

TEST(BinaryPropertyList, CountsTheBytesOfSharedTextsAtEveryVisit) {
  std::vector<Value> copies(100, Value(std::string(500'000, 'x')));
  const auto bytes = writeBinaryPropertyList(List(std::move(copies)));
  ASSERT_TRUE(bytes && bytes->size() < 600'000);
  EXPECT_EQ(parsePropertyList(*bytes).error, "more than 16777216 bytes of content");
}

TEST(BinaryPropertyList, MeasuresTheDepthOfSharedPartsWhereTheyStand) {
  // A chain of lists whose end is first met near the root, then again at its bottom.
  const auto chain = [](std::size_t depth) {
    std::vector<std::string> objects = {"\xA2\x01\x02"};  // the root: the shared part, then the chain
    objects.push_back("\xA0");                            // the shared part is a list itself
    for (std::size_t i = 2; i < depth; ++i)
      objects.push_back("\xA1" + std::string(1, static_cast<char>(i + 1)));
    objects.back() = "\xA1\x01";
    return document(objects);
  };
  EXPECT_TRUE(parsePropertyList(chain(64)).value);
  EXPECT_EQ(parsePropertyList(chain(65)).error, "nested deeper than 64");
}

TEST(BinaryPropertyList, HasUIDsInArchivesOnly) {
  const Value uid = Dictionary{{"CF$UID", 258u}};
  EXPECT_EQ(archived(document({"\x81\x01\x02"})), uid);
  const auto bytes =
      writeBinaryPropertyList(List{uid, Dictionary{{"CF$UID", -1}}}, PropertyListFlavor::KeyedArchive);
  ASSERT_TRUE(bytes);
  EXPECT_NE(bytes->find("\x81\x01\x02"), std::string::npos);
  EXPECT_EQ(archived(*bytes), Value(List{uid, Dictionary{{"CF$UID", -1}}}));
  EXPECT_EQ(writeBinaryPropertyList(uid)->find("\x81\x01\x02"), std::string::npos);
}

TEST(BinaryPropertyList, IsNotWrittenWithWhatNobodyCouldReadBack) {
  Value deep = List{};
  for (int i = 1; i < 65; ++i) deep = List{deep};
  for (const Value& value :
       {Value("\xFF"), Value(std::string_view("a\0", 2)), Value(Dictionary{{"\xFF", 1}}), deep}) {
    EXPECT_EQ(writeBinaryPropertyList(value), std::nullopt) << describe(value);
  }
  EXPECT_EQ(parsePropertyList(*writeBinaryPropertyList(List{Value()})).value, Value(List{Value()}));
}

/// Every kind of value in a few hundred bytes.
const Value kSmallSample =
    Dictionary{{"t", "text é"},
               {"i", List{1, -1, UINT64_MAX}},
               {"r", 1.5},
               {"d", Date{1e9}},
               {"b", Bytes("\0\x01"s)},
               {"f", false},
               {"n", Dictionary{{"t", "text é"}, {"a fairly long key", List{Value(List{})}}}}};

TEST(PropertyList, SurvivesEveryTruncationAndEveryFlippedBit) {
  for (const auto& bytes : {*writeBinaryPropertyList(kSmallSample), *writeXMLPropertyList(kSmallSample)}) {
    ASSERT_EQ(parsePropertyList(bytes).value, kSmallSample);
    const auto check = [](std::string damaged) {
      for (auto flavor : {PropertyListFlavor::Plain, PropertyListFlavor::KeyedArchive}) {
        // A copy of its own, so that a read past the end is one past the allocation.
        const auto outcome = parsePropertyList(std::string(damaged), flavor);
        EXPECT_EQ(outcome.value.has_value(), outcome.error.empty());
        if (outcome.value) describe(*outcome.value, 1 << 20);
      }
    };
    for (std::size_t size = 0; size < bytes.size(); ++size) check(bytes.substr(0, size));
    for (std::size_t bit = 0; bit < 8 * bytes.size(); ++bit) {
      std::string damaged = bytes;
      damaged[bit / 8] = static_cast<char>(damaged[bit / 8] ^ (1 << bit % 8));
      check(std::move(damaged));
    }
  }
}

}  // namespace
}  // namespace vesk
