// Compression in one pass, with zlib's deflate.
#pragma once

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Bytes in a buffer that has room for more; what is not used of it was never touched.
struct CompressedBytes {
  std::unique_ptr<char[]> bytes;
  std::size_t size = 0;
};

/// `data` as one gzip stream (`useGzip`) or zlib stream; nothing, and one level-3 line, on any failure, of
/// which empty data is one. Whole input and whole output are in memory at once. Thread-safe.
std::optional<CompressedBytes> compressToBuffer(bool useGzip, std::string_view data);

/// The same as a text of its own.
std::optional<std::string> compressDataWithZlibOrGzip(bool useGzip, std::string_view data);

/// `data` as gzip stream.
std::optional<std::string> gzipDeflate(std::string_view data);

}  // namespace vesk
