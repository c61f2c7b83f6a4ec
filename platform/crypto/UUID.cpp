#include "platform/crypto/UUID.h"

#include <sys/random.h>

#include <cerrno>
#include <system_error>

#include "platform/text/ASCII.h"

namespace vesk {

UUIDBytes makeUUID() {
  UUIDBytes uuid;
  // Requests of up to 256 bytes are never answered partially.
  if (::getrandom(uuid.data(), uuid.size(), 0) != static_cast<ssize_t>(uuid.size())) {
    throw std::system_error(errno, std::generic_category(), "getrandom");
  }
  uuid[6] = static_cast<unsigned char>((uuid[6] & 0x0f) | 0x40);  // version 4: random
  uuid[8] = static_cast<unsigned char>((uuid[8] & 0x3f) | 0x80);  // the standard variant
  return uuid;
}

std::string uuidText(const UUIDBytes& uuid) {
  std::string text = hexLower(uuid);
  for (std::size_t dash : {8, 13, 18, 23}) text.insert(dash, 1, '-');
  return text;
}

}  // namespace vesk
