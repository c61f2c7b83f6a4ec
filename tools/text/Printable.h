// Text for people: times, and untrusted text made safe to show.
#pragma once

#include <ctime>
#include <string>
#include <string_view>

#include "platform/time/CivilTime.h"

namespace vesk {

/// Returns `text` with control characters and invalid UTF-8 as \xNN, so that a peer can neither forge a line
/// nor control a terminal.
std::string printable(std::string_view text);

/// Returns `bytes` for use in JSON: if they are not valid UTF-8, "?" replaces each byte above 127.
std::string printableUTF8(std::string_view bytes);

/// "2026-11-24T20:31:29Z", without a fraction.
inline std::string isoTime(WallTime time) {
  std::string text = civilTime(time);
  text[text.find(' ')] = 'T';
  return text + "Z";
}

/// ".042", for 0 to 999.
inline std::string fractionText(int milliseconds) {
  return "." + std::to_string(1000 + milliseconds).substr(1);
}

/// "20:31:29.123", local time.
inline std::string clockText(WallTime time) {
  const timeval value = timevalFrom(time);
  std::tm local{};
  ::localtime_r(&value.tv_sec, &local);
  char text[32];
  const std::size_t length = std::strftime(text, sizeof text, "%H:%M:%S", &local);
  return std::string(text, length) + fractionText(static_cast<int>(value.tv_usec / 1000));
}

inline double secondsFrom(WallTime time) {
  return std::chrono::duration<double>(time.time_since_epoch()).count();
}

}  // namespace vesk
