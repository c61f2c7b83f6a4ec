// Property lists against an implementation that is not ours, both ways.
#include <gtest/gtest.h>

#include <limits>

#include "platform/plist/PropertyList.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TempDirectory.h"

namespace vesk::test {
namespace {

/// What plist_oracle.py calls its sample.
Value sample() {
  std::string allBytes;
  for (int i = 0; i < 768; ++i) allBytes += static_cast<char>(i);
  MutableDictionary many;
  for (int i = 0; i < 300; ++i) many.set("key " + std::to_string(i), i);
  constexpr double kInfinity = std::numeric_limits<double>::infinity();
  return Dictionary{
      {"texts", List{"", "plain", "<&>\"' \n\t", "äöü → 🎉", std::string(300, 'x')}},
      {"integers", List{0, 1, 127, 128, 255, 256, 65535, 65536, 1LL << 31, 1LL << 32, INT64_MAX,
                        std::uint64_t{1} << 63, UINT64_MAX, -1, -128, -129, -(1LL << 31) - 1, INT64_MIN}},
      {"reals", List{0.0, -1.5, 0.1, 1e300, 5e-324, kInfinity, -kInfinity}},
      {"booleans", List{true, false}},
      {"dates", List{Date{0}, Date{1795552289}, Date{-2203891201}, Date{253402300799}}},
      {"data", List{Bytes(""), Bytes(std::string("\0\x01\xff", 3)), Bytes(allBytes)}},
      {"empty", List{List{}, Dictionary{}}},
      {"shared", List{"same", "same", Dictionary{{"same", "same"}}}},
      {"ключ", Dictionary{{"deep", List{Value(List{Value(List{Value(List{Dictionary{{"er", "!"}}})})})}}}},
      {"many", many.share()},
  };
}

void runOracle(std::vector<std::string> arguments) {
  arguments.insert(arguments.begin(), {VESK_PYTHON, VESK_PLIST_ORACLE});
  ChildProcess oracle(std::move(arguments));
  ASSERT_EQ(oracle.wait(), 0) << oracle.errors();
}

TEST(PropertyListOracle, WritesWhatIsReadAsItWasMeantAndReadsWhatWeWrite) {
  TempDirectory directory;
  for (const std::string encoding : {"xml", "binary"}) {
    SCOPED_TRACE(encoding);
    runOracle({"write", encoding, directory / "sample.plist"});
    const auto outcome = parsePropertyList(directory.read("sample.plist"));
    ASSERT_TRUE(outcome.value) << outcome.error;
    EXPECT_EQ(*outcome.value, sample()) << describe(*outcome.value, 20'000);

    const auto bytes = encoding == "xml" ? writeXMLPropertyList(sample()) : writeBinaryPropertyList(sample());
    ASSERT_TRUE(bytes);
    runOracle({"compare", directory.write("ours.plist", *bytes)});
    EXPECT_EQ(parsePropertyList(*bytes).value, sample());
  }
}

}  // namespace
}  // namespace vesk::test
