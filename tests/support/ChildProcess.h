// A program under test, run as a process of its own.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/files/FileDescriptor.h"

namespace vesk::test {

/// Starts with construction and is killed with destruction. Its output goes into files in memory, so that it
/// never waits for its reader.
class ChildProcess {
 public:
  /// Long enough for a sanitized build on a busy machine; a test that waits this long has failed.
  static constexpr std::chrono::seconds kPatience{60};

  struct Options {
    std::vector<std::string> command;                  ///< program (path or name in PATH) and arguments
    std::map<std::string, std::string> environment{};  ///< added to the test's own
    std::string input{};                               ///< what it reads on standard input
    bool outputClosed = false;                         ///< runs without a standard output
  };

  /// Throws std::runtime_error when the program can't be started.
  explicit ChildProcess(Options options);
  explicit ChildProcess(std::vector<std::string> command) : ChildProcess(Options{std::move(command)}) {}
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return _pid; }
  void signal(int number) const;

  /// The exit status once it has ended, 128 + the signal when one ended it; nothing when it still runs after
  /// `patience`.
  std::optional<int> wait(std::chrono::milliseconds patience = kPatience);

  /// What it wrote so far.
  std::string output() const;
  std::string errors() const;

  /// Waits until it has written `text` to standard output or error, `count` times in all; false when it ended
  /// or kPatience ran out before.
  bool waitForText(std::string_view text, int count = 1) const;

 private:
  bool hasEnded(std::chrono::milliseconds patience) const;

  FileDescriptor _output;
  FileDescriptor _errors;
  pid_t _pid = -1;
  FileDescriptor _process;  // readable once the process has ended
  std::optional<int> _status;
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
