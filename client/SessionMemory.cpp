#include "client/SessionMemory.h"

namespace vesk {

namespace {

constexpr std::size_t kUserInfoOfConfiguration = 1;
constexpr std::size_t kUserInfoOfStates = 0;

}  // namespace

void SessionMemory::note(const ClientCall& call) {
  switch (call.effect) {
    case CallEffect::None:
      break;
    case CallEffect::Configures:
      _configuration = call.call;
      _aggregation = call.aggregation;
      _isConfigured = true;
      break;
    case CallEffect::Starts:
      _start = call.call;
      _isStarted = true;
      break;
    case CallEffect::ChangesUserInfo:
      if (_isConfigured) {
        _configuration.arguments[kUserInfoOfConfiguration] = call.call.arguments[kUserInfoOfStates];
      }
      break;
  }
}

std::vector<IPCOutgoingCall> SessionMemory::replay() const {
  std::vector<IPCOutgoingCall> calls;
  if (_isConfigured) calls.push_back(_configuration);
  if (_isStarted) calls.push_back(_start);
  return calls;
}

}  // namespace vesk
