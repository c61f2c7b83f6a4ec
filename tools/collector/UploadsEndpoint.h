// Takes uploaded files.
#pragma once

#include <atomic>
#include <filesystem>
#include <string>

#include "tools/collector/Endpoint.h"

namespace vesk {

/// Saves the body of every good upload as it came, compressed, under a number and the name that the query
/// gives, tells so on the console and answers with a fixed text. What is no upload is refused with 400 or
/// 405. An upload that meets a fault which comes instead of the answer has not been taken.
class UploadsEndpoint : public Endpoint {
 public:
  /// Bytes of a body that the servers must let through: the largest file that is uploaded, were it not
  /// compressible at all.
  static constexpr std::size_t kMaximumBody = std::size_t{260} << 20;

  struct Parts {
    Console& console;
    CollectorStats& stats;
    FaultPlan& faults;
  };
  UploadsEndpoint(Parts parts, std::filesystem::path directory, std::string goodAnswer);

  HTTPAnswer answer(const HTTPReceived& received) override;

 private:
  HTTPAnswer take(const HTTPReceived& received);
  /// Where it was saved. Throws std::runtime_error.
  std::filesystem::path save(const HTTPReceived& received, const std::string& name);

  const Parts _parts;
  const Refusals _refuse;
  const FaultyAnswers _faulty;
  const std::filesystem::path _directory;
  const std::string _goodAnswer;
  std::atomic<unsigned> _last{0};  ///< number of a file
};

}  // namespace vesk
