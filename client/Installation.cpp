// Information about the installation and the device.
#include <VeskReporting/VeskReporting.h>

#include "common/PersistentIdentifiers.h"
#include "common/Resources.h"

namespace vesk {

std::string VeskReporting::version() noexcept { return clientLibraryVersion(); }

std::optional<std::string> VeskReporting::publicKey() noexcept { return publicKeyDER(); }

std::string VeskReporting::getPersistentIdentifierForDNU(bool respectsConsent) noexcept {
  return persistentIdentifierForDNU(respectsConsent);
}

}  // namespace vesk
