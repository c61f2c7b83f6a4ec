// What a process holds, as the kernel sees it.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <thread>

#include "tests/support/ChildProcess.h"

namespace vesk::test {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kIsSanitized = true;
#else
constexpr bool kIsSanitized = false;
#endif

class ProcessFacts {
 public:
  explicit ProcessFacts(pid_t process) : _directory("/proc/" + std::to_string(process)) {}

  std::size_t descriptors() const { return entries("fd"); }
  std::size_t threads() const { return entries("task"); }

 private:
  std::size_t entries(const char* name) const {
    std::filesystem::directory_iterator all(_directory + "/" + name);
    return static_cast<std::size_t>(std::distance(begin(all), end(all)));
  }
  std::string _directory;
};

/// Looks again and again until it is so; false when ChildProcess::kPatience ran out before.
template <class Condition>
bool eventually(Condition isSo) {
  const auto deadline = std::chrono::steady_clock::now() + ChildProcess::kPatience;
  while (!isSo()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(5));  // between two looks
  }
  return true;
}

}  // namespace vesk::test
