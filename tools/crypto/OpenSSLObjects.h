// Owners of the OpenSSL objects that the tools use, and conversions from and to PEM. Include in sources only.
#pragma once

#include <openssl/bio.h>
#include <openssl/evp.h>
#include <openssl/x509v3.h>

#include <memory>
#include <string>

namespace vesk::openssl {

template <auto release>
struct Releasing {
  template <class T>
  void operator()(T* object) const {
    release(object);
  }
};

using Key = std::unique_ptr<EVP_PKEY, Releasing<&EVP_PKEY_free>>;
using Certificate = std::unique_ptr<X509, Releasing<&X509_free>>;
using Extension = std::unique_ptr<X509_EXTENSION, Releasing<&X509_EXTENSION_free>>;
using Number = std::unique_ptr<BIGNUM, Releasing<&BN_free>>;
using DigestContext = std::unique_ptr<EVP_MD_CTX, Releasing<&EVP_MD_CTX_free>>;

/// Throws std::runtime_error "can't <step>: <the library's reason>".
[[noreturn]] void fail(const std::string& step);

inline void require(bool done, const char* step) {
  if (!done) fail(step);
}

template <class Pointer>
Pointer checked(Pointer pointer, const char* step) {
  if (!pointer) fail(step);
  return pointer;
}

std::string toPEM(X509* certificate);
std::string toPEM(EVP_PKEY* privateKey);
/// Null if the text contains none.
Certificate certificateFromPEM(const std::string& text);
Key privateKeyFromPEM(const std::string& text);

}  // namespace vesk::openssl
