#include "storebag/StorebagSignature.h"

#include "platform/crypto/Digest.h"

namespace vesk {

bool verifyStorebagSignature(const RSAPublicKey& publicKey, std::string_view payload,
                             std::string_view signature) {
  return publicKey.verifySHA1(sha1(payload), signature);
}

}  // namespace vesk
