// A shared library that is loaded by its path while the process runs.
#pragma once

#include <string>

namespace vesk {

/// Once loaded, a library stays for the life of the process: it may have started threads. Thread-safe as the
/// dynamic linker is.
class LoadableBundle {
 public:
  /// `path`: of the library, as it is.
  explicit LoadableBundle(std::string path);

  /// Whether this process has the library already.
  bool isLoaded() const noexcept { return _handle != nullptr; }
  /// Loads it, which runs its initialisers. False, with `error` set, when there is none or it is no library.
  bool load();
  /// What it exports under `name`, or null.
  void* symbolNamed(const char* name) const noexcept;

  const std::string& path() const noexcept { return _path; }
  const std::string& error() const noexcept { return _error; }

 private:
  const std::string _path;
  void* _handle = nullptr;
  std::string _error;
};

}  // namespace vesk
