// Keyed archives: round trips, and comparison with Python's plistlib.
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
  for (const auto& bytes : {std::string(), *writeBinaryPropertyList(Dictionary{})})
    EXPECT_FALSE(unarchiveValue(bytes));
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

}  // namespace
}  // namespace vesk::test
