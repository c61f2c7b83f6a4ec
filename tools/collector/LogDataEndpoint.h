// Takes uploads of log data.
#pragma once

#include <filesystem>

#include "tools/collector/FaultyEndpoint.h"
#include "tools/collector/NumberedFiles.h"

namespace vesk {

/// Stores each keyed archive that is posted as a file of its own and answers with the file's path, which is
/// what the sender announces as location. Anything else is refused with 400 or 405.
class LogDataEndpoint : public FaultyEndpoint {
 public:
  /// `directory` is made when the first upload arrives.
  LogDataEndpoint(const CollectorServices& services, std::filesystem::path directory);

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  NumberedFiles _files;
};

}  // namespace vesk
