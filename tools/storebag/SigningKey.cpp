#include "tools/storebag/SigningKey.h"

#include <openssl/rsa.h>

#include <stdexcept>

#include "tools/crypto/OpenSSLObjects.h"
#include "tools/files/WholeFile.h"

namespace vesk {

using namespace openssl;

struct SigningKey::Handle {
  Key key;
};

SigningKey SigningKey::generate() {
  constexpr unsigned kBits = 2048;
  return SigningKey(std::make_shared<Handle>(Handle{checked(Key(EVP_RSA_gen(kBits)), "make an RSA key")}));
}

SigningKey SigningKey::fromPEM(const std::string& pem) {
  Key key = checked(privateKeyFromPEM(pem), "read a private key");
  if (EVP_PKEY_is_a(key.get(), "RSA") != 1) throw std::runtime_error("can't sign with what is no RSA key");
  return SigningKey(std::make_shared<Handle>(Handle{std::move(key)}));
}

SigningKey SigningKey::fromFile(const std::filesystem::path& path) {
  std::string pem = readWholeFile(path);
  try {
    return fromPEM(pem);
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

std::string SigningKey::privateKeyPEM() const { return toPEM(_handle->key.get()); }

std::string SigningKey::publicKeyDER() const {
  unsigned char* bytes = nullptr;
  int size = i2d_PUBKEY(_handle->key.get(), &bytes);
  require(size > 0, "write a public key");
  std::string der(reinterpret_cast<const char*>(bytes), static_cast<std::size_t>(size));
  OPENSSL_free(bytes);
  return der;
}

std::string SigningKey::sign(std::string_view bytes) const {
  DigestContext context = checked(DigestContext(EVP_MD_CTX_new()), "allocate a digest");
  const auto* data = reinterpret_cast<const unsigned char*>(bytes.data());
  require(EVP_DigestSignInit(context.get(), nullptr, EVP_sha1(), nullptr, _handle->key.get()) == 1,
          "start a signature");
  std::size_t size = 0;
  require(EVP_DigestSign(context.get(), nullptr, &size, data, bytes.size()) == 1, "size a signature");
  std::string signature(size, '\0');
  auto* out = reinterpret_cast<unsigned char*>(signature.data());
  require(EVP_DigestSign(context.get(), out, &size, data, bytes.size()) == 1, "sign");
  signature.resize(size);
  return signature;
}

}  // namespace vesk
