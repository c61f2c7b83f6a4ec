#include "storebag/SignedDocument.h"

#include <algorithm>

#include "platform/crypto/Base64.h"
#include "platform/crypto/Digest.h"
#include "platform/crypto/RSAPublicKey.h"
#include "platform/plist/PropertyList.h"
#include "platform/text/ASCII.h"
#include "storebag/StorebagSignature.h"

namespace vesk {

using Verdict = Verification::Verdict;

std::string nameOfPublicKey(std::string_view der) { return hexLower(sha256(der)).substr(0, 16); }

Verification verifySignedDocument(const Dictionary& document, const PublicKeys& keys) {
  const auto signatureText = document.text("signature");
  if (!signatureText) return {.verdict = Verdict::SignatureMissing};

  std::vector<std::pair<RSAPublicKey, std::string_view>> publicKeys;
  for (const std::string& der : keys) {
    if (auto key = RSAPublicKey::fromDER(der)) publicKeys.emplace_back(std::move(*key), der);
  }
  const auto signature = base64Decode(signatureText->view());
  const auto bagText = document.text("bag");
  const auto bag = bagText ? base64Decode(bagText->view()) : std::nullopt;
  if (publicKeys.empty() || !signature || !bag) return {};

  const auto signer = std::find_if(publicKeys.begin(), publicKeys.end(), [&](const auto& key) {
    return verifyStorebagSignature(key.first, *bag, *signature);
  });
  if (signer == publicKeys.end())
    return {.verdict = Verdict::SignatureWrong, .keyIdentity = publicKeys.front().first.identity()};

  const auto payload = parsePropertyList(*bag);
  if (!payload || !payload->dictionary()) return {};
  return {
      .verdict = Verdict::Good, .payload = *payload->dictionary(), .key = nameOfPublicKey(signer->second)};
}

}  // namespace vesk
