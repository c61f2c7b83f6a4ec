// A shared library that is loaded at run time.
#pragma once

#include <string>

namespace vesk {

/// A loaded library stays for the life of the process, since it may have started threads. As thread-safe as
/// the dynamic linker.
class LoadableBundle {
 public:
  /// `path`: of the library, used as it is.
  explicit LoadableBundle(std::string path);

  /// Whether this process has already loaded the library.
  bool isLoaded() const noexcept { return _handle != nullptr; }
  /// Loads the library, which runs its initialisers. Returns false, with `error` set, if the file is missing
  /// or not a library.
  bool load();
  /// The address of the exported symbol `name`, or null.
  void* symbolNamed(const char* name) const noexcept;

  const std::string& path() const noexcept { return _path; }
  const std::string& error() const noexcept { return _error; }

 private:
  const std::string _path;
  void* _handle = nullptr;
  std::string _error;
};

}  // namespace vesk
