#include "storebag/StorebagAcceptance.h"

#include <algorithm>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

WallTime wallTimeAt(const Date& date) {
  constexpr double kLatest = 253'402'300'799;  // of the year 9999
  const double seconds = std::clamp(date.secondsSince1970, 0.0, kLatest);
  return WallTime(std::chrono::seconds(static_cast<std::int64_t>(seconds)));
}

Result<void> StorebagAcceptance::accept(std::string_view name, const Dictionary& payload) {
  if (const Value* own = payload.find("name")) {
    const Text* text = own->text();
    if (text == nullptr) return malformed("its name is no text");
    if (text->view() != name) return malformed("it is the storebag '" + text->string() + "'");
  }
  const Value* serialValue = payload.find("serial");
  const auto serial = serialValue ? serialValue->asInteger() : std::nullopt;
  if (serialValue && (!serial || *serial < 0)) return malformed("its serial is no integer from 0");
  std::optional<WallTime> expires;
  if (const Value* value = payload.find("expires")) {
    const Date* date = value->date();
    if (date == nullptr) return malformed("its key 'expires' is no date");
    expires = wallTimeAt(*date);
  }
  if (isPast(expires)) return malformed("it has expired");

  MutexLock lock(_mutex);
  Accepted& accepted = _accepted[std::string(name)];
  if (serial.value_or(0) < accepted.serial) {
    return malformed(serial ? "its serial is " + std::to_string(*serial) + ", after " +
                                  std::to_string(accepted.serial)
                            : "it has no serial, after " + std::to_string(accepted.serial));
  }
  accepted = {serial.value_or(0), expires};
  return {};
}

bool StorebagAcceptance::hasExpired(std::string_view name) {
  MutexLock lock(_mutex);
  const auto accepted = _accepted.find(name);
  if (accepted == _accepted.end() || !isPast(accepted->second.expires)) return false;
  if (!std::exchange(accepted->second.isExpiryLogged, true)) {
    VESK_LOG_ERROR("storebag: '%s' has expired; its clients report nothing until there is a new one",
                   accepted->first.c_str());
  }
  return true;
}

bool StorebagAcceptance::isPast(std::optional<WallTime> time) const {
  return time && *time <= _clock.now() && _isClockSet();
}

}  // namespace vesk
