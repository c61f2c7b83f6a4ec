#include "client/SessionMemory.h"

#include <utility>

namespace vesk {

namespace {

constexpr std::size_t kUserInfoOfConfiguration = 1;
constexpr std::size_t kUserInfoOfStates = 0;

}  // namespace

void SessionMemory::sent(IPCOutgoingCall&& call, CallEffect effect) noexcept {
  switch (effect) {
    case CallEffect::None:
      break;
    case CallEffect::Configures:
      _configuration = std::move(call);
      _isConfigured = true;
      break;
    case CallEffect::Starts:
      _start = std::move(call);
      _isStarted = true;
      break;
    case CallEffect::ChangesUserInfo:
      if (_isConfigured) {
        _configuration.arguments[kUserInfoOfConfiguration] = std::move(call.arguments[kUserInfoOfStates]);
      }
      break;
  }
}

std::array<const IPCOutgoingCall*, 2> SessionMemory::replay() const noexcept {
  return {_isConfigured ? &_configuration : nullptr, _isStarted ? &_start : nullptr};
}

}  // namespace vesk
