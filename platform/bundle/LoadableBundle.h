// A shared library that is loaded at run time.
#pragma once

#include <string>

#include "platform/result/Result.h"

namespace vesk {

/// A loaded library stays for the life of the process, since it may have started threads. As thread-safe as
/// the dynamic linker.
class LoadableBundle {
 public:
  /// `path`: of the library, used as it is.
  explicit LoadableBundle(std::string path);

  /// Loads the library, which runs its initialisers, unless this process has already loaded it. Fails if the
  /// file is missing or not a library.
  Result<void> load();
  /// The address of the exported symbol `name`, or null.
  void* symbolNamed(const char* name) const noexcept;

  const std::string& path() const noexcept { return _path; }

 private:
  const std::string _path;
  void* _handle = nullptr;
};

}  // namespace vesk
