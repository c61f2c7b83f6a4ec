// RSA public keys and the verification of signatures.
#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "platform/crypto/Digest.h"

namespace vesk {

/// An RSA public key. Movable; const use is safe from any thread.
class RSAPublicKey {
 public:
  /// Reads a SubjectPublicKeyInfo or a PKCS#1 RSAPublicKey. Nothing when `der` is neither, has anything
  /// behind it, or holds a key of another kind.
  static std::optional<RSAPublicKey> fromDER(std::string_view der);

  /// Whether `signature` is an RSASSA-PKCS1-v1_5 signature by this key over a message with that SHA-1 digest.
  bool verifySHA1(const SHA1Digest& digest, std::string_view signature) const;

  /// Tells this key object from others in a log line; stays the same when it is moved.
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
