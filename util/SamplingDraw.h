// The random draws for sampling decisions.
#pragma once

namespace vesk {

/// The next draw in [0, 1) of the process's sequence. It uses `drand48` without a seed, so the sequence is
/// the same after every start. Thread-safe.
double nextSamplingDraw();

}  // namespace vesk
