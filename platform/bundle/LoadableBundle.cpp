#include "platform/bundle/LoadableBundle.h"

#include <dlfcn.h>

#include <utility>

namespace vesk {

LoadableBundle::LoadableBundle(std::string path)
    : _path(std::move(path)), _handle(::dlopen(_path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NOLOAD)) {}

Result<void> LoadableBundle::load() {
  if (!_handle) _handle = ::dlopen(_path.c_str(), RTLD_NOW | RTLD_LOCAL | RTLD_NODELETE);
  if (_handle) return {};
  const char* cause = ::dlerror();
  return Error{Error::Kind::Failed, cause ? cause : "can't be loaded"};
}

void* LoadableBundle::symbolNamed(const char* name) const noexcept {
  return _handle ? ::dlsym(_handle, name) : nullptr;
}

}  // namespace vesk
