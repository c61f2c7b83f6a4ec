#include "platform/files/RootPrefix.h"

#include <stdlib.h>

namespace vesk {

namespace {

std::string normalized(std::string_view prefix) {
  while (!prefix.empty() && prefix.back() == '/') prefix.remove_suffix(1);
  return std::string(prefix);
}

std::string& storage() {
  // Never destroyed: a session may be created while the process exits. Since the client library runs in any
  // program, the caller of a setuid program must not be able to choose its daemon and files.
  static std::string& prefix = *new std::string([] {
    const char* fromEnvironment = ::secure_getenv("VESKREPORTINGD_ROOT");
    return normalized(fromEnvironment ? fromEnvironment : "");
  }());
  return prefix;
}

}  // namespace

const std::string& rootPrefix() { return storage(); }

void setRootPrefix(std::string_view prefix) { storage() = normalized(prefix); }

std::string pathUnderRoot(std::string_view path) { return rootPrefix() + std::string(path); }

bool isPlainFileName(std::string_view name) noexcept {
  return !name.empty() && name.front() != '.' && name.find('/') == std::string_view::npos &&
         name.find('\0') == std::string_view::npos;
}

}  // namespace vesk
