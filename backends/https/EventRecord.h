// Makes event records from messages.
#pragma once

#include <sys/time.h>

#include <cstdint>
#include <optional>

#include <VeskReporting/values/Value.h>
#include "backends/BackendIdentity.h"
#include "backends/https/EventFilters.h"
#include "backends/https/PostPolicy.h"

namespace vesk {

/// One message and what its record says about the session. Borrowed while the record is made.
struct EventSource {
  const std::optional<Dictionary>& payload;
  const timeval& timestamp;
  std::uint16_t method;
  std::uint16_t respCode;
  std::uint16_t eventID;
  const BackendIdentity& identity;
  const std::optional<Text>& combinedSessionID;
  bool hasExtrasOnInternal;
};

/// Returns the payload with the fields that are computed here, which replace entries of the same name, and
/// with room for `more` entries. A field whose source is unknown is left out, even if the payload has one.
MutableDictionary createEventDictfromPayload(const EventSource& source, std::size_t more);

/// Adds the user info, then applies the filters.
void prepareEventForMessage(MutableDictionary& event, const std::optional<Dictionary>& userInfo,
                            const EventFilters& filters);

/// The payload of a session's last message, which also says how the session was sampled.
std::optional<Dictionary> payloadWithStopEntries(const std::optional<Dictionary>& payload,
                                                 const PostPolicy::Settings& settings,
                                                 const std::optional<Value>& samplingThreshold);

}  // namespace vesk
