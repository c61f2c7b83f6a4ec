#include "platform/crypto/Digest.h"

#include <openssl/evp.h>

#include <memory>
#include <stdexcept>
#include <string>

namespace vesk {

namespace {

// Fetched once: fetching by name costs several times as much as the digest of a short text.
const EVP_MD* fetchDigest(const char* name) {
  EVP_MD* digest = EVP_MD_fetch(nullptr, name, nullptr);
  if (!digest) throw std::runtime_error(std::string("no digest ") + name);
  return digest;
}

EVP_MD_CTX* threadContext() {
  struct Free {
    void operator()(EVP_MD_CTX* context) const noexcept { EVP_MD_CTX_free(context); }
  };
  thread_local std::unique_ptr<EVP_MD_CTX, Free> context(EVP_MD_CTX_new());
  if (!context) throw std::runtime_error("no digest context");
  return context.get();
}

template <std::size_t Size>
std::array<unsigned char, Size> digestOf(std::string_view bytes, const EVP_MD* digest) {
  std::array<unsigned char, Size> result;
  EVP_MD_CTX* context = threadContext();
  if (EVP_DigestInit_ex2(context, digest, nullptr) != 1 ||
      EVP_DigestUpdate(context, bytes.data(), bytes.size()) != 1 ||
      EVP_DigestFinal_ex(context, result.data(), nullptr) != 1) {
    throw std::runtime_error("digest failed");
  }
  return result;
}

}  // namespace

SHA1Digest sha1(std::string_view bytes) {
  static const EVP_MD* digest = fetchDigest("SHA1");
  return digestOf<20>(bytes, digest);
}

SHA256Digest sha256(std::string_view bytes) {
  static const EVP_MD* digest = fetchDigest("SHA256");
  return digestOf<32>(bytes, digest);
}

}  // namespace vesk
