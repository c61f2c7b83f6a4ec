// Takes uploaded files.
#pragma once

#include <filesystem>
#include <string>

#include "tools/collector/FaultyEndpoint.h"
#include "tools/collector/NumberedFiles.h"

namespace vesk {

/// Saves the body of every good upload as it came, compressed, under a number and the name that the query
/// gives, tells so on the console and answers with a fixed text. What is no upload is refused with 400 or
/// 405. An upload that meets a fault which comes instead of the answer has not been taken.
class UploadsEndpoint : public FaultyEndpoint {
 public:
  /// Bytes of a body that the servers must let through: the largest file that is uploaded, were it not
  /// compressible at all.
  static constexpr std::size_t kMaximumBody = std::size_t{260} << 20;

  UploadsEndpoint(const CollectorServices& services, std::filesystem::path directory, std::string goodAnswer);

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  NumberedFiles _files;
  const std::string _goodAnswer;
};

}  // namespace vesk
