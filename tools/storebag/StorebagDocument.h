// The signed form of a storebag, as a server sends it.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "tools/storebag/SigningKey.h"

namespace vesk {

/// Returns an XML property list with the entries "bag" (the payload as a base64-encoded XML property list)
/// and "signature". Throws std::runtime_error if the payload holds a value that a property list can't
/// represent.
std::string signStorebag(const Dictionary& payload, const SigningKey& key);

/// Like `signStorebag`, but with an invalid signature, for testing how a daemon handles it.
std::string signStorebagBadly(const Dictionary& payload, const SigningKey& key);

enum class StorebagVerdict : unsigned char {
  Valid,
  NoPropertyList,     ///< the document is not a property list with a dictionary at its root
  SignatureMissing,   ///< there is no text under "signature"
  SignatureNoBase64,  ///< it is not base64, or it is empty
  BagMissing,         ///< there is no text under "bag"
  BagNoBase64,
  PublicKeyUnusable,  ///< the key is not an RSA public key in DER form
  SignatureMismatch,  ///< the signature was made over other bytes or with another key
  PayloadUnreadable,  ///< signed correctly, but not a property list with a dictionary at its root
};

/// A readable sentence about the verdict.
std::string_view explain(StorebagVerdict verdict);

struct StorebagInspection {
  StorebagVerdict verdict = StorebagVerdict::NoPropertyList;
  /// The bag's contents, whether or not the signature is valid.
  std::optional<Dictionary> payload;

  bool isValid() const { return verdict == StorebagVerdict::Valid; }
};

/// Verifies and decodes a document with the daemon's own parser and verification. Doesn't throw for any
/// `document` or key.
StorebagInspection inspectStorebag(std::string_view document, std::string_view publicKeyDER);

}  // namespace vesk
