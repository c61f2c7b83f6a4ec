// RSA public keys and the verification of signatures.
#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "platform/crypto/Digest.h"

namespace vesk {

/// An RSA public key. Movable. Const operations are thread-safe.
class RSAPublicKey {
 public:
  /// Reads a SubjectPublicKeyInfo or a PKCS#1 RSAPublicKey. Returns nullopt if `der` is neither, has trailing
  /// bytes, or holds another kind of key.
  static std::optional<RSAPublicKey> fromDER(std::string_view der);

  /// Whether `signature` is an RSASSA-PKCS1-v1_5 signature by this key over a message with that SHA-1 digest.
  bool verifySHA1(const SHA1Digest& digest, std::string_view signature) const;

  /// Identifies this key object in log lines. Stays the same when the key is moved.
  const void* identity() const noexcept { return _key.get(); }

 private:
  struct Handle;
  struct FreeHandle {
    void operator()(Handle* handle) const noexcept;
  };
  explicit RSAPublicKey(Handle* handle) noexcept : _key(handle) {}

  std::unique_ptr<Handle, FreeHandle> _key;
};

}  // namespace vesk
