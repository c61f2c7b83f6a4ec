// The signed document that a storebag server sends.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include <VeskReporting/values/Value.h>

namespace vesk {

/// The DER bytes of the RSA keys that storebags may be signed with.
using PublicKeys = std::vector<std::string>;

/// The outcome of verifying a document.
struct Verification {
  enum class Verdict : unsigned char {
    Good,
    SignatureMissing,
    SignatureWrong,  ///< none of the keys made it
    Unusable,        ///< no usable key, or the document is not of the expected form
  };
  Verdict verdict = Verdict::Unusable;
  Dictionary payload{};               ///< if good
  std::string key{};                  ///< if good: names the key that made the signature, see nameOfPublicKey
  const void* keyIdentity = nullptr;  ///< of the first key, if the signature is wrong
};

/// The first 16 hexadecimal digits of the SHA-256 of the key's file.
std::string nameOfPublicKey(std::string_view der);

/// Verifies the signature of a parsed document with any of the keys. Logs nothing.
Verification verifySignedDocument(const Dictionary& document, const PublicKeys& keys);

}  // namespace vesk
