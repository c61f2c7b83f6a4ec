#include "daemon/SetupProblems.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "platform/files/RootPrefix.h"
#include "platform/log/SystemLog.h"
#include "platform/preferences/PreferencesSuite.h"
#include "platform/preferences/TomlFile.h"
#include "platform/text/NearestWord.h"
#include "storebag/Settings.h"

namespace vesk {

namespace {

constexpr std::array<std::string_view, 14> kPreferences{"diagnosticsSubmission",
                                                        "environmentType",
                                                        "httpsPostURL",
                                                        "httpsRealtimePostURL",
                                                        "keepStorebags",
                                                        "logRateLimit",
                                                        "maxConnections",
                                                        "maxConnectionsPerUser",
                                                        "maxHeldMiB",
                                                        "maxHeldMiBPerUser",
                                                        "outbox",
                                                        "outboxDays",
                                                        "outboxMiB",
                                                        "veskreporting_storebag_url"};
constexpr std::array<std::string_view, 9> kDeviceFacts{"BuildVersion", "HWModelStr",  "SerialNumber",
                                                       "DeviceName",   "ProductType", "ProductVersion",
                                                       "RegionCode",   "ReleaseType", "UniqueDeviceID"};
constexpr char kSuite[] = "com.corvane.veskreporting";
constexpr char kPublicKey[] = "/usr/share/veskreporting/publicKey.der";
constexpr std::size_t kShown = 64;
constexpr std::size_t kMostKinds = 64;

template <class Known>
void warnOfUnknownKeys(const char* file, const Known& known) {
  const std::string path = pathUnderRoot(file);
  for (const auto& [key, value] : readTomlFile(path)) {
    if (std::find(known.begin(), known.end(), key.view()) != known.end()) continue;
    const std::string name(key.view().substr(0, kShown)), nearest(nearestOf(key.view(), known));
    VESK_LOG_WARNING("main: %s: nothing reads the key '%s'%s%s%s", path.c_str(), name.c_str(),
                     nearest.empty() ? "" : "; is '", nearest.c_str(), nearest.empty() ? "" : "' meant?");
  }
}

}  // namespace

void warnOfUnknownSettings() {
  warnOfUnknownKeys("/etc/veskreporting/preferences/com.corvane.veskreporting.toml", kPreferences);
  warnOfUnknownKeys("/etc/veskreporting/device.toml", kDeviceFacts);
}

Dictionary settingsInForce() {
  const PreferencesSuite suite(kSuite);
  MutableDictionary settings;
  for (const auto key : kPreferences) {
    if (const auto setting = suite.settingForKey(key))
      settings.set(key, Dictionary{{"value", setting->value}, {"file", setting->file}});
  }
  return settings.share();
}

void FetchProblems::note(const Fetch& fetch) {
  if (!fetch.hasPublicKey)
    warn("there is no usable public key at " + pathUnderRoot(kPublicKey) + ", so every storebag is refused");
  if (storebagServerBaseURL().find(".invalid/") != std::string::npos)
    warn("no storebag server is configured: set the preference veskreporting_storebag_url");
  if (fetch.httpStatus != 0 && fetch.httpStatus / 100 != 2)
    warn("the storebag server answered with status " + std::to_string(fetch.httpStatus) +
         " for client type " + std::to_string(fetch.clientType));
}

void FetchProblems::warn(const std::string& line) {
  if (_bursts.size() >= kMostKinds && !_bursts.contains(line)) return;
  if (_bursts[line].begins()) VESK_LOG_WARNING("storebagForSession: %s", line.c_str());
}

}  // namespace vesk
