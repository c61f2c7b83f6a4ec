// The signed form of a storebag, as a server sends it.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>
#include "tools/storebag/SigningKey.h"

namespace vesk {

/// The XML property list with the entries "bag" (the payload, itself an XML property list, as base64) and
/// "signature". Throws std::runtime_error when the payload holds what a property list can't carry.
std::string signStorebag(const Dictionary& payload, const SigningKey& key);

/// The same with a signature over other bytes, for trying out what a daemon makes of it.
std::string signStorebagBadly(const Dictionary& payload, const SigningKey& key);

enum class StorebagVerdict : unsigned char {
  Valid,
  NoPropertyList,     ///< the document is no property list with a dictionary at its root
  SignatureMissing,   ///< there is no text "signature"
  SignatureNoBase64,  ///< or it decodes to nothing
  BagMissing,         ///< there is no text "bag"
  BagNoBase64,
  PublicKeyUnusable,  ///< the key is no RSA public key in DER form
  SignatureMismatch,  ///< the signature was made over other bytes or with another key
  PayloadUnreadable,  ///< signed well, but no property list with a dictionary at its root
};

/// A sentence for a person.
std::string_view explain(StorebagVerdict verdict);

struct StorebagInspection {
  StorebagVerdict verdict = StorebagVerdict::NoPropertyList;
  /// What the bag holds, whether or not the signature fits.
  std::optional<Dictionary> payload;

  bool isValid() const { return verdict == StorebagVerdict::Valid; }
};

/// Verifies and takes apart a document, with the daemon's own parser and verification. Never throws on
/// anything in `document` or the key.
StorebagInspection inspectStorebag(std::string_view document, std::string_view publicKeyDER);

}  // namespace vesk
