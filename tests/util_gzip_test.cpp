#include <gtest/gtest.h>
#include <zlib.h>

#include "tests/support/CapturedLog.h"
#include "util/Gzip.h"

namespace vesk::test {
namespace {

std::string inflated(const std::string& data, int windowBits, std::size_t size) {
  z_stream stream{};
  EXPECT_EQ(inflateInit2(&stream, windowBits), Z_OK);
  std::string out(size + 1, '\0');
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(data.data()));
  stream.avail_in = static_cast<uInt>(data.size());
  stream.next_out = reinterpret_cast<Bytef*>(out.data());
  stream.avail_out = static_cast<uInt>(out.size());
  EXPECT_EQ(inflate(&stream, Z_FINISH), Z_STREAM_END);
  EXPECT_EQ(stream.avail_in, 0u);
  out.resize(stream.total_out);
  inflateEnd(&stream);
  return out;
}

std::string noise(std::size_t size) {
  std::string out;
  unsigned state = 1;
  while (out.size() < size) out += static_cast<char>((state = state * 1664525 + 1013904223) >> 24);
  return out;
}

TEST(Gzip, MakesStreamsThatAnyReaderReadsAndTellsBothSizes) {
  for (const std::string& data : {std::string("x"), std::string(100'000, 'r'), noise(200'000)}) {
    for (int round = 0; round < 2; ++round) {  // the second one works with a stream that was used before
      CapturedLog log;
      const auto gzip = gzipDeflate(data);
      ASSERT_TRUE(gzip);
      EXPECT_EQ(gzip->substr(0, 2), "\x1f\x8b");
      EXPECT_EQ(log.count(7, "compressDataWithZlibOrGzip: Compressed file from " +
                                 std::to_string(data.size()) + " to " + std::to_string(gzip->size())),
                1);
      EXPECT_EQ(inflated(*gzip, 31, data.size()), data);
      const auto zlib = compressDataWithZlibOrGzip(false, data);
      ASSERT_TRUE(zlib);
      EXPECT_EQ(inflated(*zlib, 15, data.size()), data);
    }
  }
}

TEST(Gzip, RefusesNothingToCompress) {
  CapturedLog log;
  EXPECT_EQ(gzipDeflate(""), std::nullopt);
  EXPECT_EQ(log.lines(), (std::vector<std::pair<int, std::string>>{
                             {3, "compressDataWithZlibOrGzip: Cannot compress empty ByteBlob"}}));
}

}  // namespace
}  // namespace vesk::test
