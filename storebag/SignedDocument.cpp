#include "storebag/SignedDocument.h"

#include <algorithm>

#include "platform/crypto/Base64.h"
#include "platform/crypto/RSAPublicKey.h"
#include "platform/plist/PropertyList.h"
#include "storebag/StorebagSignature.h"

namespace vesk {

using Verdict = Verification::Verdict;

Verification verifySignedDocument(const Dictionary& document, const PublicKeys& keys) {
  const auto signatureText = document.text("signature");
  if (!signatureText) return {.verdict = Verdict::SignatureMissing};

  std::vector<RSAPublicKey> publicKeys;
  for (const std::string& der : keys) {
    if (auto key = RSAPublicKey::fromDER(der)) publicKeys.push_back(std::move(*key));
  }
  const auto signature = base64Decode(signatureText->view());
  const auto bagText = document.text("bag");
  const auto bag = bagText ? base64Decode(bagText->view()) : std::nullopt;
  if (publicKeys.empty() || !signature || !bag) return {};

  const bool isSigned = std::any_of(publicKeys.begin(), publicKeys.end(), [&](const RSAPublicKey& key) {
    return verifyStorebagSignature(key, *bag, *signature);
  });
  if (!isSigned) return {.verdict = Verdict::SignatureWrong, .keyIdentity = publicKeys.front().identity()};

  const auto payload = parsePropertyList(*bag);
  if (!payload || !payload->dictionary()) return {};
  return {.verdict = Verdict::Good, .payload = *payload->dictionary()};
}

}  // namespace vesk
