// A value that is loaded and stored as a whole.
#pragma once

#include <utility>

#include "platform/sync/Mutex.h"

namespace vesk {

/// For types too large for std::atomic. Holds its lock while copying and takes no other lock meanwhile, so
/// `T` should be cheap to copy.
template <class T>
class Snapshot {
 public:
  T load() const {
    MutexLock lock(_mutex);
    return _value;
  }
  void store(T value) {
    MutexLock lock(_mutex);
    std::swap(_value, value);  // the old value is destroyed after unlocking
  }

 private:
  mutable Mutex _mutex;
  T _value VESK_GUARDED_BY(_mutex){};
};

}  // namespace vesk
