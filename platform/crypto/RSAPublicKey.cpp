#include "platform/crypto/RSAPublicKey.h"

#include <openssl/err.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <algorithm>
#include <array>
#include <limits>
#include <string>

namespace vesk {

namespace {

// The DigestInfo of SHA-1 without the digest.
constexpr std::array<unsigned char, 15> kSHA1DigestInfo = {0x30, 0x21, 0x30, 0x09, 0x06, 0x05, 0x2b, 0x0e,
                                                           0x03, 0x02, 0x1a, 0x05, 0x00, 0x04, 0x14};

struct FreeKey {
  void operator()(EVP_PKEY* key) const noexcept { EVP_PKEY_free(key); }
};
struct FreeContext {
  void operator()(EVP_PKEY_CTX* context) const noexcept { EVP_PKEY_CTX_free(context); }
};
using KeyPointer = std::unique_ptr<EVP_PKEY, FreeKey>;

// Errors are returned as results. OpenSSL's error queue is cleared so that it doesn't affect other callers on
// this thread.
struct ClearErrors {
  ~ClearErrors() { ERR_clear_error(); }
};

template <class Decode>
KeyPointer decodeWhole(std::string_view der, Decode decode) {
  auto* at = reinterpret_cast<const unsigned char*>(der.data());
  const auto* end = at + der.size();
  KeyPointer key(decode(&at, static_cast<long>(der.size())));
  if (!key || at != end || EVP_PKEY_get_base_id(key.get()) != EVP_PKEY_RSA) return nullptr;
  return key;
}

}  // namespace

// Handle is EVP_PKEY under another name, so that our header doesn't include OpenSSL's.
void RSAPublicKey::FreeHandle::operator()(Handle* handle) const noexcept {
  EVP_PKEY_free(reinterpret_cast<EVP_PKEY*>(handle));
}

std::optional<RSAPublicKey> RSAPublicKey::fromDER(std::string_view der) {
  ClearErrors clear;
  if (der.empty() || der.size() > std::numeric_limits<int>::max()) return std::nullopt;
  auto key =
      decodeWhole(der, [](const unsigned char** at, long size) { return d2i_PUBKEY(nullptr, at, size); });
  if (!key) {
    key = decodeWhole(der, [](const unsigned char** at, long size) {
      return d2i_PublicKey(EVP_PKEY_RSA, nullptr, at, size);
    });
  }
  if (!key) return std::nullopt;
  return RSAPublicKey(reinterpret_cast<Handle*>(key.release()));
}

bool RSAPublicKey::verifySHA1(const SHA1Digest& digest, std::string_view signature) const {
  // Recovers the signed block and compares all of it. Setting SHA-1 as the signature digest would fail on
  // systems whose policy forbids SHA-1 signatures.
  ClearErrors clear;
  auto* key = reinterpret_cast<EVP_PKEY*>(_key.get());
  std::unique_ptr<EVP_PKEY_CTX, FreeContext> context(EVP_PKEY_CTX_new_from_pkey(nullptr, key, nullptr));
  if (!context || EVP_PKEY_verify_recover_init(context.get()) != 1 ||
      EVP_PKEY_CTX_set_rsa_padding(context.get(), RSA_PKCS1_PADDING) != 1) {
    return false;
  }
  std::string block(static_cast<std::size_t>(EVP_PKEY_get_size(key)), '\0');
  std::size_t size = block.size();
  if (signature.size() != block.size()) return false;
  if (EVP_PKEY_verify_recover(context.get(), reinterpret_cast<unsigned char*>(block.data()), &size,
                              reinterpret_cast<const unsigned char*>(signature.data()),
                              signature.size()) != 1) {
    return false;
  }
  if (size != kSHA1DigestInfo.size() + digest.size()) return false;
  auto* bytes = reinterpret_cast<const unsigned char*>(block.data());
  return std::equal(kSHA1DigestInfo.begin(), kSHA1DigestInfo.end(), bytes) &&
         std::equal(digest.begin(), digest.end(), bytes + kSHA1DigestInfo.size());
}

}  // namespace vesk
