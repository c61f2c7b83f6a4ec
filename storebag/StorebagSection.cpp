#include "storebag/StorebagSection.h"

#include <string>

#include "platform/log/SystemLog.h"
#include "storebag/Settings.h"
#include "storebag/StorebagNaming.h"
#include "storebag/StorebagProfile.h"

namespace vesk {

namespace {

constexpr std::string_view kStorebag = "storebag";  // backend name in lines about the storebag's own entries

}  // namespace

std::optional<Dictionary> storebagSectionForEnvironment(const Dictionary& payload,
                                                        std::int32_t environmentType,
                                                        std::int32_t clientType) {
  auto name = environmentNameForType(environmentType);
  auto section = name ? profileDictionary(kStorebag, payload, *name) : std::nullopt;
  if (!section && environmentType == kSeedEnvironment) {
    VESK_LOG_WARNING("fetchStorebagForEnvironmentAndClientType: Seed section is missing in the storebag.");
    name = "release";
    section = profileDictionary(kStorebag, payload, *name);
  }
  if (!section) {
    VESK_LOG_ERROR(
        "fetchStorebagForEnvironmentAndClientType: Could not find storebag for client type %d with %s "
        "environment",
        clientType, std::string(name.value_or("(none)")).c_str());
  }
  return section;
}

}  // namespace vesk
