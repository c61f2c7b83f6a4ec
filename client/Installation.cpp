// Information about the installation and the device.
#include <VeskReporting/veskreporting.h>

#include <algorithm>
#include <string>

#include "common/PersistentIdentifiers.h"
#include "common/Resources.h"

namespace {

size_t give(const std::string& text, char* buffer, size_t size) noexcept {
  if (buffer) std::copy_n(text.begin(), std::min(size, text.size()), buffer);
  return text.size();
}

}  // namespace

size_t vesk_persistent_identifier(int respects_consent, char* buffer, size_t size) {
  return give(vesk::persistentIdentifierForDNU(respects_consent != 0), buffer, size);
}

size_t vesk_version(char* buffer, size_t size) { return give(vesk::clientLibraryVersion(), buffer, size); }

size_t vesk_public_key(char* buffer, size_t size) {
  return give(vesk::publicKeyDER().value_or(""), buffer, size);
}
