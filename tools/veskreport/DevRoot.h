// The private root below which `veskreport dev` runs collector and daemon.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// Failures throw std::runtime_error with a readable message.
class DevRoot {
 public:
  /// `kept`: this directory stays, and is made if it is missing; empty: a temporary one, which is removed in
  /// the end. Refuses a directory with other files in it.
  explicit DevRoot(const std::string& kept);
  ~DevRoot();
  DevRoot(const DevRoot&) = delete;
  DevRoot& operator=(const DevRoot&) = delete;

  const std::filesystem::path& path() const { return _path; }
  std::filesystem::path collector() const { return _path / "collector"; }
  std::filesystem::path readyFile() const { return collector() / "ready.json"; }

  /// What the collector has written to the ready file; empty without one.
  Dictionary facts() const;
  /// Options for the collector's ports. Those of an earlier run are kept, since storebags name them.
  std::vector<std::string> portOptions() const;
  /// Writes what the daemon reads: key, sandbox profile and, unless they are there, preferences, device facts
  /// and a storebag for each client type.
  void prepare() const;

 private:
  const bool _isKept;
  std::filesystem::path _path;
};

}  // namespace vesk
