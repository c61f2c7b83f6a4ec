// An RSA key for tests.
#pragma once

#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <openssl/rsa.h>
#include <openssl/x509.h>

#include <cstddef>
#include <memory>
#include <string>
#include <string_view>

namespace vesk::test {

class TestSigningKey {
 public:
  explicit TestSigningKey(EVP_PKEY* key = EVP_RSA_gen(2048)) : _key(key) {}

  /// The public key as SubjectPublicKeyInfo.
  std::string publicKeyInfo() const {
    return encoded([this](unsigned char** out) { return i2d_PUBKEY(_key.get(), out); });
  }
  /// The public key in its type's own format: PKCS#1 for RSA.
  std::string bareKey() const {
    return encoded([this](unsigned char** out) { return i2d_PublicKey(_key.get(), out); });
  }

  std::string sign(std::string_view message, const EVP_MD* digest = EVP_sha1()) const {
    std::unique_ptr<EVP_MD_CTX, decltype(&EVP_MD_CTX_free)> context(EVP_MD_CTX_new(), EVP_MD_CTX_free);
    EXPECT_EQ(EVP_DigestSignInit(context.get(), nullptr, digest, nullptr, _key.get()), 1);
    std::string signature(1024, '\0');
    std::size_t size = signature.size();
    EXPECT_EQ(EVP_DigestSign(context.get(), reinterpret_cast<unsigned char*>(signature.data()), &size,
                             reinterpret_cast<const unsigned char*>(message.data()), message.size()),
              1);
    signature.resize(size);
    return signature;
  }

 private:
  struct Free {
    void operator()(EVP_PKEY* key) const { EVP_PKEY_free(key); }
  };
  template <class Encode>
  static std::string encoded(Encode encode) {
    unsigned char* bytes = nullptr;
    int size = encode(&bytes);
    std::string der(reinterpret_cast<char*>(bytes), static_cast<std::size_t>(size));
    OPENSSL_free(bytes);
    return der;
  }
  std::unique_ptr<EVP_PKEY, Free> _key;
};

}  // namespace vesk::test
