#include "backends/UploadGate.h"

#include <utility>

namespace vesk {

UploadGate::UploadGate(const Limits& limits) : _limits(limits) {}

bool UploadGate::hasRoomFor(std::size_t bytes, const Share& ofUser) const {
  return _all.uploads < _limits.uploads && bytes <= _limits.bytes - _all.bytes &&
         ofUser.uploads < _limits.uploadsOfUser && bytes <= _limits.bytesOfUser - ofUser.bytes;
}

std::optional<UploadGate::Pass> UploadGate::enter(uid_t user, std::size_t bytes) {
  const auto deadline = std::chrono::steady_clock::now() + _limits.patience;
  MutexLock lock(_mutex);
  while (!_closed) {
    const auto ofUser = _ofUser.find(user);
    if (hasRoomFor(bytes, ofUser == _ofUser.end() ? Share{} : ofUser->second)) {
      Share& share = _ofUser[user];
      for (Share* each : {&share, &_all}) {
        ++each->uploads;
        each->bytes += bytes;
      }
      return std::optional<Pass>(std::in_place, *this, user, bytes);
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

bool UploadGate::isOpen() const {
  MutexLock lock(_mutex);
  return !_closed;
}

void UploadGate::leave(uid_t user, Share share) {
  MutexLock lock(_mutex);
  const auto ofUser = _ofUser.find(user);
  for (Share* each : {&ofUser->second, &_all}) {
    each->uploads -= share.uploads;
    each->bytes -= share.bytes;
  }
  if (ofUser->second.uploads == 0) _ofUser.erase(ofUser);
  _changed.notify_all();
}

void UploadGate::Pass::shrinkTo(std::size_t bytes) {
  if (bytes >= _bytes) return;
  _gate->leave(_user, {0, std::exchange(_bytes, bytes) - bytes});
}

}  // namespace vesk
