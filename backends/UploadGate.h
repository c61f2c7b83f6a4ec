// How many files are uploaded at once, and the end of all uploads when the daemon stops.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <map>
#include <optional>
#include <utility>

#include "platform/http/HTTPClient.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// One for all upload backends of a process. Sessions upload on their own threads; the gate keeps them from
/// taking all memory, and all connections to a server that others need as well. Thread-safe; its lock is a
/// leaf, and no other lock may be held by who waits here.
class UploadGate {
 public:
  struct Limits {
    std::size_t uploads = 3;                     ///< of the six connections to a host
    std::size_t bytes = std::size_t{768} << 20;  ///< of files and compressed files in memory
    /// A user whose files or servers hang leaves this much to the others.
    std::size_t uploadsOfUser = 2;
    std::size_t bytesOfUser = std::size_t{512} << 20;
    std::chrono::milliseconds patience = std::chrono::minutes(1);  ///< how long one waits to be let in
  };

  /// The right to have an upload under way. Must not outlive the gate.
  class Pass {
   public:
    Pass(UploadGate& gate, uid_t user, std::size_t bytes) noexcept
        : _gate(&gate), _user(user), _bytes(bytes) {}
    Pass(Pass&& other) noexcept
        : _gate(std::exchange(other._gate, nullptr)), _user(other._user), _bytes(other._bytes) {}
    Pass& operator=(Pass&&) = delete;
    ~Pass() {
      if (_gate) _gate->leave(_user, {1, _bytes});
    }
    /// It needs no more than that from now on.
    void shrinkTo(std::size_t bytes);

   private:
    UploadGate* _gate;
    uid_t _user;
    std::size_t _bytes;
  };

  UploadGate() : UploadGate(Limits{}) {}
  explicit UploadGate(const Limits& limits);
  UploadGate(const UploadGate&) = delete;
  UploadGate& operator=(const UploadGate&) = delete;

  /// Whose an upload is that no user in particular asked for.
  static constexpr uid_t kNobody = static_cast<uid_t>(-1);

  /// Waits until there is room for an upload that needs so many bytes, of that user's; nothing when there was
  /// none in time, or the gate is closed. Throws std::bad_alloc.
  [[nodiscard]] std::optional<Pass> enter(uid_t user, std::size_t bytes);

  /// Sends the request and waits for its end, which comes at once when the client no longer serves uploads.
  static HTTPResult perform(HTTPClient& http, HTTPRequest request);

  /// Nobody is let in or waits for that any more: the daemon stops.
  void close();
  bool isOpen() const;

 private:
  struct Share {
    std::size_t uploads = 0;
    std::size_t bytes = 0;
  };
  void leave(uid_t user, Share share);
  bool hasRoomFor(std::size_t bytes, const Share& ofUser) const VESK_REQUIRES(_mutex);

  const Limits _limits;
  mutable Mutex _mutex;
  std::condition_variable_any _changed;
  Share _all VESK_GUARDED_BY(_mutex);
  std::map<uid_t, Share> _ofUser VESK_GUARDED_BY(_mutex);  ///< those who have some
  bool _closed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
