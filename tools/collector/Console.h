// What the collector says to the person who runs it.
#pragma once

#include <string_view>

#include "platform/sync/Mutex.h"

namespace vesk {

/// Whole lines to standard output and standard error, from any thread. A standard output that was closed
/// costs one line on standard error, and the collector goes on without.
class Console {
 public:
  enum class Style : unsigned char {
    Readable,  ///< everything for a person
    JSON       ///< standard output holds the events only, one JSON line each; notes go to standard error
  };
  explicit Console(Style style) : _style(style) {}

  Style style() const { return _style; }

  /// What arrived; `lines` are separated by line feeds and hold no other control characters.
  void event(std::string_view lines);
  /// What else happened. Control characters are shown as \xNN.
  void note(std::string_view line);
  /// What was refused or failed, on standard error.
  void problem(std::string_view line);

 private:
  void writeOutput(std::string_view line) VESK_REQUIRES(_mutex);

  const Style _style;
  Mutex _mutex;
  bool _outputClosed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
