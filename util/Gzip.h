// Compression in one pass, with zlib's deflate.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vesk {

/// `data` as one gzip stream (`useGzip`) or zlib stream; nothing, and one level-3 line, on any failure, of
/// which empty data is one. Whole input and whole output are in memory at once. Thread-safe.
std::optional<std::string> compressDataWithZlibOrGzip(bool useGzip, std::string_view data);

/// `data` as gzip stream.
std::optional<std::string> gzipDeflate(std::string_view data);

}  // namespace vesk
