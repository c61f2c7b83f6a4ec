// The policy of an HTTPS backend: what the storebag's client entries make of it.
#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <boost/algorithm/string/join.hpp>
#include <limits>
#include <utility>

#include "backends/https/HTTPSPostBackend.h"
#include "backends/https/ListMatching.h"
#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"
#include "storebag/StorebagProfile.h"

namespace vesk {

namespace {

constexpr std::size_t kLongestNameInLog = 256;

std::optional<std::string_view> viewOf(const std::optional<Text>& text) {
  if (!text) return std::nullopt;
  return text->view();
}

NameList split(const std::optional<std::string>& text) {
  if (!text) return std::nullopt;
  return componentsSeparatedByComma(*text);
}

std::int32_t clamped(std::int64_t number) {
  using Limits = std::numeric_limits<std::int32_t>;
  return static_cast<std::int32_t>(std::clamp<std::int64_t>(number, Limits::min(), Limits::max()));
}

std::string printed(const NameList& list) {
  return "(" + boost::algorithm::join(list.value_or(std::vector<std::string>()), ", ") + ")";
}

}  // namespace

std::int32_t HTTPSPostBackend::updateBackendState() {
  MutexLock lock(_mutex);
  return updateBackendStateLocked();
}

void HTTPSPostBackend::updateStateLocked() { setState(updateBackendStateLocked()); }

std::optional<std::vector<Dictionary>> HTTPSPostBackend::clientEntries() const {
  auto list = profileList(_name, _profile, "clients");
  if (!list) return std::nullopt;
  std::vector<Dictionary> entries;
  for (const Value& element : *list) {
    if (const Dictionary* entry = element.dictionary()) {
      entries.push_back(*entry);
    } else {
      reportWrongType(_name, "clients", element);
    }
  }
  return entries;
}

bool HTTPSPostBackend::matchClientNameAndServiceID(const Dictionary& entry,
                                                   const std::optional<Text>& clientName,
                                                   const std::optional<Text>& serviceName) const {
  // What restricts, and has the wrong type, must not let everybody pass.
  const NameList clients = split(profileText(_name, entry, "client"));
  if (!clients && entry.contains("client")) return false;
  if (!matchExactStringWithList(clients, viewOf(clientName), true)) return false;
  const NameList services = split(profileText(_name, entry, "service"));
  if (!services && entry.contains("service")) return false;
  return matchStringWithList(services, viewOf(serviceName), true);
}

std::int32_t HTTPSPostBackend::updateBackendStateLocked() {
  auto clients = clientEntries();
  if (!clients) return BackendStateDisabled;

  std::optional<Text> clientName;
  std::optional<Text> serviceName;
  if (_userInfoDict) {
    clientName = _userInfoDict->text(kVeskReportingUserInfoClientName);
    serviceName = _userInfoDict->text(kVeskReportingUserInfoServiceName);
  }
  const Dictionary* matching = nullptr;
  for (const Dictionary& entry : *clients) {
    if (!matchClientNameAndServiceID(entry, clientName, serviceName)) continue;
    matching = &entry;
    break;
  }

  if (matching) updateExpedite(*matching);
  if (!_identity._requireUserInfo) return stateWithoutUserInfo(*clients);
  if (!_userInfoDict) return BackendStatePending;
  return matching ? stateForEntry(*matching, clientName) : BackendStateDisabled;
}

void HTTPSPostBackend::updateExpedite(const Dictionary& entry) {
  auto expedite = profileInteger(_name, entry, "expedite");
  if (!expedite) return;
  _batchEvents = *expedite == 0;
  VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): Store bag override  _batchEvent=%d", _batchEvents);
}

std::int32_t HTTPSPostBackend::stateWithoutUserInfo(const std::vector<Dictionary>& clients) {
  for (const Dictionary& entry : clients) {
    if (!updatePostLink(entry)) continue;
    updateExtrasOnInternal(entry);
    break;
  }
  return BackendStateEnabled;
}

std::int32_t HTTPSPostBackend::stateForEntry(const Dictionary& entry, const std::optional<Text>& clientName) {
  setHierarchy(clamped(profileInteger(_name, entry, "hierarchy").value_or(0)));
  if (!consentAllows(entry) || !placeAndDeviceAllow(entry)) return BackendStateDisabled;

  auto filters = profileList(_name, entry, "filters");
  if (!filters) {
    VESK_LOG_WARNING("HTTPSPostBackend(updateBackendState): filters are required.");
    return BackendStateDisabled;
  }
  _filters.createFiltersFromArray(*filters, _name);

  std::int32_t newState = stateForSampling(entry);
  updateEventThreshold(entry);
  updateExtrasOnInternal(entry);
  VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): %s: client found %s, state? %d, %f", _name.c_str(),
                 clientName ? cutToWholeCharacters(clientName->view(), kLongestNameInLog).c_str() : "(none)",
                 newState, samplingFactor());
  updatePostLink(entry);
  return newState;
}

bool HTTPSPostBackend::consentAllows(const Dictionary& entry) {
  auto override = profileInteger(_name, entry, "override_dnu");
  if (override == 1) {
    _dnuType = _dnuEnabled ? 2 : 1;
    return true;
  }
  _dnuType = 0;
  if (_dnuEnabled) return true;
  VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): reporting disabled by DNU: %d.",
                 static_cast<int>(override.value_or(0)));
  return false;
}

bool HTTPSPostBackend::placeAndDeviceAllow(const Dictionary& entry) {
  auto region = _services.regionCode();
  NameList locales = profileTextList(_name, entry, "locale_whitelist");
  if (!matchStringWithList(locales, region, false)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): (%s) isn't in locale list %s",
                   region.value_or("(none)").c_str(), printed(locales).c_str());
    return false;
  }
  NameList devices = profileTextList(_name, entry, "device_whitelist");
  const Value* whitelist = entry.find("device_whitelist");
  const bool namesNone = !devices || devices->empty();
  if (whitelist && namesNone && !(whitelist->list() && whitelist->list()->empty())) devices = {{""}};
  if (!matchStringWithList(devices, _identity._productFamily->view(), true)) {
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): (%s) isn't in device list %s",
                   _identity._productFamily->string().c_str(), printed(devices).c_str());
    return false;
  }
  return true;
}

std::int32_t HTTPSPostBackend::stateForSampling(const Dictionary& entry) {
  const auto threshold = profileNumber(_name, entry, "sampling_threshold");
  setSamplingThreshold(threshold);
  if (!threshold) return BackendStateDisabled;
  double draw = samplingFactor();
  if (draw <= *threshold->asDouble()) return BackendStateEnabled;
  _overrideSampling = profileNumber(_name, entry, "override_sampling");
  if (!_overrideSampling && entry.contains("override_sampling")) return BackendStateDisabled;
  if (!_overrideSampling || draw <= *_overrideSampling->asDouble()) return BackendStateOverride;
  return BackendStateDisabled;
}

void HTTPSPostBackend::updateEventThreshold(const Dictionary& entry) {
  if (auto threshold = profileInteger(_name, entry, "event_threshold")) {
    _eventThreshold = clamped(*threshold);
    VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): event_threshold set to %d", _eventThreshold);
  } else {
    _eventThreshold = kDefaultEventThreshold;
    VESK_LOG_DEBUG(
        "HTTPSPostBackend(updateBackendState): event_threshold value not found in storebag - defaulting to "
        "%d",
        _eventThreshold);
  }
}

void HTTPSPostBackend::updateExtrasOnInternal(const Dictionary& entry) {
  auto extras = profileInteger(_name, entry, "extras_on_internal");
  if (!extras) return;
  _extrasOnInternal = clamped(*extras);
  VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): extras on internal is set to %d", _extrasOnInternal);
}

bool HTTPSPostBackend::updatePostLink(const Dictionary& entry) {
  bool suppliedPostURL = false;
  if (!(_useDefaultPostURL && _postURL)) {
    _useDefaultPostURL = false;
    if (auto url = profileText(_name, entry, "post_url")) {
      _postURL = std::move(url);
      VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): Storebag '%s' for postURL", _postURL->c_str());
      suppliedPostURL = true;
    }
  }
  if (!(_useDefaultRealtimePostURL && _realtimePostURL)) {
    _useDefaultRealtimePostURL = false;
    _realtimePostURL = profileText(_name, entry, "realtime_post_url");
    if (_realtimePostURL) {
      VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): Storebag '%s' for realtimePostURL",
                     _realtimePostURL->c_str());
    } else {
      _realtimePostURL = _postURL;
      VESK_LOG_DEBUG("HTTPSPostBackend(updateBackendState): realtimePostURL defaults to postURL '%s'",
                     _realtimePostURL.value_or("(none)").c_str());
    }
  }
  return suppliedPostURL;
}

}  // namespace vesk
