// The programs that `veskreport dev` runs.
#pragma once

#include <signal.h>
#include <sys/types.h>

#include <filesystem>
#include <functional>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/files/FileDescriptor.h"

namespace vesk {

/// The program's path: beside this one, in ../sbin, in PATH or in /usr/sbin. Throws std::runtime_error that
/// names the package if there is none.
std::filesystem::path findProgram(const std::string& name);

/// A child process. The kernel kills it if its parent ends first. For programs with a single thread.
class DevProgram {
 public:
  struct Options {
    std::vector<std::string> command;                ///< path, or name in PATH, and arguments
    std::map<std::string, std::string> environment;  ///< added to this program's own
    sigset_t signals;                                ///< its mask
    /// A server has a process group of its own, so that a terminal's Ctrl-C does not reach it, makes private
    /// files, and writes to a pipe. Any other program shares terminal and output with this one.
    bool isServer;
  };

  /// Throws std::system_error. A program that can't be run says so and ends with 127, as in a shell.
  explicit DevProgram(const Options& options);
  /// Kills a program that still runs.
  ~DevProgram();
  DevProgram(const DevProgram&) = delete;
  DevProgram& operator=(const DevProgram&) = delete;

  pid_t pid() const { return _pid; }
  void signal(int number) const;
  /// Its exit status, or 128 plus the number of the signal that ended it; nullopt while it runs.
  std::optional<int> status();

  /// What a server writes to standard output and error; -1 once it was read to the end.
  int output() const { return _output.get(); }
  /// Reads once, and calls the handler with each complete line. Blocks if nothing is there.
  void readOutput(const std::function<void(const std::string& line)>& handler);

 private:
  pid_t _pid = -1;
  FileDescriptor _output;
  std::string _partial;  ///< an incomplete line
  std::optional<int> _status;
};

}  // namespace vesk
