#include "session/BackendSet.h"
#include "backends/BackendFactory.h"

#include <VeskReporting/VeskReportingKeys.h>

#include "platform/log/SystemLog.h"
#include "platform/preferences/PreferencesSuite.h"
#include "storebag/StorebagProfile.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

BackendIdentity identityFrom(const Dictionary& sessionInfo, std::string_view deviceID,
                             const std::string& libraryVersion, const BackendClient& client,
                             const BackendServices& services) {
  const auto number = [&](std::string_view key) { return integerForKey(sessionInfo, key).value_or(0); };
  const auto flag = [&](std::string_view key) { return booleanForKey(sessionInfo, key).value_or(false); };
  BackendIdentity identity{
      ._sessionID = static_cast<std::uint32_t>(number(kVeskReportingSessionInfoSessionID)),
      ._compType = static_cast<std::int32_t>(number(kVeskReportingSessionInfoClientType)),
      ._clientVersion = static_cast<std::uint16_t>(number(kVeskReportingSessionInfoClientVersion)),
      ._udid = std::string(deviceID),
      ._productVersion = deviceProductVersion(),
      ._buildVersion = deviceBuildVersion(),
      ._hardwareType = deviceProductType(),
      ._productFamily = deviceName(),
      ._isInternal = isInternalBuild(),
      ._requireUserInfo = flag(kVeskReportingSessionInfoRequireUserInfo),
      ._batchEvents = flag(kVeskReportingSessionInfoBatchEvent),
      ._startTimeStamp = secondsFromTimeval(timevalFrom(services.clock.now())),
      ._client = client,
      ._heldBytes = services.heldBudget->accountFor(client.user)};
  identity.setSelfVersion(libraryVersion);
  return identity;
}

// Like any value of the wrong type, a profile that is not a dictionary counts as absent.
std::optional<Dictionary> profileFrom(const DictionaryEntry& entry) {
  if (const Dictionary* profile = entry.value.dictionary()) return *profile;
  reportWrongType(entry.key.view(), "profile", entry.value);
  return std::nullopt;
}

}  // namespace

std::optional<BackendSet> createBackends(const std::optional<Dictionary>& storebag,
                                         const std::optional<Dictionary>& sessionInfo,
                                         const std::optional<Dictionary>& userInfo, std::string_view deviceID,
                                         const std::string& libraryVersion, const BackendClient& client,
                                         const BackendServices& services) {
  if (!storebag) {
    VESK_LOG_ERROR("createBackends: Attempted to create backends with nil storebag");
    return std::nullopt;
  }
  if (!sessionInfo) {
    VESK_LOG_ERROR("createBackends: Attempted to create backends with nil session info");
    return std::nullopt;
  }
  const BackendIdentity identity = identityFrom(*sessionInfo, deviceID, libraryVersion, client, services);
  BackendSet backends;
  for (const DictionaryEntry& entry : *storebag) {
    std::string name = entry.key.string();
    auto backend = newBackendWithName(name, profileFrom(entry), identity, services);
    if (!backend) continue;
    backend->setUserInfoDict(userInfo);
    backends.emplace_back(std::move(name), std::move(backend));
  }
  return backends;
}

std::shared_ptr<VeskReportingBackend> findBackend(const BackendSet& backends, std::string_view name) {
  for (const auto& [backendName, backend] : backends) {
    if (backendName == name) return backend;
  }
  return nullptr;
}

namespace {

// From the time service's settings. The default, if unset, is automatic.
bool automaticTimeZoneEnabled() {
  auto value = PreferencesSuite("com.corvane.timed").valueForKey("TMAutomaticTimeZoneEnabled");
  return value ? value->asBoolean().value_or(true) : true;
}

Value orUnknown(const std::optional<Text>& fact) {
  return fact ? Value(*fact) : Value(Text::literal("Unknown"));
}

}  // namespace

Dictionary deviceDictionary(const std::string& libraryVersion,
                            const std::optional<std::string>& countryCode) {
  MutableDictionary device;
  if (isInternalBuild()) {
    device.set("SerialNum", orUnknown(deviceSerialNumber()));
    device.set("Version", orUnknown(deviceProductVersion()));
    device.set("Build", orUnknown(deviceBuildVersion()));
    device.set("Hardware", orUnknown(deviceHardwareModel()));
    device.set("Product", orUnknown(deviceName()));
    device.set("ReportVers", libraryVersion);
    // A locale without a country, such as C, has no entry.
    if (countryCode) device.set("Locale", *countryCode);
  }
  device.set("AutomaticTimeSet", automaticTimeZoneEnabled());
  return device.share();
}

}  // namespace vesk
