#include "session/BackendSet.h"
#include "backends/BackendFactory.h"

#include <VeskReporting/VeskReportingKeys.h>

#include "platform/log/SystemLog.h"
#include "platform/preferences/PreferencesSuite.h"
#include "storebag/StorebagProfile.h"
#include "util/ReportingdUtil.h"

namespace vesk {

namespace {

/// The identity that all backends of a set share.
struct SetIdentity {
  SetIdentity(const Dictionary& sessionInfo, const BackendServices& services)
      : startTimestamp(timevalFrom(services.clock.now())),
        productVersion(deviceProductVersion()),
        buildVersion(deviceBuildVersion()),
        productType(deviceProductType()),
        productFamily(deviceName()),
        isInternal(isInternalBuild()),
        sessionID(number(sessionInfo, kVeskReportingSessionInfoSessionID)),
        clientType(number(sessionInfo, kVeskReportingSessionInfoClientType)),
        clientVersion(
            static_cast<std::uint16_t>(number(sessionInfo, kVeskReportingSessionInfoClientVersion))),
        requireUserInfo(flag(sessionInfo, kVeskReportingSessionInfoRequireUserInfo)),
        batchEvents(flag(sessionInfo, kVeskReportingSessionInfoBatchEvent)) {}

  static std::int32_t number(const Dictionary& sessionInfo, std::string_view key) {
    return static_cast<std::int32_t>(integerForKey(sessionInfo, key).value_or(0));
  }
  static bool flag(const Dictionary& sessionInfo, std::string_view key) {
    return booleanForKey(sessionInfo, key).value_or(false);
  }

  timeval startTimestamp;
  std::optional<Text> productVersion;
  std::optional<Text> buildVersion;
  std::optional<Text> productType;
  std::optional<Text> productFamily;
  bool isInternal;
  std::int32_t sessionID;
  std::int32_t clientType;
  std::uint16_t clientVersion;
  bool requireUserInfo;
  bool batchEvents;
};

void stamp(VeskReportingBackend& backend, const SetIdentity& identity,
           const std::optional<Dictionary>& userInfo, std::string_view deviceID,
           const std::string& libraryVersion) {
  backend.setSessionID(static_cast<std::uint32_t>(identity.sessionID));
  backend.setCompType(identity.clientType);
  backend.setClientVersion(identity.clientVersion);
  backend.setUdid(deviceID);
  backend.setProductVersion(identity.productVersion);
  backend.setBuildVersion(identity.buildVersion);
  backend.setHardwareType(identity.productType);
  backend.setIsInternal(identity.isInternal);
  backend.setRequireUserInfo(identity.requireUserInfo);
  backend.setBatchEvents(identity.batchEvents);
  backend.setUserInfoDict(userInfo);
  backend.setSelfVersion(libraryVersion);
  backend.setStartTimestamp(identity.startTimestamp);
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
                                         const std::string& libraryVersion, uid_t user,
                                         const BackendServices& services) {
  if (!storebag) {
    VESK_LOG_ERROR("createBackends: Attempted to create backends with nil storebag");
    return std::nullopt;
  }
  if (!sessionInfo) {
    VESK_LOG_ERROR("createBackends: Attempted to create backends with nil session info");
    return std::nullopt;
  }
  SetIdentity identity(*sessionInfo, services);
  const HeldBytes heldBytes = services.heldBudget->accountFor(user);
  BackendSet backends;
  for (const DictionaryEntry& entry : *storebag) {
    std::string name = entry.key.string();
    auto backend =
        newBackendWithName(name, profileFrom(entry), identity.productFamily, identity.clientType, services);
    if (!backend) continue;
    stamp(*backend, identity, userInfo, deviceID, libraryVersion);
    backend->setHeldBytes(heldBytes);
    backend->setUser(user);
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
