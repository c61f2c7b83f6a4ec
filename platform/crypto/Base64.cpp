#include "platform/crypto/Base64.h"

#include <openssl/evp.h>

#include <cstddef>

namespace vesk {

namespace {

// OpenSSL takes lengths as int. Both values are multiples of their group's size.
constexpr std::size_t kBytesAtOnce = std::size_t{3} << 20;
constexpr std::size_t kCharactersAtOnce = std::size_t{4} << 20;

bool isAlphabet(char c) {
  return (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z') || (c >= '0' && c <= '9') || c == '+' || c == '/';
}

const unsigned char* input(std::string_view bytes) {
  return reinterpret_cast<const unsigned char*>(bytes.data());
}

}  // namespace

std::string base64Encode(std::string_view bytes) {
  // One byte more than the text, because OpenSSL ends each piece with a NUL.
  std::string text((bytes.size() + 2) / 3 * 4 + 1, '\0');
  std::size_t used = 0;
  while (!bytes.empty()) {
    auto piece = bytes.substr(0, kBytesAtOnce);
    int size = EVP_EncodeBlock(reinterpret_cast<unsigned char*>(text.data() + used), input(piece),
                               static_cast<int>(piece.size()));
    used += static_cast<std::size_t>(size);
    bytes.remove_prefix(piece.size());
  }
  text.resize(used);
  return text;
}

std::optional<std::string> base64Decode(std::string_view text) {
  std::string characters;
  characters.reserve(text.size());
  std::size_t padding = 0;
  for (char c : text) {
    if (c == '=') {
      ++padding;
    } else if (isAlphabet(c)) {
      if (padding > 0) return std::nullopt;
    } else {
      continue;
    }
    characters += c;
  }
  if (padding > 2 || characters.size() % 4 != 0) return std::nullopt;

  std::string bytes(characters.size() / 4 * 3, '\0');
  std::string_view rest = characters;
  std::size_t used = 0;
  while (!rest.empty()) {
    auto piece = rest.substr(0, kCharactersAtOnce);
    int size = EVP_DecodeBlock(reinterpret_cast<unsigned char*>(bytes.data() + used), input(piece),
                               static_cast<int>(piece.size()));
    if (size < 0) return std::nullopt;
    used += static_cast<std::size_t>(size);
    rest.remove_prefix(piece.size());
  }
  // OpenSSL counts the padding as bytes.
  bytes.resize(used - padding);
  return bytes;
}

}  // namespace vesk
