// One-pass compression with zlib's deflate.
#pragma once

#include <cstddef>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// Bytes in a larger buffer whose unused part was never touched.
struct CompressedBytes {
  struct Free {
    void operator()(char* memory) const noexcept { std::free(memory); }
  };
  std::unique_ptr<char[], Free> bytes;
  std::size_t size = 0;
};

/// Compresses `data` into one gzip (`useGzip`) or zlib stream. Returns nullopt, with a line of level 3, on
/// any failure, including empty data. Input and output are completely in memory. Thread-safe.
std::optional<CompressedBytes> compressToBuffer(bool useGzip, std::string_view data);

/// Like `compressToBuffer`, but returns a string.
std::optional<std::string> compressDataWithZlibOrGzip(bool useGzip, std::string_view data);

/// Compresses `data` into a gzip stream.
std::optional<std::string> gzipDeflate(std::string_view data);

}  // namespace vesk
