// A file that a client opened and passed as a descriptor. Its bytes are read through the descriptor only.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>

#include "platform/files/FileDescriptor.h"
#include "platform/result/Result.h"

namespace vesk {

/// The client may change its file at any time, so everything here refers to the file's state when this object
/// was created. Not thread-safe.
class LentFile {
 public:
  /// Takes ownership of the descriptor, which may be empty.
  explicit LentFile(FileDescriptor descriptor) noexcept;

  /// Whether the descriptor is a regular file that still has a name, and `path` names a regular file. A path
  /// that this process can't see, because of permissions or its own mounts, is trusted.
  bool isRegularAt(const std::string& path) const;

  /// Size in bytes.
  std::uint64_t size() const noexcept { return static_cast<std::uint64_t>(_status.st_size); }

  /// Returns the first `size()` bytes, even if the file has grown. Keeps the client's file position. Calls
  /// `goOn` before each piece, since the file's device may be arbitrarily slow. The error's kind is TimedOut
  /// if `goOn` returned false, Malformed if the file is shorter than before, and Failed if the client itself
  /// could not read it or the device failed.
  Result<std::string> read(const std::function<bool()>& goOn) const;

  /// Removes the file from `path` if that still names this unchanged file and its owner is `user` or this
  /// process's user. Returns false if the file was not removed. The check and the removal are not atomic, but
  /// anyone who could exchange the file in between has the right to remove it.
  bool removeFrom(const std::string& path, uid_t user) const;

 private:
  bool wasOpenedAt(const std::string& path) const;
  bool isUnchanged(const struct stat& now) const noexcept;

  FileDescriptor _descriptor;
  struct stat _status {};  // all zero without a file
};

}  // namespace vesk
