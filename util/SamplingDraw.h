// The random draws that sampling is decided by.
#pragma once

namespace vesk {

/// The next draw, in [0, 1), of the process's one sequence: that of `drand48`, which is never seeded, so that
/// the same sequence follows every start. Thread-safe.
double nextSamplingDraw();

}  // namespace vesk
