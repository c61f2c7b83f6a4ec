#include "backends/upload/UploadGate.h"

#include <utility>

namespace vesk {

UploadGate::UploadGate(const Limits& limits)
    : _patience(limits.patience),
      _lanes{Lane{{limits.uploads, limits.bytes}, {limits.uploadsOfUser, limits.bytesOfUser}},
             Lane{{limits.smallUploads, limits.smallUploads * kSmallLogData},
                  {limits.smallUploadsOfUser, limits.smallUploadsOfUser * kSmallLogData}}} {}

bool UploadGate::hasRoom(const Share& taken, const Share& limit, std::size_t bytes) {
  return taken.uploads < limit.uploads && bytes <= limit.bytes - taken.bytes;
}

std::optional<UploadGate::Pass> UploadGate::enter(uid_t user, std::size_t bytes) {
  return enter(File, user, bytes);
}

std::optional<UploadGate::Pass> UploadGate::enterWithLogData(uid_t user, std::size_t bytes) {
  return enter(bytes < kSmallLogData ? SmallLogData : File, user, bytes);
}

std::optional<UploadGate::Pass> UploadGate::enter(Kind kind, uid_t user, std::size_t bytes) {
  const auto deadline = std::chrono::steady_clock::now() + _patience;
  MutexLock lock(_mutex);
  Lane& lane = _lanes[kind];
  while (!_closed) {
    const auto ofUser = lane.ofUser.find(user);
    if (hasRoom(lane.all, lane.limit, bytes) &&
        hasRoom(ofUser == lane.ofUser.end() ? Share{} : ofUser->second, lane.limitOfUser, bytes)) {
      Share& share = lane.ofUser[user];
      for (Share* each : {&share, &lane.all}) {
        ++each->uploads;
        each->bytes += bytes;
      }
      return std::optional<Pass>(std::in_place, *this, kind, user, bytes);
    }
    if (_changed.wait_until(_mutex, deadline) == std::cv_status::timeout) break;
  }
  return std::nullopt;
}

HTTPResult UploadGate::perform(HTTPClient& http, HTTPRequest request) {
  HTTPResult result = http.perform(std::move(request));
  if (result.error && result.error->kind == HTTPError::Kind::Stopped) {
    result.error->description = "the daemon stops";  // wording of the log line
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

void UploadGate::leave(Kind kind, uid_t user, Share share) {
  MutexLock lock(_mutex);
  Lane& lane = _lanes[kind];
  const auto ofUser = lane.ofUser.find(user);
  for (Share* each : {&ofUser->second, &lane.all}) {
    each->uploads -= share.uploads;
    each->bytes -= share.bytes;
  }
  if (ofUser->second.uploads == 0) lane.ofUser.erase(ofUser);
  _changed.notify_all();
}

void UploadGate::Pass::shrinkTo(std::size_t bytes) {
  if (bytes >= _bytes) return;
  _gate->leave(_kind, _user, {0, std::exchange(_bytes, bytes) - bytes});
}

}  // namespace vesk
