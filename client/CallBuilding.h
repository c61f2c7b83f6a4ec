// Makes calls out of what callers give.
#pragma once

#include <string>
#include <utility>

#include "client/ClientCall.h"
#include "platform/ipc/CallSize.h"
#include "protocol/WireNames.h"

namespace vesk {

/// A one-way call of the daemon's object. Throws std::bad_alloc.
template <class... Arguments>
ClientCall makeCall(const wire::Member& member, Arguments&&... arguments) {
  ClientCall call;
  call.call.interfaceName = wire::kSessionInterface;
  call.call.member = member.name;
  call.call.arguments.reserve(sizeof...(arguments));
  (call.call.arguments.emplace_back(std::forward<Arguments>(arguments)), ...);
  call.memory = sizeof call - sizeof call.call + approximateMemory(call.call);
  return call;
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
