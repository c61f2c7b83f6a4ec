#include "backends/UploadGate.h"

#include <utility>

namespace vesk {

struct UploadGate::State {
  Mutex mutex;
  std::condition_variable_any changed;
  std::size_t uploads VESK_GUARDED_BY(mutex) = 0;
  std::size_t bytes VESK_GUARDED_BY(mutex) = 0;
  bool closed VESK_GUARDED_BY(mutex) = false;
};

UploadGate::UploadGate(const Limits& limits) : _limits(limits), _state(std::make_shared<State>()) {}

std::optional<UploadGate::Pass> UploadGate::enter(std::size_t bytes) {
  const auto deadline = std::chrono::steady_clock::now() + _limits.patience;
  MutexLock lock(_state->mutex);
  while (!_state->closed) {
    if (_state->uploads < _limits.uploads && bytes <= _limits.bytes - _state->bytes) {
      ++_state->uploads;
      _state->bytes += bytes;
      return std::optional<Pass>(std::in_place, *this, bytes);
    }
    if (_state->changed.wait_until(_state->mutex, deadline) == std::cv_status::timeout) break;
  }
  return std::nullopt;
}

HTTPResult UploadGate::perform(HTTPClient& http, HTTPRequest request) {
  auto result = std::make_shared<std::optional<HTTPResult>>();  // guarded by the state's mutex
  http.start(std::move(request), [result, state = _state](const HTTPResult& arrived) {
    MutexLock lock(state->mutex);
    *result = arrived;
    state->changed.notify_all();
  });
  MutexLock lock(_state->mutex);
  while (!*result && !_state->closed) _state->changed.wait(_state->mutex);
  if (*result) return std::move(**result);
  return {std::nullopt, HTTPError{HTTPError::Kind::Stopped, "the daemon stops"}};
}

void UploadGate::close() {
  MutexLock lock(_state->mutex);
  _state->closed = true;
  _state->changed.notify_all();
}

void UploadGate::leave(std::size_t uploads, std::size_t bytes) {
  MutexLock lock(_state->mutex);
  _state->uploads -= uploads;
  _state->bytes -= bytes;
  _state->changed.notify_all();
}

void UploadGate::Pass::shrinkTo(std::size_t bytes) {
  if (bytes >= _bytes) return;
  _gate->leave(0, std::exchange(_bytes, bytes) - bytes);
}

}  // namespace vesk
