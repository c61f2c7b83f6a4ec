// The device's log of power and energy events.
#pragma once

#include <chrono>
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
#include "platform/powerlog/PowerLogEvent.h"
#include "platform/sync/Mutex.h"
#include "platform/time/Clock.h"

namespace vesk {

class PowerLogStore;

/// Records events in a file, on a thread of its own: whoever records one waits neither for the disk nor for
/// another process. Thread-safe; its lock is a leaf.
class PowerLog {
 public:
  struct Options {
    std::string path;
    std::chrono::seconds maximumAge = std::chrono::days(7);
    std::int64_t maximumRows = 100'000;
    std::size_t maximumWaiting = std::size_t{4} << 20;             ///< bytes of events that wait for the disk
    std::size_t maximumEvent = std::size_t{64} << 10;              ///< bytes of one event
    std::chrono::milliseconds patience = std::chrono::seconds(5);  ///< with another process that writes
    const WallClock* clock = &WallClock::system();
    /// How long the machine has been up, asleep or not.
    std::function<std::chrono::seconds()> uptime = &systemUptime;
    /// Told how many events were lost, on any thread; must not block or throw.
    std::function<void(std::uint64_t events)> onLost;
  };

  explicit PowerLog(Options options);
  /// Writes what waits, as far as the disk and other processes allow.
  ~PowerLog();
  PowerLog(const PowerLog&) = delete;
  PowerLog& operator=(const PowerLog&) = delete;

  /// Records an event under its registered identifier. What JSON has no form for becomes text (bytes, as
  /// base64) or -1 (numbers that are not finite). `context` is not used. An event that can't be kept is lost
  /// and told to `onLost`.
  void KLLogRegisteredEvent(std::uint32_t identifier, std::string_view name, const Dictionary& dictionary,
                            const std::optional<Value>& context) noexcept;

  /// Waits until everything recorded before is in the file or lost.
  void flush();

 private:
  void keep(PowerLogEvent event);
  void lost(std::uint64_t events) const noexcept;
  void run() noexcept;
  void write(PowerLogStore& store, const std::vector<PowerLogEvent>& events) noexcept;

  const Options _options;

  Mutex _mutex;
  std::condition_variable_any _changed;
  std::vector<PowerLogEvent> _waiting VESK_GUARDED_BY(_mutex);
  std::size_t _waitingBytes VESK_GUARDED_BY(_mutex) = 0;
  bool _isWriting VESK_GUARDED_BY(_mutex) = false;
  bool _stopping VESK_GUARDED_BY(_mutex) = false;
  std::thread _thread VESK_GUARDED_BY(_mutex);  ///< started by the first event

  bool _failing = false;  ///< the thread's: a failure was logged and not over yet
};

}  // namespace vesk
