// How many files are uploaded at once, and the end of all uploads when the daemon stops.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
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
    std::chrono::milliseconds patience = std::chrono::minutes(1);  ///< how long one waits to be let in
  };

  /// The right to have an upload under way. Must not outlive the gate.
  class Pass {
   public:
    Pass(UploadGate& gate, std::size_t bytes) noexcept : _gate(&gate), _bytes(bytes) {}
    Pass(Pass&& other) noexcept : _gate(std::exchange(other._gate, nullptr)), _bytes(other._bytes) {}
    Pass& operator=(Pass&&) = delete;
    ~Pass() {
      if (_gate) _gate->leave(1, _bytes);
    }
    /// It needs no more than that from now on.
    void shrinkTo(std::size_t bytes);

   private:
    UploadGate* _gate;
    std::size_t _bytes;
  };

  UploadGate() : UploadGate(Limits{}) {}
  explicit UploadGate(const Limits& limits);
  UploadGate(const UploadGate&) = delete;
  UploadGate& operator=(const UploadGate&) = delete;

  /// Waits until there is room for an upload that needs so many bytes; nothing when there was none in time,
  /// or the gate is closed.
  [[nodiscard]] std::optional<Pass> enter(std::size_t bytes);

  /// Sends the request and waits for its end, which comes at once when the client no longer serves uploads.
  static HTTPResult perform(HTTPClient& http, HTTPRequest request);

  /// Nobody is let in or waits for that any more: the daemon stops.
  void close();

 private:
  void leave(std::size_t uploads, std::size_t bytes);

  const Limits _limits;
  Mutex _mutex;
  std::condition_variable_any _changed;
  std::size_t _uploads VESK_GUARDED_BY(_mutex) = 0;
  std::size_t _bytes VESK_GUARDED_BY(_mutex) = 0;
  bool _closed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
