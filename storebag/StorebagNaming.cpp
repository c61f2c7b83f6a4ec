#include "storebag/StorebagNaming.h"

#include "storebag/Settings.h"

namespace vesk {

std::optional<std::string_view> environmentNameForType(std::int32_t environmentType) {
  switch (environmentType) {
    case 1:
      return "development";
    case kInternalEnvironment:
      return "corvane_internal";
    case kSeedEnvironment:
      return "seed";
    case 4:
      return "release";
    default:
      return std::nullopt;
  }
}

}  // namespace vesk
