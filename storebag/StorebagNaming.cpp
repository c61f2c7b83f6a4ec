#include "storebag/StorebagNaming.h"

#include "storebag/Settings.h"

namespace vesk {

std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType) {
  switch (clientType) {
    case 5:
      return "zelko";
    case 6:
      return "brannic";
    case 7:
    case 11:
      return "palvo";
    case 8:
      return "tessin";
    case 9:
      return "quimby";
    case 10:
      return "dorvel";
    default:
      return std::nullopt;
  }
}

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
