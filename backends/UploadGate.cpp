#include "backends/UploadGate.h"

#include <utility>

namespace vesk {

UploadGate::UploadGate(const Limits& limits) : _limits(limits) {}

std::optional<UploadGate::Pass> UploadGate::enter(std::size_t bytes) {
  const auto deadline = std::chrono::steady_clock::now() + _limits.patience;
  MutexLock lock(_mutex);
  while (!_closed) {
    if (_uploads < _limits.uploads && bytes <= _limits.bytes - _bytes) {
      ++_uploads;
      _bytes += bytes;
      return std::optional<Pass>(std::in_place, *this, bytes);
    }
    if (_changed.wait_until(_mutex, deadline) == std::cv_status::timeout) break;
  }
  return std::nullopt;
}

HTTPResult UploadGate::perform(HTTPClient& http, HTTPRequest request) {
  HTTPResult result = http.perform(std::move(request));
  if (result.error && result.error->kind == HTTPError::Kind::Stopped) {
    result.error->description = "the daemon stops";  // as whoever reads the log knows it
  }
  return result;
}

void UploadGate::close() {
  MutexLock lock(_mutex);
  _closed = true;
  _changed.notify_all();
}

void UploadGate::leave(std::size_t uploads, std::size_t bytes) {
  MutexLock lock(_mutex);
  _uploads -= uploads;
  _bytes -= bytes;
  _changed.notify_all();
}

void UploadGate::Pass::shrinkTo(std::size_t bytes) {
  if (bytes >= _bytes) return;
  _gate->leave(0, std::exchange(_bytes, bytes) - bytes);
}

}  // namespace vesk
