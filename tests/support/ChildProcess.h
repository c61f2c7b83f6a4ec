// A program under test, run as a process of its own.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/files/FileDescriptor.h"

namespace vesk::test {

/// Starts with construction and is killed with destruction. Its output is collected all the time, so that it
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
  /// `patience`. All its output has been collected then.
  std::optional<int> wait(std::chrono::milliseconds patience = kPatience);

  /// What it wrote so far.
  std::string output() const;
  std::string errors() const;

  /// Waits until it has written `text` to standard output or error, `count` times in all; false when it ended
  /// or `patience` ran out before.
  bool waitForText(std::string_view text, int count = 1,
                   std::chrono::milliseconds patience = kPatience) const;

 private:
  void collect();
  bool collectFrom(int descriptor, std::string& text);

  pid_t _pid = -1;
  FileDescriptor _process;  // readable once the process has ended
  FileDescriptor _output;
  FileDescriptor _errors;
  FileDescriptor _stop;
  std::optional<int> _status;

  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::string _outputText;  // these three under _mutex
  std::string _errorText;
  bool _collected = false;

  std::thread _collector;
};

/// Waits until the file exists (a ready file appears whole); false when `patience` ran out before.
bool waitForFile(const std::string& path, std::chrono::milliseconds patience = ChildProcess::kPatience);

}  // namespace vesk::test
