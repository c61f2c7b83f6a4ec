// Receives uploaded files.
#pragma once

#include <filesystem>
#include <string>

#include "tools/collector/FaultyEndpoint.h"
#include "tools/collector/NumberedFiles.h"

namespace vesk {

/// Saves the body of every valid upload unchanged (compressed), under a number and the name given in the
/// query, reports it on the console and answers with a fixed text. Refuses anything else with 400 or 405. An
/// upload hit by a fault that replaces the answer is not accepted.
class UploadsEndpoint : public FaultyEndpoint {
 public:
  /// Size in bytes of a body that the servers must accept: the largest file that may be uploaded, assuming
  /// that it is incompressible.
  static constexpr std::size_t kMaximumBody = std::size_t{260} << 20;

  UploadsEndpoint(const CollectorServices& services, std::filesystem::path directory, std::string goodAnswer);

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  NumberedFiles _files;
  const std::string _goodAnswer;
};

}  // namespace vesk
