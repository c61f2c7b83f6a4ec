#include "platform/time/CivilTime.h"

#include <cstdio>

namespace vesk {

std::string civilTime(WallTime time) {
  auto seconds = std::chrono::floor<std::chrono::seconds>(time);
  auto day = std::chrono::floor<std::chrono::days>(seconds);
  std::chrono::year_month_day date(day);
  std::chrono::hh_mm_ss clock(seconds - day);
  char text[48];
  int size = std::snprintf(text, sizeof text, "%04d-%02u-%02u %02d:%02d:%02d", static_cast<int>(date.year()),
                           static_cast<unsigned>(date.month()), static_cast<unsigned>(date.day()),
                           static_cast<int>(clock.hours().count()), static_cast<int>(clock.minutes().count()),
                           static_cast<int>(clock.seconds().count()));
  return {text, static_cast<std::size_t>(size)};
}

}  // namespace vesk
