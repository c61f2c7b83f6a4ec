// How many dashboards may wait for acknowledgements after their sessions' end.
#pragma once

#include <cstddef>
#include <semaphore>

namespace vesk {

/// A place for each delivery that outlives its backend (DashboardDelivery.h); shared by all of a process.
using DashboardLinger = std::counting_semaphore<>;

/// As many as an orderly stop may end at once: one a connection.
inline constexpr std::size_t kMaximumLingering = 4096;

}  // namespace vesk
