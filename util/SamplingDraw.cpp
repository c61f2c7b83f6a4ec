#include "util/SamplingDraw.h"

#include <cstdlib>

#include "platform/sync/Mutex.h"

namespace vesk {

double nextSamplingDraw() {
  // The generator's state is process-wide, and the C library doesn't protect it.
  static Mutex mutex;
  MutexLock lock(mutex);
  return ::drand48();  // NOLINT(concurrency-mt-unsafe)
}

}  // namespace vesk
