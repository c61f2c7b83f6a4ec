#include "platform/crypto/UUID.h"

#include <openssl/rand.h>

#include <cstddef>
#include <stdexcept>

namespace vesk {

UUIDBytes makeUUID() {
  UUIDBytes uuid;
  if (RAND_bytes(uuid.data(), static_cast<int>(uuid.size())) != 1) {
    throw std::runtime_error("no random bytes");
  }
  uuid[6] = static_cast<unsigned char>((uuid[6] & 0x0f) | 0x40);  // version 4: random
  uuid[8] = static_cast<unsigned char>((uuid[8] & 0x3f) | 0x80);  // the standard variant
  return uuid;
}

std::string uuidText(const UUIDBytes& uuid) {
  static constexpr char kDigits[] = "0123456789ABCDEF";
  std::string text;
  text.reserve(36);
  for (std::size_t i = 0; i < uuid.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    text += kDigits[uuid[i] >> 4];
    text += kDigits[uuid[i] & 15];
  }
  return text;
}

}  // namespace vesk
