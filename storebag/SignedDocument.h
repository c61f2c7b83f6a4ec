// The signed document that a storebag server sends.
#pragma once

#include <string>
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
  const void* keyIdentity = nullptr;  ///< of the first key, if the signature is wrong
};

/// Verifies the signature of a parsed document with any of the keys. Logs nothing.
Verification verifySignedDocument(const Dictionary& document, const PublicKeys& keys);

}  // namespace vesk
