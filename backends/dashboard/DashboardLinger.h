// Limits how many dashboards may wait for acknowledgements after their sessions' end.
#pragma once

#include <cstddef>
#include <semaphore>

namespace vesk {

/// One slot for each delivery that outlives its backend (DashboardDelivery.h). Shared by the whole process.
using DashboardLinger = std::counting_semaphore<>;

/// As many as an orderly stop may end at once: one per connection.
inline constexpr std::size_t kMaximumLingering = 4096;

}  // namespace vesk
