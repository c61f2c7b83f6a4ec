// Limits concurrent uploads, and ends all uploads when the daemon stops.
#pragma once

#include <sys/types.h>

#include <array>
#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <map>
#include <optional>
#include <utility>

#include "platform/http/HTTPClient.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Shared by all upload backends of a process. Sessions upload on their own threads; the gate keeps them from
/// using all memory, or all connections to a server that others need too. Thread-safe. Its lock is a leaf,
/// and a caller that waits here must hold no other lock.
class UploadGate {
  enum Kind : std::size_t { File, SmallLogData };

 public:
  struct Limits {
    std::size_t uploads = 3;                     ///< of the eight connections to a host
    std::size_t bytes = std::size_t{768} << 20;  ///< of files and compressed files in memory
    /// Limits of one user, so that slow files or servers leave room for other users.
    std::size_t uploadsOfUser = 2;
    std::size_t bytesOfUser = std::size_t{512} << 20;
    /// Small log data has separate slots, so that neither kind waits for the other's slow servers.
    std::size_t smallUploads = 3;
    std::size_t smallUploadsOfUser = 2;
    std::chrono::milliseconds patience = std::chrono::minutes(1);  ///< how long a caller waits to be admitted
  };

  /// Permission to perform an upload. Must not outlive the gate.
  class Pass {
   public:
    Pass(UploadGate& gate, Kind kind, uid_t user, std::size_t bytes) noexcept
        : _gate(&gate), _kind(kind), _user(user), _bytes(bytes) {}
    Pass(Pass&& other) noexcept
        : _gate(std::exchange(other._gate, nullptr)),
          _kind(other._kind),
          _user(other._user),
          _bytes(other._bytes) {}
    Pass& operator=(Pass&&) = delete;
    ~Pass() {
      if (_gate) _gate->leave(_kind, _user, {1, _bytes});
    }
    /// Returns the part of its memory share above `bytes`.
    void shrinkTo(std::size_t bytes);

   private:
    UploadGate* _gate;
    Kind _kind;
    uid_t _user;
    std::size_t _bytes;
  };

  UploadGate() : UploadGate(Limits{}) {}
  explicit UploadGate(const Limits& limits);
  UploadGate(const UploadGate&) = delete;
  UploadGate& operator=(const UploadGate&) = delete;

  /// The user of uploads without a particular user.
  static constexpr uid_t kNobody = static_cast<uid_t>(-1);

  /// Waits for room for a user's upload that needs `bytes` of memory. Returns nullopt if there was none in
  /// time or the gate is closed.
  [[nodiscard]] std::optional<Pass> enter(uid_t user, std::size_t bytes);

  /// Log data below this size in bytes counts as small.
  static constexpr std::size_t kSmallLogData = std::size_t{1} << 20;
  /// Like `enter`, for log data: in the separate slots if it is small, otherwise like a file.
  [[nodiscard]] std::optional<Pass> enterWithLogData(uid_t user, std::size_t bytes);

  /// Sends the request and waits for its result, which is immediate if the client no longer serves uploads.
  static HTTPResult perform(HTTPClient& http, HTTPRequest request);

  /// Admits no more uploads and ends all waits, because the daemon stops.
  void close();
  bool isOpen() const;

 private:
  struct Share {
    std::size_t uploads = 0;
    std::size_t bytes = 0;
  };
  /// Uploads that share their slots.
  struct Lane {
    Share limit, limitOfUser;
    Share all{};
    std::map<uid_t, Share> ofUser{};  ///< users with uploads in progress
  };
  std::optional<Pass> enter(Kind kind, uid_t user, std::size_t bytes);
  void leave(Kind kind, uid_t user, Share share);
  static bool hasRoom(const Share& taken, const Share& limit, std::size_t bytes);

  const std::chrono::milliseconds _patience;
  mutable Mutex _mutex;
  std::condition_variable_any _changed;
  std::array<Lane, 2> _lanes VESK_GUARDED_BY(_mutex);  ///< by Kind
  bool _closed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
