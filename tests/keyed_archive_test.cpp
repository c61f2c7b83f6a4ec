// Keyed archives: round trips, comparison with Python's plistlib, and what is refused.
#include <gtest/gtest.h>

#include "platform/plist/KeyedArchive.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TempDirectory.h"
#include "tools/plist/KeyedArchiveReader.h"

namespace vesk::test {
namespace {

TEST(KeyedArchive, ReadsBackWhatWasArchived) {
  Value deep = List{"same", "same"};
  for (int i = 1; i < 64; ++i) deep = List{deep};
  std::vector<Value> many;  // more than a one-byte index covers
  for (int i = 0; i < 300; ++i) many.emplace_back(i);
  const List shared{"same", 1};
  const List texts{"text", "ä → 🎉", "\uFDD0\uFFFE\U0010FFFF", "", "$null", "text"};
  const List numbers{-7, INT64_MIN, UINT64_MAX, 0.1, true, false, Value(), Date{1795552289.25}};
  const Dictionary nested{{"shared", shared}, {"text", "text"}, {"", List{Value(List{Value()})}}};
  const List all{texts, numbers, Bytes(std::string("\0\x01\xff", 3)), List{}, Dictionary{}, shared, nested};
  for (const Value& value : {Value(all), deep, Value(List(many)), Value(), Value("$null"), Value(3)}) {
    const auto archive = archiveValue(value);
    ASSERT_TRUE(archive);
    const auto read = unarchiveValue(*archive);
    EXPECT_TRUE(read && *read == value) << describe(value);
  }
  for (const Value& value : {Value(List{deep}), Value("\xff"), Value(Dictionary{{"a\xc0", 1}})})
    EXPECT_FALSE(archiveValue(value));
}

TEST(KeyedArchive, IsAGraphOfObjectsWithClassesForOthersToo) {
  TempDirectory directory;
  const auto archive =
      archiveValue(List{"a", Dictionary{{"k", "a"}, {"d", Date{86400.5}}}, Bytes("xy"), Value()});
  ASSERT_TRUE(archive);
  ChildProcess python({VESK_PYTHON, "-c", R"(
import plistlib, sys
document = plistlib.load(open(sys.argv[1], "rb"))
objects = document["$objects"]
assert document["$version"] == 100000 and document["$archiver"] == "VeskKeyedArchiver"
assert objects[0] == "$null" and list(document) == ["$version", "$archiver", "$top", "$objects"]
def chain(name): return {"$classname": name, "$classes": [name, "Object"]}
def read(uid):
    assert isinstance(uid, plistlib.UID)
    value = objects[uid.data]
    if not isinstance(value, dict): return None if uid.data == 0 else value
    kind = objects[value.pop("$class").data]
    assert kind == chain(kind["$classname"]), kind
    return (kind["$classname"], {k: [read(u) for u in v] if isinstance(v, list) else v for k, v in value.items()})
assert objects.count("a") == 1
print(read(document["$top"]["root"]))
)",
                       directory.write("archive", *archive).string()});
  ASSERT_EQ(python.wait(), 0) << python.errors();
  EXPECT_EQ(python.output(),
            "('List', {'items': ['a', ('Dictionary', {'keys': ['k', 'd'], 'items': ['a', "
            "('Date', {'seconds': 86400.5})]}), ('Data', {'bytes': b'xy'}), None]})\n");
}

Value uid(std::uint64_t index) { return Dictionary{{"CF$UID", index}}; }

std::string document(List objects, Value root = uid(1)) {
  return *writeBinaryPropertyList(Dictionary{{"$version", 100000},
                                             {"$archiver", "VeskKeyedArchiver"},
                                             {"$top", Dictionary{{"root", std::move(root)}}},
                                             {"$objects", std::move(objects)}},
                                  PropertyListFlavor::KeyedArchive);
}

TEST(KeyedArchive, RefusesWhatIsNoArchive) {
  const Value listClass = Dictionary{{"$classname", "List"}};
  auto list = [](std::vector<Value> items) {
    return Value(Dictionary{{"items", List(std::move(items))}, {"$class", uid(2)}});
  };
  // Each object contains the next one `times` times: small to write, endless to traverse.
  const auto chain = [&](std::uint64_t length, std::size_t times) {
    std::vector<Value> objects{"$null"};
    for (std::uint64_t i = 1; i <= length; ++i)
      objects.push_back(
          Dictionary{{"items", List(std::vector<Value>(times, uid(i + 1)))}, {"$class", uid(length + 2)}});
    objects.insert(objects.end(), {Value(1), listClass});
    return document(List(std::move(objects)));
  };
  const struct {
    std::string bytes;
    const char* error;
  } cases[] = {
      {"", "no keyed archive: it is no binary property list"},
      {*writeBinaryPropertyList(Dictionary{}), "no keyed archive: another archiver made it"},
      {document({}), "no keyed archive: it has no objects or no root"},
      {document({"$null", 1}, uid(2)), "a reference to no object"},
      {document({"$null", list({uid(1)}), listClass}), "nested deeper than 64"},
      {document({"$null", Dictionary{{"$class", uid(2)}}, Dictionary{{"$classname", "Bus"}}}),
       "an object of an unknown class or form"},
      {document({"$null", Dictionary{{"$class", uid(2)}}, listClass}), "a list without items"},
      {chain(40, 2), "more than 100000 values"},
      {chain(70, 1), "nested deeper than 64"},
  };
  for (const auto& test : cases) {
    const auto outcome = unarchiveValue(test.bytes);
    ASSERT_FALSE(outcome) << test.error;
    EXPECT_EQ(outcome.error().text, test.error);
  }
}

}  // namespace
}  // namespace vesk::test
