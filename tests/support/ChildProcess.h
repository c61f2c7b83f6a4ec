// A program under test, run in its own process.
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

/// Starts the program on construction and kills it on destruction. Output goes to files in memory, so that
/// the program never waits for its reader.
class ChildProcess {
 public:
  /// Long enough for a sanitized build on a busy machine. A test that waits this long has failed.
  static constexpr std::chrono::seconds kPatience{60};

  struct Options {
    std::vector<std::string> command;                  ///< program (path or name in PATH) and arguments
    std::map<std::string, std::string> environment{};  ///< added to the test's own
    std::string input{};                               ///< standard input
    bool outputClosed = false;                         ///< runs without standard output
  };

  /// Throws std::runtime_error if the program can't be started.
  explicit ChildProcess(Options options);
  explicit ChildProcess(std::vector<std::string> command) : ChildProcess(Options{std::move(command)}) {}
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return _pid; }
  void signal(int number) const;

  /// The exit status, or 128 + the signal that ended it; nullopt if it still runs after `patience`.
  std::optional<int> wait(std::chrono::milliseconds patience = kPatience);

  /// The output so far.
  std::string output() const;
  std::string errors() const;

  /// Waits until it has written `text` to standard output or error, `count` times in all. Returns false if it
  /// ends first, or after kPatience.
  bool waitForText(std::string_view text, int count = 1) const;

 private:
  bool hasEnded(std::chrono::milliseconds patience) const;

  FileDescriptor _output;
  FileDescriptor _errors;
  pid_t _pid = -1;
  FileDescriptor _process;  // readable once the process has ended
  std::optional<int> _status;
};

/// Polls until the condition holds. Returns false after ChildProcess::kPatience.
template <class Condition>
bool eventually(Condition isSo) {
  const auto deadline = std::chrono::steady_clock::now() + ChildProcess::kPatience;
  while (!isSo()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  return true;
}

}  // namespace vesk::test
