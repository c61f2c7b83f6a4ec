#include "util/Counters.h"

#include <mutex>

namespace vesk {

namespace {

constexpr std::size_t kMostBackends = 64;
constexpr std::string_view kOtherBackends = "other";

}  // namespace

std::string_view nameOfDropReason(DropReason reason) noexcept {
  switch (reason) {
    case DropReason::StateDisabled:
      return "state-disabled";
    case DropReason::TransportError:
      return "transport-error";
    case DropReason::NoURL:
      return "no-url";
    case DropReason::ServerError5xx:
      return "server-error-5xx";
    case DropReason::OverBound:
      return "over-bound";
    case DropReason::BodyNotBuilt:
      return "body-not-built";
    case DropReason::InvalidMessage:
      return "invalid-message";
    case DropReason::NoBackend:
      return "no-backend";
    case DropReason::UploadFailed:
      return "upload-failed";
    case DropReason::NeverEnabled:
      return "never-enabled";
    case DropReason::Unacknowledged:
      return "unacknowledged";
    case DropReason::NotAggregated:
      return "not-aggregated";
    case DropReason::NotRecorded:
      return "not-recorded";
    case DropReason::AdaptorFailed:
      return "adaptor-failed";
    case DropReason::ServerRefused:
      return "server-refused";
    case DropReason::Deferred:
      return "deferred";
    case DropReason::DeliveredLate:
      return "delivered-late";
    case DropReason::RefusedLate:
      return "refused";
    case DropReason::Expired:
      return "expired";
    case DropReason::OverQuota:
      return "over-quota";
    case DropReason::ConsentWithdrawn:
      return "consent-withdrawn";
    case DropReason::Damaged:
      return "damaged";
    case DropReason::NotWritten:
      return "not-written";
    case DropReason::Exported:
      return "exported";
  }
  return "unknown";
}

Counters& Counters::shared() {
  // Never destroyed: completions may still count while the process ends.
  static auto* counters = new Counters;
  return *counters;
}

Counters::Row* Counters::rowFor(std::string_view backend) {
  {
    std::shared_lock lock(_mutex);
    if (auto found = _rows.find(backend); found != _rows.end()) return found->second.get();
  }
  std::unique_lock lock(_mutex);
  if (_rows.size() >= kMostBackends && _rows.find(backend) == _rows.end()) backend = kOtherBackends;
  auto& row = _rows[std::string(backend)];
  if (!row) row = std::make_unique<Row>();
  return row.get();
}

void Counters::count(std::string_view backend, DropReason reason, std::uint64_t n) noexcept {
  (*rowFor(backend))[static_cast<std::size_t>(reason)].fetch_add(n, std::memory_order_relaxed);
}

std::vector<Counters::Count> Counters::snapshot() const {
  std::vector<Count> counts;
  std::shared_lock lock(_mutex);
  for (const auto& [backend, row] : _rows) {
    for (std::size_t reason = 0; reason < kDropReasonCount; ++reason) {
      if (std::uint64_t count = (*row)[reason].load(std::memory_order_relaxed)) {
        counts.push_back({backend, static_cast<DropReason>(reason), count});
      }
    }
  }
  return counts;
}

}  // namespace vesk
