// Signed storebags, as a server sends them, and the key that signs them.
#pragma once

#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include <VeskReporting/values/Value.h>

struct evp_pkey_st;

namespace vesk {

/// An RSA private key. Immutable; thread-safe. Failures throw std::runtime_error with a message that names
/// the file or the step.
class SigningKey {
 public:
  /// Creates a key of 2048 bits.
  static SigningKey generate();
  /// Reads the PEM file at `path`.
  static SigningKey fromFile(const std::filesystem::path& path);
  /// Opens the key in `directory`, or creates it there if neither of its files exists.
  static SigningKey openOrCreate(const std::filesystem::path& directory);

  static std::filesystem::path privateKeyFile(const std::filesystem::path& directory) {
    return directory / "storebag-signing.key";
  }
  static std::filesystem::path publicKeyFile(const std::filesystem::path& directory) {
    return directory / "publicKey.der";
  }

  /// Writes the two files (the private one with mode 0600) and creates the directory if it is missing.
  /// Refuses to replace either file.
  void save(const std::filesystem::path& directory) const;

  std::string privateKeyPEM() const;
  /// The SubjectPublicKeyInfo in DER form, as in the client library's resource "publicKey.der".
  std::string publicKeyDER() const;

  /// The RSASSA-PKCS1-v1_5 signature with SHA-1 over `bytes`.
  std::string sign(std::string_view bytes) const;

 private:
  explicit SigningKey(std::shared_ptr<evp_pkey_st> key) : _key(std::move(key)) {}
  std::shared_ptr<evp_pkey_st> _key;
};

/// Returns an XML property list with the entries "bag" (the payload as a base64-encoded XML property list)
/// and "signature". Throws std::runtime_error if the payload holds a value that a property list can't
/// represent.
std::string signStorebag(const Dictionary& payload, const SigningKey& key);

/// Like `signStorebag`, but with an invalid signature, for testing how a daemon handles it.
std::string signStorebagBadly(const Dictionary& payload, const SigningKey& key);

struct StorebagInspection {
  std::string problem;  ///< why the document is not valid; empty if it is
  /// The bag's contents, whether or not the signature is valid.
  std::optional<Dictionary> payload;

  bool isValid() const { return problem.empty(); }
};

/// Verifies and decodes a document with the daemon's own parser and verification. Doesn't throw for any
/// `document` or key.
StorebagInspection inspectStorebag(std::string_view document, std::string_view publicKeyDER);

}  // namespace vesk
