// A device to decide for, described by its facts and preferences.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include <VeskReporting/values/Value.h>
#include "backends/https/PostPolicy.h"
#include "platform/result/Result.h"

namespace vesk {

struct StorebagDevice {
  std::string productFamily = "Device";
  std::optional<std::string> regionCode{};
  std::optional<Text> hardwareType{};
  std::optional<Text> productVersion{};
  std::optional<Text> buildVersion{};
  bool isInternal = false;
  bool dnuEnabled = true;  ///< the user agreed to the submission of diagnostics
  std::int32_t environmentType = 3;
  PostPolicy::Settings initial{};  ///< URLs from the preferences

  /// The name of the environment's section; "(none)" if it has none.
  std::string environment() const;
};

/// Reads facts under the keys of device.toml and of the preferences, and `environment`, an environment's
/// name. Fails for a key that is none of these or a value of a wrong type.
Result<StorebagDevice> storebagDevice(const Dictionary& facts);

/// Reads facts as the command line gives them: "key=value,key=value", or the path of a TOML or JSON file.
/// Throws std::runtime_error if the file can't be read.
Result<Dictionary> deviceFactsIn(const std::string& argument);

}  // namespace vesk
