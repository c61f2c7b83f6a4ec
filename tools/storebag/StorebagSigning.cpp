#include "tools/storebag/StorebagSigning.h"

#include <openssl/rsa.h>

#include <stdexcept>

#include "platform/crypto/Base64.h"
#include "platform/crypto/RSAPublicKey.h"
#include "platform/plist/PropertyList.h"
#include "tools/crypto/OpenSSLObjects.h"
#include "tools/files/WholeFile.h"
#include "tools/plist/XMLPropertyListWriter.h"

namespace vesk {

using namespace openssl;

namespace {

std::string written(const Dictionary& dictionary) {
  auto text = writeXMLPropertyList(dictionary);
  if (!text)
    throw std::runtime_error(
        "the storebag holds what a property list can't carry (null, a control character, a date out of "
        "range, or too deep a nesting)");
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

/// Why the bag can't be trusted; empty if it can.
std::string problemOf(const Dictionary& document, const std::optional<std::string>& bag,
                      std::string_view publicKeyDER) {
  auto signatureText = document.text("signature");
  if (!signatureText) return "the document has no text \"signature\"";
  auto key = RSAPublicKey::fromDER(publicKeyDER);
  if (!key) return "the public key is no RSA key in DER form";
  auto signature = base64Decode(signatureText->view());
  if (!signature || signature->empty()) return "the signature is no base64 text";
  if (!document.text("bag")) return "the document has no text \"bag\"";
  if (!bag) return "the bag is no base64 text";
  if (!key->verifySHA1(sha1(*bag), *signature))
    return "the signature does not fit: the bag was changed or signed with another key";
  return dictionaryIn(*bag) ? "" : "the bag holds no property list with a dictionary";
}

}  // namespace

SigningKey SigningKey::generate() {
  constexpr unsigned kBits = 2048;
  return SigningKey(checked(Key(EVP_RSA_gen(kBits)), "make an RSA key"));
}

SigningKey SigningKey::fromFile(const std::filesystem::path& path) {
  const std::string pem = readWholeFile(path);
  try {
    Key key = checked(privateKeyFromPEM(pem), "read a private key");
    if (EVP_PKEY_is_a(key.get(), "RSA") != 1) throw std::runtime_error("can't sign with what is no RSA key");
    return SigningKey(std::move(key));
  } catch (const std::runtime_error& error) {
    throw std::runtime_error(path.string() + ": " + error.what());
  }
}

SigningKey SigningKey::openOrCreate(const std::filesystem::path& directory) {
  auto privatePath = privateKeyFile(directory);
  auto publicPath = publicKeyFile(directory);
  if (!std::filesystem::exists(privatePath) && !std::filesystem::exists(publicPath)) {
    SigningKey fresh = generate();
    fresh.save(directory);
    return fresh;
  }
  SigningKey kept = fromFile(privatePath);
  if (readWholeFile(publicPath) != kept.publicKeyDER())
    throw std::runtime_error(publicPath.string() + " is not the public key of " + privatePath.string());
  return kept;
}

void SigningKey::save(const std::filesystem::path& directory) const {
  for (const auto& path : {privateKeyFile(directory), publicKeyFile(directory)})
    if (std::filesystem::exists(path)) throw std::runtime_error(path.string() + " exists already");
  if (!directory.empty()) std::filesystem::create_directories(directory);
  writeWholeFile(privateKeyFile(directory), privateKeyPEM(), 0600);
  writeWholeFile(publicKeyFile(directory), publicKeyDER(), 0644);
}

std::string SigningKey::privateKeyPEM() const { return toPEM(_key.get()); }

std::string SigningKey::publicKeyDER() const {
  unsigned char* bytes = nullptr;
  int size = i2d_PUBKEY(_key.get(), &bytes);
  require(size > 0, "write a public key");
  std::string der(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(size));
  OPENSSL_free(bytes);
  return der;
}

std::string SigningKey::sign(std::string_view bytes) const {
  DigestContext context = checked(DigestContext(EVP_MD_CTX_new()), "allocate a digest");
  const auto* data = reinterpret_cast<const unsigned char*>(bytes.data());
  require(EVP_DigestSignInit(context.get(), nullptr, EVP_sha1(), nullptr, _key.get()) == 1,
          "start a signature");
  std::size_t size = 0;
  require(EVP_DigestSign(context.get(), nullptr, &size, data, bytes.size()) == 1, "size a signature");
  std::string signature(size, '\0');
  auto* out = reinterpret_cast<unsigned char*>(signature.data());
  require(EVP_DigestSign(context.get(), out, &size, data, bytes.size()) == 1, "sign");
  signature.resize(size);
  return signature;
}

std::string signStorebag(const Dictionary& payload, const SigningKey& key) {
  std::string bag = written(payload);
  return makeDocument(bag, key.sign(bag));
}

std::string signStorebagBadly(const Dictionary& payload, const SigningKey& key) {
  std::string bag = written(payload);
  return makeDocument(bag, key.sign(bag + " "));
}

StorebagInspection inspectStorebag(std::string_view documentBytes, std::string_view publicKeyDER) {
  auto document = dictionaryIn(documentBytes);
  if (!document) return {"the document is no property list with a dictionary", {}};
  std::optional<std::string> bag;
  if (auto text = document->text("bag")) bag = base64Decode(text->view());
  return {problemOf(*document, bag, publicKeyDER), bag ? dictionaryIn(*bag) : std::nullopt};
}

}  // namespace vesk
