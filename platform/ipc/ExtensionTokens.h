// Descriptors that clients sent along with a call, kept under texts that nobody can guess.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <list>
#include <string>
#include <string_view>

#include "platform/files/FileDescriptor.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Who sent a descriptor: a connection and the user at its other end.
struct ExtensionOwner {
  std::uint64_t connection = 0;
  uid_t user = static_cast<uid_t>(-1);
};

/// What a token was worth. Nothing without a descriptor.
struct ExtensionHandle {
  FileDescriptor descriptor;
  uid_t user = static_cast<uid_t>(-1);  ///< who sent it

  explicit operator bool() const noexcept { return static_cast<bool>(descriptor); }
};

/// A token is worth one use of its descriptor: the right to a file travels as the descriptor that the client
/// opened, never as a path. Thread-safe; its lock is a leaf.
class ExtensionTokens {
 public:
  /// Tokens that one connection can have waiting. Each is used while its call is served, so what is older was
  /// left behind by a session that had no use for it.
  static constexpr std::size_t kMaximumPerOwner = 4;

  /// The process's.
  static ExtensionTokens& shared();

  /// Keeps `descriptor` under a fresh token, until it is consumed or dropped. An owner that has too many
  /// loses its oldest.
  std::string add(const ExtensionOwner& owner, FileDescriptor descriptor);

  /// The token's descriptor and its sender; nothing when the token is unknown or was consumed before.
  ExtensionHandle consume(std::string_view token);

  /// Closes what an owner, a connection that ended, has left.
  void drop(std::uint64_t connection) noexcept;

 private:
  struct Entry {
    ExtensionOwner owner;
    std::string token;
    FileDescriptor descriptor;
  };

  Mutex _mutex;
  std::list<Entry> _entries VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
