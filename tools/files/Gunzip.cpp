#include "tools/files/Gunzip.h"

#include <zlib.h>

#include <array>
#include <memory>

namespace vesk {

Result<std::string> gunzipped(std::string_view compressed, std::size_t limit) {
  constexpr int kGzipOnly = 16 + MAX_WBITS;
  z_stream stream{};
  if (::inflateInit2(&stream, kGzipOnly) != Z_OK) return malformed("the gzip decoder can't be started");
  const std::unique_ptr<z_stream, decltype(&::inflateEnd)> ending(&stream, &::inflateEnd);
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));  // zlib only reads it
  stream.avail_in = static_cast<uInt>(compressed.size());
  std::string out;
  std::array<char, 65536> piece;
  for (int result = Z_OK; result != Z_STREAM_END;) {
    stream.next_out = reinterpret_cast<Bytef*>(piece.data());
    stream.avail_out = piece.size();
    result = ::inflate(&stream, Z_NO_FLUSH);
    out.append(piece.data(), piece.size() - stream.avail_out);
    if (out.size() > limit)
      return malformed("the body unpacks to more than " + std::to_string(limit) + " bytes");
    if (result != Z_OK && result != Z_STREAM_END) return malformed("the body is no whole gzip stream");
  }
  if (stream.avail_in != 0) return malformed("bytes follow the gzip stream of the body");
  return out;
}

}  // namespace vesk
