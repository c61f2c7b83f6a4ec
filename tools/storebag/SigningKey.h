// The key that storebags are signed with.
#pragma once

#include <filesystem>
#include <memory>
#include <string>
#include <string_view>

namespace vesk {

/// An RSA private key. Immutable; thread-safe. Failures throw std::runtime_error with a message that names
/// the file or the step.
class SigningKey {
 public:
  /// Creates a key of 2048 bits.
  static SigningKey generate();
  static SigningKey fromPEM(const std::string& pem);
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
  struct Handle;
  explicit SigningKey(std::shared_ptr<const Handle> handle) : _handle(std::move(handle)) {}
  std::shared_ptr<const Handle> _handle;
};

}  // namespace vesk
