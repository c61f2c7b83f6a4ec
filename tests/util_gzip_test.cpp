#include <dlfcn.h>
#include <gtest/gtest.h>
#include <zlib.h>

#include <optional>

#include "tests/support/CapturedLog.h"
#include "util/Gzip.h"

namespace {

std::optional<int> beginsWith;  // zlib's result, returned without doing anything
std::optional<int> deflatesWith;

}  // namespace

int deflateInit2_(z_streamp stream, int level, int method, int windowBits, int memory, int strategy,
                  const char* version, int size) {
  if (beginsWith) return *beginsWith;
  static const auto begin = reinterpret_cast<decltype(&deflateInit2_)>(::dlsym(RTLD_NEXT, "deflateInit2_"));
  return begin(stream, level, method, windowBits, memory, strategy, version, size);
}

int deflate(z_streamp stream, int flush) {
  if (deflatesWith) return *deflatesWith;
  static const auto next = reinterpret_cast<decltype(&deflate)>(::dlsym(RTLD_NEXT, "deflate"));
  return next(stream, flush);
}

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

TEST(Gzip, SaysHowZlibFailed) {
  const std::string versions = "The version of zlib.h and the version of the library linked do not match.";
  const std::map<int, std::string> beginnings{{Z_STREAM_ERROR, "Invalid parameter passed in to function."},
                                              {Z_MEM_ERROR, "Insufficient memory."},
                                              {Z_VERSION_ERROR, versions},
                                              {Z_ERRNO, "Unknown error code."}};
  const std::map<int, std::string> failures{
      {Z_ERRNO, "Error occured while reading file."},
      {Z_STREAM_ERROR, "The stream state was inconsistent (e.g., next_in or next_out was NULL)."},
      {Z_DATA_ERROR, "The deflate data was invalid or incomplete."},
      {Z_MEM_ERROR, "Memory could not be allocated for processing."},
      {Z_BUF_ERROR, "Ran out of output buffer for writing compressed bytes."},
      {Z_VERSION_ERROR, versions},
      {Z_NEED_DICT, "Unknown error code."}};
  const auto expectFailure = [](std::optional<int>& answer, int with, const std::string& line) {
    CapturedLog log;
    answer = with;
    EXPECT_FALSE(gzipDeflate("x"));
    answer.reset();
    EXPECT_EQ(log.lines(), (Lines{{3, "compressDataWithZlibOrGzip: " + line + "\" Message: \"(null)\""}}));
  };
  for (const auto& [answer, text] : beginnings)
    expectFailure(beginsWith, answer, "deflateInit2() Error: \"" + text);
  for (const auto& [answer, text] : failures)
    expectFailure(deflatesWith, answer, "zlib error while attempting compression: \"" + text);
}

TEST(Gzip, MakesAStreamOfEitherFormat) {
  for (bool isGzip : {true, false}) {
    const std::string data(100'000, 'r');
    const std::string packed = compressDataWithZlibOrGzip(isGzip, data).value();
    std::string unpacked(data.size(), '\0');
    z_stream stream{};
    ASSERT_EQ(inflateInit2(&stream, isGzip ? 15 + 16 : 15), Z_OK);
    stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(packed.data()));
    stream.avail_in = static_cast<uInt>(packed.size());
    stream.next_out = reinterpret_cast<Bytef*>(unpacked.data());
    stream.avail_out = static_cast<uInt>(unpacked.size());
    EXPECT_EQ(inflate(&stream, Z_FINISH), Z_STREAM_END);
    inflateEnd(&stream);
    EXPECT_TRUE(unpacked == data);
  }
}

}  // namespace
}  // namespace vesk::test
