// Descriptors that clients sent with a call, kept under unguessable tokens.
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

/// The sender of a descriptor: a connection and the user at its other end.
struct ExtensionOwner {
  std::uint64_t connection = 0;
  uid_t user = static_cast<uid_t>(-1);
};

/// The result of consuming a token; empty without a descriptor.
struct ExtensionHandle {
  FileDescriptor descriptor;
  uid_t user = static_cast<uid_t>(-1);  ///< the sender

  explicit operator bool() const noexcept { return static_cast<bool>(descriptor); }
};

/// A token can be used once: access to a file is granted by the descriptor that the client opened, never by a
/// path. Thread-safe; its lock is a leaf.
class ExtensionTokens {
 public:
  /// Limit on one connection's pending tokens. Each is used while its call is served, so older ones were
  /// abandoned by a session that had no use for them.
  static constexpr std::size_t kMaximumPerOwner = 4;

  /// The instance for the process.
  static ExtensionTokens& shared();

  /// Keeps `descriptor` under a new token until it is consumed or dropped. An owner with too many tokens
  /// loses its oldest.
  std::string add(const ExtensionOwner& owner, FileDescriptor descriptor);

  /// Returns the token's descriptor and its sender; empty if the token is unknown or already consumed.
  ExtensionHandle consume(std::string_view token);

  /// Closes the descriptors left by an owner, a connection that ended.
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
