#include "storebag/StorebagAcceptance.h"

#include <algorithm>
#include <cmath>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

WallTime wallTimeAt(const Date& date) {
  constexpr double kLatest = 253'402'300'799;  // of the year 9999
  if (std::isnan(date.secondsSince1970)) return {};
  const double seconds = std::clamp(date.secondsSince1970, 0.0, kLatest);
  return WallTime(std::chrono::seconds(static_cast<std::int64_t>(seconds)));
}

namespace {

bool isInteger(const Value& value) {
  return value.kind() == Value::Kind::Signed || value.kind() == Value::Kind::Unsigned;
}

}  // namespace

Result<void> StorebagAcceptance::accept(std::string_view name, const Dictionary& payload) {
  if (const Value* own = payload.find("name")) {
    const Text* text = own->text();
    if (text == nullptr) return malformed("its name is no text");
    if (text->view() != name) return malformed("it is the storebag '" + text->string() + "'");
  }
  const Value* serialValue = payload.find("serial");
  const auto serial = serialValue && isInteger(*serialValue) ? serialValue->asInteger() : std::nullopt;
  if (serialValue && (!serial || *serial < 0)) return malformed("its serial is no integer from 0");
  std::optional<WallTime> expires;
  if (const Value* value = payload.find("expires")) {
    const Date* date = value->date();
    if (date == nullptr) return malformed("its key 'expires' is no date");
    expires = wallTimeAt(*date);
  }
  const bool hasExpired = isPast(expires);

  MutexLock lock(_mutex);
  Accepted& accepted = _accepted[std::string(name)];
  if (serial.value_or(0) < accepted.serial) {
    return malformed(serial ? "its serial is " + std::to_string(*serial) + ", after " +
                                  std::to_string(accepted.serial)
                            : "it has no serial, after " + std::to_string(accepted.serial));
  }
  // Also by an expired document, so that an older one without a date can't follow it.
  accepted.serial = serial.value_or(0);
  if (hasExpired) return malformed("it has expired");
  accepted = {accepted.serial, expires};
  return {};
}

void StorebagAcceptance::usesBuiltIn(std::string_view name) {
  MutexLock lock(_mutex);
  const auto accepted = _accepted.find(name);
  if (accepted != _accepted.end()) accepted->second = {accepted->second.serial};
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
