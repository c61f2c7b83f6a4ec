// A value that is written and read as a whole.
#pragma once

#include <utility>

#include "platform/sync/Mutex.h"

namespace vesk {

/// For what does not fit into std::atomic. Its lock is held for the length of a copy and no other is taken
/// under it, so `T` should be cheap to copy.
template <class T>
class Snapshot {
 public:
  T load() const {
    MutexLock lock(_mutex);
    return _value;
  }
  void store(T value) {
    MutexLock lock(_mutex);
    std::swap(_value, value);  // what it replaces is destroyed after the lock
  }

 private:
  mutable Mutex _mutex;
  T _value VESK_GUARDED_BY(_mutex){};
};

}  // namespace vesk
