// Event records: what becomes of one message.
#include <algorithm>
#include <cmath>
#include <limits>

#include "backends/https/HTTPSPostBackend.h"
#include "backends/https/SenderCodes.h"
#include "platform/device/DeviceInformation.h"
#include "storebag/Settings.h"
#include "util/ReportingdUtil.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::size_t kFixedFields = 17;
constexpr std::int32_t kClientTypeWithNumericSessionID = 7;

// Of all sessions that start within a minute the records show the same start. A clock may be wrong by
// decades.
std::int32_t startOfMinute(double seconds) {
  constexpr double kLatest = std::numeric_limits<std::int32_t>::max();
  return static_cast<std::int32_t>(std::clamp(seconds, -kLatest, kLatest)) / 60 * 60;
}

// Sets a field whose source may be unknown; then it stays out of the record, also when the payload has one.
template <class T>
void setIfKnown(MutableDictionary& event, Text key, const std::optional<T>& value) {
  if (value) {
    event.set(std::move(key), *value);
  } else {
    event.remove(key.view());
  }
}

}  // namespace

MutableDictionary HTTPSPostBackend::createEventDictfromPayload(const std::optional<Dictionary>& payload,
                                                               const timeval& timestamp, std::uint16_t method,
                                                               std::uint16_t respCode,
                                                               std::uint16_t eventID) const {
  std::size_t userInfoSize = _userInfoDict ? _userInfoDict->size() : 0;
  MutableDictionary event(payload.value_or(Dictionary()), kFixedFields + userInfoSize);
  std::int32_t startTS = startOfMinute(_identity._startTimeStamp);
  double clientTS = finiteOrMinusOne(startTS + (secondsFromTimeval(timestamp) - _identity._startTimeStamp));

  event.set(Text::literal("_startTS"), startTS);
  setIfKnown(event, Text::literal("_sender"), senderCodeForClientType(_identity._compType));
  event.set(Text::literal("_clientVersion"), static_cast<unsigned>(_identity._clientVersion));
  setIfKnown(event, Text::literal("_sessionID"), _combinedSessionIDString);
  if (_settings._extrasOnInternal != 0 && _identity._isInternal &&
      _identity._compType == kClientTypeWithNumericSessionID) {
    event.set(Text::literal("_sessionID"), _identity._sessionID);
  }
  event.set(Text::literal("_eventNumber"), static_cast<unsigned>(eventID));
  event.set(Text::literal("_method"), static_cast<unsigned>(method));
  event.set(Text::literal("_status"), static_cast<unsigned>(respCode));
  event.set(Text::literal("_clientTS"), clientTS);
  event.set(Text::literal("eventTime"), clientTS);
  setIfKnown(event, Text::literal("_productFamily"), _identity._productFamily);
  setIfKnown(event, Text::literal("_productModel"), _identity._hardwareType);
  setIfKnown(event, Text::literal("_osVersion"), _identity._productVersion);
  setIfKnown(event, Text::literal("_build"), _identity._buildVersion);
  event.set(Text::literal("_internal"), currentEnvironmentType() == kSeedEnvironment ? 2
                                        : isInternalBuild()                          ? 1
                                                                                     : 0);
  event.set(Text::literal("_reportVers"),
            std::to_string(_identity._selfVersionMajor) + "." + std::to_string(_identity._selfVersionMinor));
  event.set(Text::literal("_timezoneOffset"), timezoneOffsetSeconds(wallTimeFrom(timestamp)));
  return event;
}

void HTTPSPostBackend::prepareEventForMessage(MutableDictionary& event) const {
  if (_userInfoDict) event.setAll(*_userInfoDict);
  _filters.filterEvent(event);
}

}  // namespace vesk
