// The collector's output for the person who runs it.
#pragma once

#include <string_view>

#include "platform/sync/Mutex.h"

namespace vesk {

/// Writes whole lines to standard output and standard error. Thread-safe. If standard output is closed, logs
/// one line to standard error and continues without it.
class Console {
 public:
  enum class Style : unsigned char {
    Readable,  ///< everything as readable text
    JSON       ///< events as JSON lines on standard output; notes on standard error
  };
  explicit Console(Style style) : _style(style) {}

  Style style() const { return _style; }

  /// Shows received data. `lines` are separated by line feeds and contain no other control characters.
  void event(std::string_view lines);
  /// Shows any other occurrence. Control characters appear as \xNN.
  void note(std::string_view line);
  /// Shows a refusal or failure, on standard error.
  void problem(std::string_view line);

 private:
  void writeOutput(std::string_view line) VESK_REQUIRES(_mutex);

  const Style _style;
  Mutex _mutex;
  bool _outputClosed VESK_GUARDED_BY(_mutex) = false;
};

}  // namespace vesk
