#include "platform/bundle/LoadableBundle.h"

#include <dlfcn.h>

#include <utility>

namespace vesk {

LoadableBundle::LoadableBundle(std::string path)
    : _path(std::move(path)), _handle(::dlopen(_path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD)) {}

bool LoadableBundle::load() {
  if (_handle) return true;
  _handle = ::dlopen(_path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
  if (_handle) return true;
  const char* cause = ::dlerror();
  _error = cause ? cause : "can't be loaded";
  return false;
}

void* LoadableBundle::symbolNamed(const char* name) const noexcept {
  return _handle ? ::dlsym(_handle, name) : nullptr;
}

}  // namespace vesk
