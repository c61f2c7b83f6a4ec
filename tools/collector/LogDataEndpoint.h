// Receives uploads of log data.
#pragma once

#include <filesystem>

#include "tools/collector/FaultyEndpoint.h"
#include "tools/collector/NumberedFiles.h"

namespace vesk {

/// Stores each posted keyed archive in a file of its own and answers with the file's path, which the sender
/// reports as location. Refuses anything else with 400 or 405.
class LogDataEndpoint : public FaultyEndpoint {
 public:
  /// `directory` is created with the first upload.
  LogDataEndpoint(const CollectorServices& services, std::filesystem::path directory);

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  NumberedFiles _files;
};

}  // namespace vesk
