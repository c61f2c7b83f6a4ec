// Receives uploaded files and log data.
#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>
#include <string>
#include <string_view>

#include "tools/collector/Endpoint.h"

namespace vesk {

/// Saves files in one directory, each under a number that is not used there yet. Thread-safe.
class NumberedFiles {
 public:
  /// `directory` is created with the first file.
  explicit NumberedFiles(std::filesystem::path directory) : _directory(std::move(directory)) {}

  /// Saves `bytes` under the next number, followed by `ending`, and returns the path. Throws
  /// std::runtime_error.
  std::filesystem::path save(std::string_view bytes, const std::string& ending);

 private:
  const std::filesystem::path _directory;
  std::atomic<std::uint64_t> _last = 0;
};

/// Saves the body of every valid upload unchanged (compressed), under a number and the name given in the
/// query, reports it on the console and answers with a fixed text. Refuses anything else with 400 or 405. An
/// upload hit by a fault that replaces the answer is not accepted.
class UploadsEndpoint : public Endpoint {
 public:
  /// Size in bytes of a body that the servers must accept: the largest file that may be uploaded, assuming
  /// that it is incompressible.
  static constexpr std::size_t kMaximumBody = std::size_t{260} << 20;

  UploadsEndpoint(const CollectorServices& services, std::filesystem::path directory, std::string goodAnswer)
      : Endpoint(services, "upload"), _files(std::move(directory)), _goodAnswer(std::move(goodAnswer)) {}

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  NumberedFiles _files;
  const std::string _goodAnswer;
};

/// Stores each posted keyed archive in a file of its own and answers with the file's path, which the sender
/// reports as location. Refuses anything else with 400 or 405.
class LogDataEndpoint : public Endpoint {
 public:
  LogDataEndpoint(const CollectorServices& services, std::filesystem::path directory)
      : Endpoint(services, "logdata"), _files(std::move(directory)) {}

 private:
  HTTPAnswer serve(const HTTPReceived& received, const CollectorFault* fault) override;

  NumberedFiles _files;
};

}  // namespace vesk
