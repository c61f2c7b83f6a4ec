#include "backends/HTTPSPostBackend.h"

#include "platform/log/SystemLog.h"
#include "storebag/StorebagNaming.h"
#include "storebag/StorebagProfile.h"

namespace vesk {

namespace {

constexpr std::uint16_t kSessionTypeStop = 1;
constexpr std::size_t kMostMethods = 65'536;

}  // namespace

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::create(const std::string& name,
                                                           const std::optional<Dictionary>& profile,
                                                           const std::optional<Text>& productFamily,
                                                           const BackendServices& services) {
  if (!profile || !productFamily) return nullptr;
  if (!profileList(name, *profile, "clients")) {
    VESK_LOG_ERROR("HTTPSPostBackend(initWithName): can't find the client list.");
    return nullptr;
  }
  return std::shared_ptr<HTTPSPostBackend>(new HTTPSPostBackend(name, *profile, *productFamily, services));
}

HTTPSPostBackend::HTTPSPostBackend(const std::string& name, const Dictionary& profile,
                                   const Text& productFamily, const BackendServices& services)
    : VeskReportingBackend(name, profile, productFamily, services),
      _dnuEnabled(services.diagnosticsSubmissionConsent()),
      _uuidRespectDnu(services.persistentIdentifierForDNU(true)),
      _uuidOverrideDnu(services.persistentIdentifierForDNU(false)),
      _eventThreshold(kDefaultEventThreshold) {
  MutexLock lock(_mutex);
  _postURL = preferenceStringForKey("httpsPostURL");
  if (_postURL) {
    VESK_LOG_DEBUG("HTTPSPostBackend(initWithName): Using user default '%s' for postURL", _postURL->c_str());
  }
  _useDefaultPostURL = _postURL.has_value();
  _realtimePostURL = preferenceStringForKey("httpsRealtimePostURL");
  if (_realtimePostURL) {
    VESK_LOG_DEBUG("HTTPSPostBackend(initWithName): Using user default '%s' for realtimePostURL",
                   _realtimePostURL->c_str());
  }
  _useDefaultRealtimePostURL = _realtimePostURL.has_value();
  _displayURL = profileText(name, profile, "display_url");
}

HTTPSPostBackend::~HTTPSPostBackend() {
  MutexLock lock(_mutex);
  // Events that never found the backend enabled leave no other trace.
  const std::size_t unsent = endBatch();
  if (unsent > 0) _services.counters.count(_name, DropReason::NeverEnabled, unsent);
}

std::optional<std::string> HTTPSPostBackend::postURL() const {
  MutexLock lock(_mutex);
  return _postURL;
}

void HTTPSPostBackend::setPostURL(const std::optional<std::string>& url) {
  MutexLock lock(_mutex);
  _postURL = url;
}

// --- One message

std::optional<std::string> HTTPSPostBackend::sendMessageLocked(const std::optional<Dictionary>& payload,
                                                               const timeval& timestamp, std::uint16_t method,
                                                               std::uint16_t respCode, std::uint16_t eventID,
                                                               std::int32_t flag) {
  if (state() == BackendStateDisabled) {
    _services.counters.count(_name, DropReason::StateDisabled);
    return std::nullopt;
  }
  MutableDictionary event =
      respCode == kSessionTypeStop
          ? createEventDictfromPayload(payloadWithStopEntries(payload), timestamp, method, respCode, eventID)
          : createEventDictfromPayload(payload, timestamp, method, respCode, eventID);
  prepareEventForMessage(event);

  if (isOverridingSampling(flag)) {
    std::int32_t expected = BackendStateOverride;  // a completion may just switch the backend off
    _state.compare_exchange_strong(expected, BackendStateEnabled);
  }
  std::int32_t currentState = state();
  bool hold =
      !isRealtime(flag) && (currentState == BackendStatePending || currentState == BackendStateOverride ||
                            _batchEvents || (_requireUserInfo && !_userInfoDict));
  if (hold) {
    VESK_LOG_DEBUG("HTTPSPostBackend(sendMessage): Batching %d, %d, %d", currentState, _batchEvents,
                   _requireUserInfo);
    batchEvent(std::move(event));
    return std::nullopt;
  }
  return postNow(std::move(event), method, respCode, flag);
}

std::optional<Dictionary> HTTPSPostBackend::payloadWithStopEntries(
    const std::optional<Dictionary>& payload) const {
  VESK_LOG_DEBUG(
      "HTTPSPostBackend(sendMessage): Adding dnu type and sampling threshold to SESSION_TYPE_STOP message "
      "dictionary");
  if (!payload) {
    VESK_LOG_ERROR("HTTPSPostBackend(sendMessage): SESSION_TYPE_STOP message dictionary is nil");
    return std::nullopt;
  }
  MutableDictionary extended(*payload, 4);
  extended.set(Text::literal("Opt"), _dnuType);
  extended.set(Text::literal("SamplingThreshold"), _samplingThreshold.value_or(Value(-1)));
  extended.set(Text::literal("OverrideSampling"), _overrideSampling.value_or(Value(-1)));
  extended.set(Text::literal("Batch"), _batchEvents ? 1 : 0);
  return extended.share();
}

std::optional<std::string> HTTPSPostBackend::postNow(MutableDictionary event, std::uint16_t method,
                                                     std::uint16_t respCode, std::int32_t flag) {
  if (state() == BackendStateEnabled && !_batchEvents && _batchedEvents) {
    VESK_LOG_DEBUG(
        "HTTPSPostBackend(sendMessage): Backend has changed its state to 'Enabled', batching is not "
        "requested and some events have already been batched. Forcing Flush here to keep events in order.");
    flushMessagesLocked();
  }
  VESK_LOG_DEBUG("HTTPSPostBackend(sendMessage): Sending %d, %d, %d", state(), _batchEvents,
                 _requireUserInfo);
  Events single;
  single.push_back({std::move(event), 0});
  std::optional<std::string> pretty;
  auto body = createMessageForPostAndLogging(single, &pretty);
  if (!body) {
    _services.counters.count(_name, DropReason::BodyNotBuilt);
    return std::nullopt;
  }
  postJSONMessage(std::move(*body), flag, method, respCode, 1);
  return pretty;
}

// --- Batches

void HTTPSPostBackend::batchEvent(MutableDictionary event) {
  const Value* methodValue = event.find("_method");
  std::int64_t method = methodValue ? methodValue->asInteger().value_or(0) : 0;
  std::int32_t count = _eventMethodCounts[method];
  if (count > _eventThreshold) {
    VESK_LOG_DEBUG(
        "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for method "
        "%d",
        static_cast<int>(method));
    flushMessagesLocked();
    count = 0;
  }
  if (!_batchedEvents) _batchedEvents.emplace(_heldBytes);
  _batchedEvents->add(std::move(event));
  _eventMethodCounts[method] = count + 1;
  if (*_heldBytes > kMaximumHeldBytes) boundHeldEvents();
}

// Enabled, a full batch is simply sent. Otherwise nobody may be told yet, and the oldest events have to go:
// an eighth at once, or the session's other backends would be at the bound with each of their events.
void HTTPSPostBackend::boundHeldEvents() {
  if (state() == BackendStateEnabled) flushMessagesLocked();
  if (!_batchedEvents) return;
  noteDropped(_batchedEvents->dropOldest(kMaximumHeldBytes / 8 * 7), kMaximumHeldBytes);
  if (_eventMethodCounts.size() > kMostMethods) _eventMethodCounts.clear();  // user info may name any number
}

void HTTPSPostBackend::noteDropped(std::size_t count, std::size_t bound) {
  if (count == 0) return;
  _services.counters.count(_name, DropReason::OverBound, count);
  if (std::exchange(_droppingBurst, true)) return;
  VESK_LOG_WARNING(
      "HTTPSPostBackend(batchEvent): backend %s holds more than %zu bytes: dropping its oldest events",
      _name.c_str(), bound);
}

/// How many events it had.
std::size_t HTTPSPostBackend::endBatch() {
  const std::size_t count = _batchedEvents ? _batchedEvents->size() : 0;
  _batchedEvents.reset();
  _eventMethodCounts.clear();
  _droppingBurst = false;
  return count;
}

std::optional<std::string> HTTPSPostBackend::flushMessagesLocked() {
  if (!_batchedEvents || state() != BackendStateEnabled || (_requireUserInfo && !_userInfoDict)) {
    return std::nullopt;
  }
  VESK_LOG_DEBUG("HTTPSPostBackend(flushMessages): called");
  addUserInfoToHeldEvents();
  std::optional<std::string> pretty;
  auto body = createMessageForPostAndLogging(_batchedEvents->events(), &pretty);
  const std::size_t eventCount = endBatch();
  if (!body) {
    _services.counters.count(_name, DropReason::BodyNotBuilt, eventCount);
    return std::nullopt;
  }
  postJSONMessage(std::move(*body), 0, std::nullopt, std::nullopt, eventCount);
  return pretty;
}

// Events held before the user info arrived get it now.
void HTTPSPostBackend::addUserInfoToHeldEvents() {
  if (!_userInfoDict) return;
  MutableDictionary filtered(*_userInfoDict);
  _filters.filterEvent(filtered);
  if (filtered.empty()) return;
  noteDropped(_batchedEvents->addUserInfo(filtered.share(), kMaximumFlushBytes), kMaximumFlushBytes);
}

void HTTPSPostBackend::setCorrelatedSessionIDLocked(const std::optional<Text>& sessionID) {
  VeskReportingBackend::setCorrelatedSessionIDLocked(sessionID);
  if (_batchedEvents) _batchedEvents->setSessionID(sessionID);
}

}  // namespace vesk
