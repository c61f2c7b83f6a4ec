// The device's log of power and energy events.
#pragma once

#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <VeskReporting/values/Value.h>
#include "platform/powerlog/PowerLogFile.h"
#include "platform/sync/Mutex.h"
#include "platform/time/Clock.h"

namespace vesk {

/// Records events in a file, on a thread of its own, so that callers wait neither for the disk nor for other
/// processes. Thread-safe; its lock is a leaf.
class PowerLog {
 public:
  struct Options {
    std::string path;
    std::int64_t maximumRows = 100'000;
    std::size_t maximumWaiting = std::size_t{4} << 20;  ///< bytes of events waiting for the disk
    std::size_t maximumEvent = std::size_t{64} << 10;   ///< bytes of one event
    const WallClock* clock = &WallClock::system();
    /// Called with the number of lost events, on any thread; must not block or throw.
    std::function<void(std::uint64_t events)> onLost;
  };

  explicit PowerLog(Options options);
  /// Writes pending events, as far as the disk and other processes allow.
  ~PowerLog();
  PowerLog(const PowerLog&) = delete;
  PowerLog& operator=(const PowerLog&) = delete;

  /// Records an event under its registered identifier. Bytes become base64 text; numbers that are not finite
  /// become -1. `context` is ignored. Events that can't be kept are lost and reported to `onLost`.
  void KLLogRegisteredEvent(std::uint32_t identifier, std::string_view name, const Dictionary& dictionary,
                            const std::optional<Value>& context);

  /// Waits until everything recorded earlier is in the file or lost.
  void flush();

 private:
  bool keep(PowerLogEvent event);
  void lost(std::uint64_t events) const;
  void run();
  void write(const std::vector<PowerLogEvent>& events);

  const Options _options;

  Mutex _mutex;
  std::condition_variable_any _changed;
  std::vector<PowerLogEvent> _waiting VESK_GUARDED_BY(_mutex);
  std::size_t _waitingBytes VESK_GUARDED_BY(_mutex) = 0;
  bool _isWriting VESK_GUARDED_BY(_mutex) = false;
  bool _stopping VESK_GUARDED_BY(_mutex) = false;
  std::thread _thread VESK_GUARDED_BY(_mutex);  ///< started by the first event

  // Used only by the thread.
  PowerLogFile _file;
  bool _isFailing = false;  ///< a failure was logged and isn't over yet
};

}  // namespace vesk
