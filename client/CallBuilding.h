// Builds calls from the callers' arguments.
#pragma once

#include <exception>
#include <string>
#include <utility>

#include "client/ClientCall.h"
#include "platform/result/Result.h"
#include "protocol/WireNames.h"

namespace vesk {

/// A call that every receiver would refuse: too large, nested too deeply, or with text that is not UTF-8.
class InvalidCall : public std::exception {};

/// Throws InvalidCall, or what the allocator throws.
ClientCall encoded(IPCOutgoingCall call, CallEffect effect);

/// A one-way call to the daemon's object. Throws like `encoded`.
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
  FileDescriptor descriptor;
  std::string url;  ///< the file's absolute path
};

/// Doesn't block on a peer, whatever is at that path (a pipe, a terminal), but a network or user-space file
/// system may take time. The error has the system's number: EINVAL if the file isn't a regular one.
Result<FileToUpload> openToUpload(const std::string& path);

}  // namespace vesk
