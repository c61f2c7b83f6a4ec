#include <gtest/gtest.h>
#include <zlib.h>

#include "tests/support/CapturedLog.h"
#include "util/Gzip.h"

namespace vesk::test {
namespace {

using Lines = std::vector<std::pair<int, std::string>>;

TEST(Gzip, RefusesWhatZlibCannotTake) {
  CapturedLog log;
  EXPECT_FALSE(gzipDeflate(""));
  EXPECT_FALSE(gzipDeflate(std::string_view("x", std::size_t{1} << 32))) << "beyond one call of zlib";
  const std::string begin = "compressDataWithZlibOrGzip: ";
  const std::string full = "\"Ran out of output buffer for writing compressed bytes.\" Message: \"(null)\"";
  EXPECT_EQ(log.lines(), (Lines{{3, begin + "Cannot compress empty ByteBlob"},
                                {3, begin + "zlib error while attempting compression: " + full}}));
}

TEST(Gzip, MakesTheStreamsThatZlibMakes) {
  for (const std::string& data : {std::string("x"), std::string(100'000, 'r'), std::string("again")}) {
    std::string expected(compressBound(data.size()), '\0');
    uLongf size = expected.size();
    const auto* input = reinterpret_cast<const Bytef*>(data.data());
    ASSERT_EQ(compress(reinterpret_cast<Bytef*>(expected.data()), &size, input, data.size()), Z_OK);
    expected.resize(size);
    EXPECT_TRUE(compressDataWithZlibOrGzip(false, data) == expected);
    CapturedLog log;
    const std::string gzip = gzipDeflate(data).value();
    EXPECT_EQ(gzip.substr(0, 4), std::string("\x1f\x8b\x08\0", 4));
    EXPECT_TRUE(gzip.substr(10, gzip.size() - 18) == expected.substr(2, size - 6)) << "but for the wrapper";
    EXPECT_EQ(log.lines(),
              (Lines{{7, "compressDataWithZlibOrGzip: Compressed file from " + std::to_string(data.size()) +
                             " to " + std::to_string(gzip.size())}}));
  }
}

}  // namespace
}  // namespace vesk::test
