// Verification of storebags.
#pragma once

#include <string_view>

#include "platform/crypto/RSAPublicKey.h"

namespace vesk {

/// Whether `signature` is the key's RSASSA-PKCS1-v1_5 signature with SHA-1 over `payload`.
bool verifyStorebagSignature(const RSAPublicKey& publicKey, std::string_view payload,
                             std::string_view signature);

}  // namespace vesk
