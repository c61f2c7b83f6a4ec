// Data that the oracle and its client processes share while they run.
#pragma once

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <atomic>
#include <cstdint>
#include <stdexcept>
#include <string>

#include "platform/files/FileDescriptor.h"

namespace vesk::test {

/// A file that all of them map. Each word is atomic.
class SharedPage {
 public:
  struct Words {
    /// The number of the daemon that may be running. Incremented after the previous daemon is certainly dead
    /// and before the next is started, so everything that begins and ends under one number was done by one
    /// daemon.
    std::atomic<std::uint64_t> incarnation;
    /// Set once. The clients then finish their round and end.
    std::atomic<bool> stop;
  };
  static_assert(std::atomic<std::uint64_t>::is_always_lock_free, "works between processes");

  /// Creates the file if missing. Throws std::runtime_error.
  explicit SharedPage(const std::string& path) {
    FileDescriptor file(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    if (!file || ::ftruncate(file.get(), sizeof(Words)) != 0) throw std::runtime_error("no page " + path);
    _memory = ::mmap(nullptr, sizeof(Words), PROT_READ | PROT_WRITE, MAP_SHARED, file.get(), 0);
    if (_memory == MAP_FAILED) throw std::runtime_error("no page " + path);
  }
  ~SharedPage() { ::munmap(_memory, sizeof(Words)); }
  SharedPage(const SharedPage&) = delete;
  SharedPage& operator=(const SharedPage&) = delete;

  Words* operator->() const { return static_cast<Words*>(_memory); }

 private:
  void* _memory;
};

}  // namespace vesk::test
