#include "backends/https/HTTPSPostBackend.h"

#include "backends/https/EventRecord.h"
#include "backends/https/PolicyLog.h"
#include "backends/https/PostExplanation.h"
#include "platform/http/HTTPExchange.h"
#include "platform/log/SystemLog.h"
#include "storebag/Settings.h"
#include "storebag/StorebagProfile.h"

namespace vesk {

namespace {

constexpr std::uint16_t kSessionTypeStop = 1;

// The device's facts are the same for all sessions, so one line per process is enough.
void noteMissingFamily(const std::string& name) {
  static std::atomic<bool> noted{false};
  if (noted.exchange(true)) return;
  VESK_LOG_WARNING(
      "HTTPSPostBackend(initWithName): the device has no product family (DeviceName), so there is no backend "
      "%s",
      name.c_str());
}

}  // namespace

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::create(const std::string& name,
                                                           const std::optional<Dictionary>& profile,
                                                           const BackendIdentity& identity,
                                                           const BackendServices& services) {
  if (!identity._productFamily) noteMissingFamily(name);
  if (!profile || !identity._productFamily) return nullptr;
  if (!profileList(name, *profile, "clients")) {
    VESK_LOG_ERROR("HTTPSPostBackend(initWithName): can't find the client list.");
    return nullptr;
  }
  return std::shared_ptr<HTTPSPostBackend>(new HTTPSPostBackend(name, *profile, identity, services));
}

HTTPSPostBackend::HTTPSPostBackend(const std::string& name, const Dictionary& profile,
                                   const BackendIdentity& identity, const BackendServices& services)
    : VeskReportingBackend(name, profile, identity, services),
      _dnuEnabled(services.diagnosticsSubmissionConsent()),
      _uuidRespectDnu(services.persistentIdentifierForDNU(true)),
      _uuidOverrideDnu(services.persistentIdentifierForDNU(false)) {
  MutexLock lock(_mutex);
  _settings = initialPostSettings(identity._batchEvents);
  if (_settings._postURL) {
    VESK_LOG_DEBUG("HTTPSPostBackend(initWithName): Using user default '%s' for postURL",
                   _settings._postURL->c_str());
  }
  if (_settings._realtimePostURL) {
    VESK_LOG_DEBUG("HTTPSPostBackend(initWithName): Using user default '%s' for realtimePostURL",
                   _settings._realtimePostURL->c_str());
  }
  _displayURL = profileText(name, profile, "display_url");
}

HTTPSPostBackend::~HTTPSPostBackend() {
  MutexLock lock(_mutex);
  // Events that were held by a backend that was never enabled leave no other trace.
  if (holdsEvents()) _outcomes->count("message", DropReason::NeverEnabled, _batchedEvents->size());
}

std::optional<std::string> HTTPSPostBackend::postURL() const {
  MutexLock lock(_mutex);
  return _settings._postURL;
}

void HTTPSPostBackend::setPostURL(const std::optional<std::string>& url) {
  MutexLock lock(_mutex);
  _settings._postURL = url;
}

std::optional<std::string> HTTPSPostBackend::stateReason() const {
  MutexLock lock(_mutex);
  return _stateReason;
}

std::int32_t HTTPSPostBackend::updateBackendState() {
  const double draw = samplingFactor();
  auto decision = PostPolicy::decide({.profile = _profile,
                                      .userInfo = _userInfoDict,
                                      .requireUserInfo = _identity._requireUserInfo,
                                      .productFamily = _identity._productFamily->string(),
                                      .regionCode = _services.regionCode(),
                                      .dnuEnabled = _dnuEnabled,
                                      .samplingFactor = draw},
                                     _settings);
  for (const PostPolicy::Step& step : decision.steps) {
    logPolicyStep(step, _name, draw);
    // Compiled here so that complaints about filters appear at the right place in the log.
    if (step.rule == "filters" && decision.filters) _filters.createFiltersFromArray(*decision.filters, _name);
  }
  if (decision.filters) setSamplingThreshold(decision.samplingThreshold);
  const auto* reason = decision.reason();
  _stateReason =
      reason && decision.state != BackendStateEnabled ? std::optional(reasonOf(*reason)) : std::nullopt;
  if (_stateReason && reason->rule == "clients") _services.unlistedClients->note(_name, *_stateReason);
  _settings = std::move(decision.settings);
  setHierarchy(_settings._hierarchy);
  return decision.state;
}

// --- One message

std::optional<std::string> HTTPSPostBackend::sendMessageInTurn(const std::optional<Dictionary>& payload,
                                                               const timeval& timestamp, std::uint16_t method,
                                                               std::uint16_t respCode, std::uint16_t eventID,
                                                               std::int32_t flag) {
  if (state() == BackendStateDisabled) {
    _outcomes->count("message", DropReason::StateDisabled, 1, [&] {
      return Dictionary{{"category", method},
                        {"type", respCode},
                        {"eventID", eventID},
                        {"because", stateReason().value_or("reporting is off")}};
    });
    return std::nullopt;
  }
  // The event gets its place before the lock is released, so that changes by relatives while a body is built
  // reach it among the held events.
  PostToBuild earlier;
  PostToBuild own;
  bool batchEvents = false;
  {
    MutexLock lock(_mutex);
    MutableDictionary event = eventFor(payload, timestamp, method, respCode, eventID);
    if (isOverridingSampling(flag)) {
      std::int32_t expected = BackendStateOverride;  // a completion may be switching the backend off
      _state.compare_exchange_strong(expected, BackendStateEnabled);
    }
    batchEvents = _settings._batchEvents;
    if (mustHold(flag)) {
      earlier = batchEvent(std::move(event));
      _lastHeldEventID = eventID;
    } else {
      earlier = takeBatchBeforeSingleEvent();
      own = makePost(std::make_unique<EventBatch>(_identity._heldBytes, std::move(event)), flag, method,
                     respCode);
      if (_outcomes->isWatched()) own->messages = {{"eventID", eventID}};
    }
  }
  if (_outcomes->watchesMessages()) {
    _outcomes->show("message", own ? "posted" : "held",
                    {{"category", method}, {"type", respCode}, {"eventID", eventID}});
  }
  if (earlier) buildAndPost(std::move(earlier));
  if (!own) {
    boundHeldEvents();
    return std::nullopt;
  }
  VESK_LOG_DEBUG("HTTPSPostBackend(sendMessage): Sending %d, %d, %d", state(), batchEvents,
                 _identity._requireUserInfo);
  return buildAndPost(std::move(own));
}

bool HTTPSPostBackend::mustHold(std::int32_t flag) const {
  const std::int32_t currentState = state();
  const bool hold =
      !isRealtime(flag) && (currentState == BackendStatePending || currentState == BackendStateOverride ||
                            _settings._batchEvents || (_identity._requireUserInfo && !_userInfoDict));
  if (hold) {
    VESK_LOG_DEBUG("HTTPSPostBackend(sendMessage): Batching %d, %d, %d", currentState, _settings._batchEvents,
                   _identity._requireUserInfo);
  }
  return hold;
}

MutableDictionary HTTPSPostBackend::eventFor(const std::optional<Dictionary>& payload,
                                             const timeval& timestamp, std::uint16_t method,
                                             std::uint16_t respCode, std::uint16_t eventID) const {
  const auto whole = respCode == kSessionTypeStop
                         ? payloadWithStopEntries(payload, _settings, samplingThreshold())
                         : payload;
  auto event = createEventDictfromPayload({.payload = whole,
                                           .timestamp = timestamp,
                                           .method = method,
                                           .respCode = respCode,
                                           .eventID = eventID,
                                           .identity = _identity,
                                           .combinedSessionID = _combinedSessionIDString,
                                           .hasExtrasOnInternal = _settings._extrasOnInternal != 0},
                                          _userInfoDict ? _userInfoDict->size() : 0);
  prepareEventForMessage(event, _userInfoDict, _filters);
  return event;
}

// --- Batches

HTTPSPostBackend::PostToBuild HTTPSPostBackend::batchEvent(MutableDictionary event) {
  const Value* methodValue = event.find("_method");
  std::int64_t method = methodValue ? methodValue->asInteger().value_or(0) : 0;
  if (!_batchedEvents) _batchedEvents = std::make_unique<EventBatch>(_identity._heldBytes);
  PostToBuild full;
  if (_batchedEvents->passesThreshold(method, _settings._eventThreshold)) {
    VESK_LOG_DEBUG(
        "HTTPSPostBackend(batchEvent): Flushing all batched events as we reached event threshold for method "
        "%d",
        static_cast<int>(method));
    full = takeBatch();
    if (full) _batchedEvents = std::make_unique<EventBatch>(_identity._heldBytes);
  }
  _batchedEvents->add(std::move(event), method);
  return full;
}

bool HTTPSPostBackend::holdsEvents() const { return _batchedEvents && _batchedEvents->size() > 0; }

// An enabled backend sends a full batch. Otherwise sending isn't allowed yet; the oldest events are dropped.
void HTTPSPostBackend::boundHeldEvents() {
  if (!_identity._heldBytes->exceeded()) return;
  PostToBuild full;
  {
    MutexLock lock(_mutex);
    if (state() == BackendStateEnabled) full = takeBatch();
    if (_batchedEvents) countDropped(_batchedEvents->dropOldest(_name));
  }
  if (full) buildAndPost(std::move(full));
}

void HTTPSPostBackend::countDropped(std::size_t events) const {
  if (events > 0) _outcomes->count("message", DropReason::OverBound, events);
}

std::optional<std::string> HTTPSPostBackend::flushMessagesInTurn() {
  PostToBuild held;
  {
    MutexLock lock(_mutex);
    held = takeBatch();
  }
  if (!held) return std::nullopt;
  return buildAndPost(std::move(held));
}

// --- Taking events out to be posted

HTTPSPostBackend::PostToBuild HTTPSPostBackend::takeBatch() {
  if (!holdsEvents() || state() != BackendStateEnabled || (_identity._requireUserInfo && !_userInfoDict)) {
    return nullptr;
  }
  VESK_LOG_DEBUG("HTTPSPostBackend(flushMessages): called");
  PostToBuild post = makePost(std::move(_batchedEvents), 0, std::nullopt, std::nullopt);
  if (_outcomes->isWatched()) post->messages = {{"upToEventID", _lastHeldEventID}};
  if (_userInfoDict) {
    MutableDictionary filtered(*_userInfoDict);
    _filters.filterEvent(filtered);
    if (!filtered.empty()) post->lateUserInfo = filtered.share();
  }
  return post;
}

HTTPSPostBackend::PostToBuild HTTPSPostBackend::takeBatchBeforeSingleEvent() {
  if (state() != BackendStateEnabled || _settings._batchEvents || !holdsEvents()) return nullptr;
  VESK_LOG_DEBUG(
      "HTTPSPostBackend(sendMessage): Backend has changed its state to 'Enabled', batching is not "
      "requested and some events have already been batched. Forcing Flush here to keep events in order.");
  return takeBatch();
}

HTTPSPostBackend::PostToBuild HTTPSPostBackend::makePost(std::unique_ptr<EventBatch> events,
                                                         std::int32_t flag,
                                                         std::optional<std::uint16_t> method,
                                                         std::optional<std::uint16_t> responseCode) const {
  auto post = std::make_unique<Post>();
  post->events = std::move(events);
  post->url = isRealtime(flag) ? _settings._realtimePostURL : _settings._postURL;
  const bool tellsDevice =
      _settings._extrasOnInternal != 0 && _identity._isInternal && !_identity._udid.empty();
  post->clientID = tellsDevice               ? _identity._udid
                   : _settings._dnuType == 0 ? _uuidRespectDnu
                                             : _uuidOverrideDnu;
  post->headers = postHeaders(_identity, _userInfoDict, method, responseCode);
  post->isPrintable = _settings._dnuType == 0 && _dnuEnabled;
  // A session that requires no user info reports without asking for consent.
  post->respectsConsent = _settings._dnuType == 0 && _identity._requireUserInfo;
  return post;
}

// --- Posting

std::optional<std::string> HTTPSPostBackend::buildAndPost(PostToBuild post) {
  EventBatch& events = *post->events;
  std::size_t eventCount = events.size();
  if (post->respectsConsent && *_services.consentWithdrawn) {
    _outcomes->count("post", DropReason::ConsentWithdrawn, eventCount, [&post] { return post->messages; });
    return std::nullopt;
  }
  try {
    // Events held before the user info arrived get it now.
    if (post->lateUserInfo) {
      countDropped(events.addUserInfo(*post->lateUserInfo, _name));
      eventCount = events.size();
    }
    auto body =
        createMessageForPostAndLogging(events, post->clientID, _services.clock.now(), post->isPrintable);
    post->events.reset();
    if (body) {
      postJSONMessage(std::move(*post), std::move(body->json), eventCount);
      return std::move(body->prettyJsonString);
    }
  } catch (...) {
    // Out of memory; the events are already lost.
    _outcomes->count("post", DropReason::BodyNotBuilt, eventCount);
    throw;
  }
  _outcomes->count("post", DropReason::BodyNotBuilt, eventCount);
  return std::nullopt;
}

void HTTPSPostBackend::postJSONMessage(Post post, std::string json, std::size_t eventCount) {
  if (!post.url) {
    _outcomes->count("post", DropReason::NoURL, eventCount, [&post] { return post.messages; });
    return;
  }
  std::unique_ptr<Shown> shown;
  if (_outcomes->isWatched()) {
    MutableDictionary facts(post.messages, 3);
    facts.set("url", *post.url);
    facts.set("events", eventCount);
    facts.set("bytes", json.size());
    shown = std::make_unique<Shown>(Shown{facts.share(), _outcomes->watchesBodies() ? json : std::string()});
  }
  std::string host(hostOfURL(*post.url));
  auto request =
      postRequest(std::move(*post.url), std::move(post.headers), std::move(json), _identity._client);
  request.source = _name;
  request.events = static_cast<std::uint32_t>(eventCount);
  request.respectsConsent = post.respectsConsent;
  // The completion keeps the backend alive. At a session's end it may hold the last reference.
  auto self = std::static_pointer_cast<HTTPSPostBackend>(shared_from_this());
  _services.http.start(std::move(request),
                       [self, eventCount, host = std::move(host),
                        shown = std::shared_ptr<Shown>(std::move(shown))](const HTTPResult& result) {
                         if (result.response && result.response->status / 100 == 2)
                           self->_services.acceptedPosts->note(host);
                         self->postCompleted(result, eventCount, shown.get());
                       });
}

void HTTPSPostBackend::showPost(const char* outcome, const HTTPResult& result, const Shown* shown) const {
  if (shown == nullptr || !_outcomes->isWatched()) return;
  MutableDictionary facts(shown->facts, 1);
  if (result.response) facts.set("httpStatus", result.response->status);
  _outcomes->show("post", outcome, facts.share(), shown->body);
}

void HTTPSPostBackend::countPost(DropReason reason, std::size_t events, const HTTPResult& result,
                                 const Shown* shown) const {
  const auto facts = [&] {
    MutableDictionary all(shown ? shown->facts : Dictionary(), 2);
    if (result.response) all.set("httpStatus", result.response->status);
    if (result.error) all.set("because", result.error->description);
    return all.share();
  };
  _outcomes->count("post", reason, events, facts, shown ? shown->body : std::string());
}

void HTTPSPostBackend::postCompleted(const HTTPResult& result, std::size_t eventCount, const Shown* shown) {
  if (result.error) {
    VESK_LOG_ERROR("HTTPSPostBackend(postJsonMessage): post error: %s", result.error->description.c_str());
  }
  const long status = result.response ? result.response->status : 0;
  if (status < 500 || status > 599) {
    if (status >= 200 && status <= 299) return showPost("delivered", result, shown);
    const auto reason = status != 0              ? DropReason::ServerRefused
                        : result.error->deferred ? DropReason::Deferred
                                                 : DropReason::TransportError;
    countPost(reason, eventCount, result, shown);
    if (status != 0) _services.refusedPosts->note(_name, status, eventCount);
    return;
  }
  VESK_LOG_INFO("postJSONMessage: backend %s disabled by server %ld return code", _name.c_str(), status);
  setState(BackendStateDisabled);
  {
    MutexLock lock(_mutex);
    _stateReason = "the server answered with status " + std::to_string(status);
  }
  countPost(DropReason::ServerError5xx, eventCount, result, shown);
}

void HTTPSPostBackend::setCorrelatedSessionIDLocked(const std::optional<Text>& sessionID) {
  VeskReportingBackend::setCorrelatedSessionIDLocked(sessionID);
  if (_batchedEvents) _batchedEvents->setSessionID(sessionID);
}

}  // namespace vesk
