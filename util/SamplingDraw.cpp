#include "util/SamplingDraw.h"

#include <cstdlib>

#include "platform/sync/Mutex.h"

namespace vesk {

double nextSamplingDraw() {
  // The generator's state belongs to the whole process and is not protected by the C library.
  static Mutex mutex;
  MutexLock lock(mutex);
  return ::drand48();  // NOLINT(concurrency-mt-unsafe)
}

}  // namespace vesk
