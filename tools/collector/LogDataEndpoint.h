// Takes uploads of log data.
#pragma once

#include <atomic>
#include <cstdint>
#include <filesystem>

#include "tools/collector/Endpoint.h"

namespace vesk {

/// Stores each keyed archive that is posted as a file of its own and answers with the file's path, which is
/// what the sender announces as location. Anything else is refused with 400 or 405.
class LogDataEndpoint : public Endpoint {
 public:
  struct Parts {
    Console& console;
    CollectorStats& stats;
    FaultPlan& faults;
  };
  /// `directory` is made when the first upload arrives.
  LogDataEndpoint(Parts parts, std::filesystem::path directory);

  HTTPAnswer answer(const HTTPReceived& received) override;

 private:
  HTTPAnswer take(const HTTPReceived& received);
  std::filesystem::path store(const HTTPReceived& received);

  const Parts _parts;
  const Refusals _refuse;
  const FaultyAnswers _faulty;
  const std::filesystem::path _directory;
  std::atomic<std::uint64_t> _next = 1;
};

}  // namespace vesk
