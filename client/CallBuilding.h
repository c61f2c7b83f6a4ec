// Makes calls out of what callers give.
#pragma once

#include <exception>
#include <string>
#include <utility>

#include "client/ClientCall.h"
#include "protocol/WireNames.h"

namespace vesk {

/// A call that no receiver would take: too large, nested too deeply, or with text that is not UTF-8.
class InvalidCall : public std::exception {};

/// Throws InvalidCall or std::bad_alloc.
ClientCall encoded(IPCOutgoingCall call, CallEffect effect);

/// A one-way call of the daemon's object. Throws as `encoded`.
template <class... Arguments>
ClientCall makeCall(CallEffect effect, const wire::Member& member, Arguments&&... arguments) {
  IPCOutgoingCall call{wire::kSessionInterface, member.name, {}};
  call.arguments.reserve(sizeof...(arguments));
  (call.arguments.emplace_back(std::forward<Arguments>(arguments)), ...);
  return encoded(std::move(call), effect);
}

template <class... Arguments>
ClientCall makeCall(const wire::Member& member, Arguments&&... arguments) {
  return makeCall(CallEffect::None, member, std::forward<Arguments>(arguments)...);
}

/// A file opened for the daemon.
struct FileToUpload {
  FileDescriptor descriptor;  ///< none: `error` says why
  std::string url;            ///< of its absolute path
  int error = 0;              ///< errno; EINVAL for what is no regular file
};

/// Waits for no peer, whatever stands under that name (a pipe, a terminal); but a file system over a network
/// or in user space may take its time. Throws std::bad_alloc.
FileToUpload openToUpload(const std::string& path);

}  // namespace vesk
