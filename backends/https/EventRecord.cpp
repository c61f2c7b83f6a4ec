#include "backends/https/EventRecord.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "backends/https/SenderCodes.h"
#include "platform/device/DeviceInformation.h"
#include "platform/log/SystemLog.h"
#include "storebag/Settings.h"
#include "util/ReportingdUtil.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::size_t kFixedFields = 17;
constexpr std::int32_t kClientTypeWithNumericSessionID = 7;

// Records show the same start for all sessions that start within a minute. The clock may be wrong by decades.
std::int32_t startOfMinute(double seconds) {
  constexpr double kLatest = std::numeric_limits<std::int32_t>::max();
  return static_cast<std::int32_t>(std::clamp(seconds, -kLatest, kLatest)) / 60 * 60;
}

// Sets a field. If its source is unknown, the field is left out, even if the payload has one.
template <class T>
void setIfKnown(MutableDictionary& event, const Text& key, const std::optional<T>& value) {
  if (value) {
    event.set(key, *value);
  } else {
    event.remove(key.view());
  }
}

}  // namespace

MutableDictionary createEventDictfromPayload(const EventSource& source, std::size_t more) {
  const BackendIdentity& identity = source.identity;
  MutableDictionary event(source.payload.value_or(Dictionary()), kFixedFields + more);
  const std::int32_t startTS = startOfMinute(identity._startTimeStamp);
  const double clientTS =
      finiteOrMinusOne(startTS + (secondsFromTimeval(source.timestamp) - identity._startTimeStamp));

  event.set(Text::literal("_startTS"), startTS);
  setIfKnown(event, Text::literal("_sender"), senderCodeForClientType(identity._compType));
  event.set(Text::literal("_clientVersion"), static_cast<unsigned>(identity._clientVersion));
  setIfKnown(event, Text::literal("_sessionID"), source.combinedSessionID);
  if (source.hasExtrasOnInternal && identity._isInternal &&
      identity._compType == kClientTypeWithNumericSessionID) {
    event.set(Text::literal("_sessionID"), identity._sessionID);
  }
  event.set(Text::literal("_eventNumber"), static_cast<unsigned>(source.eventID));
  event.set(Text::literal("_method"), static_cast<unsigned>(source.method));
  event.set(Text::literal("_status"), static_cast<unsigned>(source.respCode));
  event.set(Text::literal("_clientTS"), clientTS);
  event.set(Text::literal("eventTime"), clientTS);
  setIfKnown(event, Text::literal("_productFamily"), identity._productFamily);
  setIfKnown(event, Text::literal("_productModel"), identity._hardwareType);
  setIfKnown(event, Text::literal("_osVersion"), identity._productVersion);
  setIfKnown(event, Text::literal("_build"), identity._buildVersion);
  event.set(Text::literal("_internal"), currentEnvironmentType() == kSeedEnvironment ? 2
                                        : isInternalBuild()                          ? 1
                                                                                     : 0);
  event.set(Text::literal("_reportVers"),
            std::to_string(identity._selfVersionMajor) + "." + std::to_string(identity._selfVersionMinor));
  event.set(Text::literal("_timezoneOffset"), timezoneOffsetSeconds(wallTimeFrom(source.timestamp)));
  return event;
}

void prepareEventForMessage(MutableDictionary& event, const std::optional<Dictionary>& userInfo,
                            const EventFilters& filters) {
  if (userInfo) event.setAll(*userInfo);
  filters.filterEvent(event);
}

std::optional<Dictionary> payloadWithStopEntries(const std::optional<Dictionary>& payload,
                                                 const PostPolicy::Settings& settings,
                                                 const std::optional<Value>& samplingThreshold) {
  VESK_LOG_DEBUG(
      "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
      "dictionary");
  if (!payload) {
    VESK_LOG_ERROR("HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
    return std::nullopt;
  }
  MutableDictionary extended(*payload, 4);
  extended.set(Text::literal("Opt"), settings._dnuType);
  extended.set(Text::literal("SamplingThreshold"), samplingThreshold.value_or(Value(-1)));
  extended.set(Text::literal("OverrideSampling"), settings._overrideSampling.value_or(Value(-1)));
  extended.set(Text::literal("Batch"), settings._batchEvents ? 1 : 0);
  return extended.share();
}

}  // namespace vesk
