// A process's resources, as reported by the kernel.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <iterator>
#include <string>

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

}  // namespace vesk::test
