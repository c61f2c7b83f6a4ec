#include "util/Gzip.h"

#include <zlib.h>

#include <algorithm>
#include <limits>
#include <memory>
#include <vector>

#include "platform/log/SystemLog.h"
#include "platform/sync/Mutex.h"

namespace vesk {

namespace {

constexpr int kZlibWindowBits = 15;
constexpr int kGzipWrapper = 16;
constexpr int kMemoryLevel = 8;

const char* textForInitialisation(int result) {
  switch (result) {
    case Z_STREAM_ERROR:
      return "Invalid parameter passed in to function.";
    case Z_MEM_ERROR:
      return "Insufficient memory.";
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    default:
      return "Unknown error code.";
  }
}

const char* textForDeflate(int result) {
  switch (result) {
    case Z_ERRNO:
      return "Error occured while reading file.";
    case Z_STREAM_ERROR:
      return "The stream state was inconsistent (e.g., next_in or next_out was NULL).";
    case Z_DATA_ERROR:
      return "The deflate data was invalid or incomplete.";
    case Z_MEM_ERROR:
      return "Memory could not be allocated for processing.";
    case Z_BUF_ERROR:
      return "Ran out of output buffer for writing compressed bytes.";
    case Z_VERSION_ERROR:
      return "The version of zlib.h and the version of the library linked do not match.";
    default:
      return "Unknown error code.";
  }
}

const char* messageOf(const z_stream& stream) { return stream.msg ? stream.msg : "(null)"; }

/// A deflate stream for one input at a time.
class Deflater {
 public:
  explicit Deflater(bool useGzip) {
    _initialisation =
        deflateInit2(&_stream, Z_DEFAULT_COMPRESSION, Z_DEFLATED,
                     kZlibWindowBits + (useGzip ? kGzipWrapper : 0), kMemoryLevel, Z_DEFAULT_STRATEGY);
  }
  ~Deflater() {
    if (_initialisation == Z_OK) deflateEnd(&_stream);
  }
  Deflater(const Deflater&) = delete;
  Deflater& operator=(const Deflater&) = delete;

  int initialisation() const { return _initialisation; }
  z_stream& stream() { return _stream; }
  /// Prepares the stream for a new input. Returns false if that fails.
  bool reset() { return deflateReset(&_stream) == Z_OK; }

 private:
  z_stream _stream{};
  int _initialisation = Z_STREAM_ERROR;
};

/// Keeps a few streams for reuse: creating one allocates 256 KiB, which costs several times as much as
/// deflating a typical body. Additional concurrent callers get temporary streams, so that a thousand idle
/// threads hold none.
class DeflaterPool {
 public:
  explicit DeflaterPool(bool useGzip) : _useGzip(useGzip) {}

  std::unique_ptr<Deflater> take() {
    {
      MutexLock lock(_mutex);
      if (!_idle.empty()) {
        auto deflater = std::move(_idle.back());
        _idle.pop_back();
        return deflater;
      }
    }
    return std::make_unique<Deflater>(_useGzip);
  }

  void giveBack(std::unique_ptr<Deflater> deflater) {
    if (!deflater->reset()) return;
    MutexLock lock(_mutex);
    if (_idle.size() < kMostIdle) _idle.push_back(std::move(deflater));
  }

 private:
  static constexpr std::size_t kMostIdle = 2;
  const bool _useGzip;
  Mutex _mutex;
  std::vector<std::unique_ptr<Deflater>> _idle VESK_GUARDED_BY(_mutex);
};

DeflaterPool& poolFor(bool useGzip) {
  static DeflaterPool zlib(false);
  static DeflaterPool gzip(true);
  return useGzip ? gzip : zlib;
}

uInt limitedSize(std::size_t size) {
  return static_cast<uInt>(std::min<std::size_t>(size, std::numeric_limits<uInt>::max()));
}

/// Returns Z_STREAM_END with the stream in `out`, or an error code.
int deflateWhole(z_stream& stream, std::string_view data, CompressedBytes& out) {
  if (data.size() > std::numeric_limits<uInt>::max()) return Z_BUF_ERROR;
  // zlib does not write through this pointer; its interface lacks the const.
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(data.data()));
  stream.avail_in = static_cast<uInt>(data.size());
  const std::size_t bound = deflateBound(&stream, static_cast<uLong>(data.size()));
  // Like zlib's own memory, and unlike `new`, this may be refused without ending the daemon. Not zeroed, so
  // that pages which the stream does not reach use no memory.
  out.bytes.reset(static_cast<char*>(std::malloc(bound)));
  if (!out.bytes) return Z_MEM_ERROR;
  int result = Z_OK;
  while (result == Z_OK) {
    stream.next_out = reinterpret_cast<Bytef*>(out.bytes.get()) + stream.total_out;
    stream.avail_out = limitedSize(bound - stream.total_out);
    result = deflate(&stream, Z_FINISH);
  }
  out.size = stream.total_out;
  return result;
}

}  // namespace

std::optional<CompressedBytes> compressToBuffer(bool useGzip, std::string_view data) {
  if (data.empty()) {
    VESK_LOG_ERROR("compressDataWithZlibOrGzip: Cannot compress empty ByteBlob");
    return std::nullopt;
  }
  auto deflater = poolFor(useGzip).take();
  if (deflater->initialisation() != Z_OK) {
    VESK_LOG_ERROR("compressDataWithZlibOrGzip: deflateInit2() Error: \"%s\" Message: \"%s\"",
                   textForInitialisation(deflater->initialisation()), messageOf(deflater->stream()));
    return std::nullopt;
  }
  CompressedBytes out;
  const int result = deflateWhole(deflater->stream(), data, out);
  if (result != Z_STREAM_END) {
    VESK_LOG_ERROR(
        "compressDataWithZlibOrGzip: zlib error while attempting compression: \"%s\" Message: \"%s\"",
        textForDeflate(result), messageOf(deflater->stream()));
    return std::nullopt;
  }
  poolFor(useGzip).giveBack(std::move(deflater));
  VESK_LOG_DEBUG("compressDataWithZlibOrGzip: Compressed file from %u to %u",
                 static_cast<unsigned>(data.size()), static_cast<unsigned>(out.size));
  return out;
}

std::optional<std::string> compressDataWithZlibOrGzip(bool useGzip, std::string_view data) {
  const auto compressed = compressToBuffer(useGzip, data);
  if (!compressed) return std::nullopt;
  return std::string(compressed->bytes.get(), compressed->size);
}

std::optional<std::string> gzipDeflate(std::string_view data) {
  return compressDataWithZlibOrGzip(true, data);
}

}  // namespace vesk
