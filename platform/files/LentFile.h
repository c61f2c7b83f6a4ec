// A file that a client has opened and lent: its bytes come through the descriptor, never by its path.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <cstdint>
#include <functional>
#include <string>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// The file is the client's, who may do anything to it meanwhile. Everything here is therefore said of the
/// file as it was when this object was made. Used by one thread.
class LentFile {
 public:
  /// Takes the descriptor, which may be none.
  explicit LentFile(FileDescriptor descriptor) noexcept;

  /// Whether it is a regular file, still has a name, and `path` names a regular file. A path that this
  /// process can't see, because of rights or of mounts of its own, is believed.
  bool isRegularAt(const std::string& path) const;

  /// Bytes.
  std::uint64_t size() const noexcept { return static_cast<std::uint64_t>(_status.st_size); }

  enum class Reading : unsigned char {
    Whole,
    Unreadable,  ///< the client itself could not read it, or the device fails
    Shrank,      ///< it has fewer bytes than it had
    GivenUp      ///< `goOn` said so
  };
  /// Reads the first `size()` bytes, however many follow by now; `bytes` is of no use unless they are Whole.
  /// Leaves the client's position in the file alone. `goOn` is asked before each piece: the file's device may
  /// be as slow as its client likes. Throws std::bad_alloc.
  [[nodiscard]] Reading read(std::string& bytes, const std::function<bool()>& goOn) const;

  /// Removes the file from `path` when that still names this very file, unchanged, and when `user` owns it or
  /// is this process's own user. False when it was left, for whatever reason. Whoever could make `path` name
  /// another file between the look and the removal can remove files there himself.
  bool removeFrom(const std::string& path, uid_t user) const;

 private:
  bool wasOpenedAt(const std::string& path) const;
  bool isUnchanged(const struct stat& now) const noexcept;

  FileDescriptor _descriptor;
  struct stat _status {};  // all zero without a file
};

}  // namespace vesk
