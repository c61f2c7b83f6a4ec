#include "tools/storebag/StorebagDocument.h"

#include <stdexcept>

#include "platform/crypto/Base64.h"
#include "platform/crypto/RSAPublicKey.h"
#include "platform/plist/PropertyList.h"
#include "tools/plist/XMLPropertyListWriter.h"

namespace vesk {

namespace {

std::string written(const Dictionary& dictionary) {
  auto text = writeXMLPropertyList(dictionary);
  if (!text)
    throw std::runtime_error(
        "the storebag holds what a property list can't carry (null, a control character, a date out of "
        "range, or "
        "too deep a nesting)");
  return *std::move(text);
}

std::string makeDocument(const std::string& bag, const std::string& signature) {
  return written(Dictionary{{"bag", base64Encode(bag)}, {"signature", base64Encode(signature)}});
}

std::optional<Dictionary> dictionaryIn(std::string_view bytes) {
  const auto root = parsePropertyList(bytes);
  const Dictionary* dictionary = root ? root->dictionary() : nullptr;
  return dictionary != nullptr ? std::optional(*dictionary) : std::nullopt;
}

StorebagVerdict verdictOn(const Dictionary& document, const std::optional<std::string>& bag,
                          std::string_view publicKeyDER) {
  auto signatureText = document.text("signature");
  if (!signatureText) return StorebagVerdict::SignatureMissing;
  auto key = RSAPublicKey::fromDER(publicKeyDER);
  if (!key) return StorebagVerdict::PublicKeyUnusable;
  auto signature = base64Decode(signatureText->view());
  if (!signature || signature->empty()) return StorebagVerdict::SignatureNoBase64;
  if (!document.text("bag")) return StorebagVerdict::BagMissing;
  if (!bag) return StorebagVerdict::BagNoBase64;
  return key->verifySHA1(sha1(*bag), *signature) ? StorebagVerdict::Valid
                                                 : StorebagVerdict::SignatureMismatch;
}

}  // namespace

std::string signStorebag(const Dictionary& payload, const SigningKey& key) {
  std::string bag = written(payload);
  return makeDocument(bag, key.sign(bag));
}

std::string signStorebagBadly(const Dictionary& payload, const SigningKey& key) {
  std::string bag = written(payload);
  return makeDocument(bag, key.sign(bag + " "));
}

std::string_view explain(StorebagVerdict verdict) {
  switch (verdict) {
    case StorebagVerdict::Valid:
      return "the signature is valid";
    case StorebagVerdict::NoPropertyList:
      return "the document is no property list with a dictionary";
    case StorebagVerdict::SignatureMissing:
      return "the document has no text \"signature\"";
    case StorebagVerdict::SignatureNoBase64:
      return "the signature is no base64 text";
    case StorebagVerdict::BagMissing:
      return "the document has no text \"bag\"";
    case StorebagVerdict::BagNoBase64:
      return "the bag is no base64 text";
    case StorebagVerdict::PublicKeyUnusable:
      return "the public key is no RSA key in DER form";
    case StorebagVerdict::SignatureMismatch:
      return "the signature does not fit: the bag was changed or signed with another key";
    case StorebagVerdict::PayloadUnreadable:
      return "the bag holds no property list with a dictionary";
  }
  return "";
}

StorebagInspection inspectStorebag(std::string_view documentBytes, std::string_view publicKeyDER) {
  StorebagInspection inspection;
  auto document = dictionaryIn(documentBytes);
  if (!document) return inspection;
  std::optional<std::string> bag;
  if (auto text = document->text("bag")) bag = base64Decode(text->view());
  if (bag) inspection.payload = dictionaryIn(*bag);
  inspection.verdict = verdictOn(*document, bag, publicKeyDER);
  if (inspection.isValid() && !inspection.payload) inspection.verdict = StorebagVerdict::PayloadUnreadable;
  return inspection;
}

}  // namespace vesk
