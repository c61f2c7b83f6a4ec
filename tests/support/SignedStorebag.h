// Storebags as their server sends them.
#pragma once

#include "platform/crypto/Base64.h"
#include "tests/support/TestSigningKey.h"
#include "tools/plist/XMLPropertyListWriter.h"

namespace vesk::test {

/// The outer document with `bag` and a signature over `signedBytes`.
inline Dictionary storebagDocument(const TestSigningKey& key, const std::string& bag,
                                   const std::string& signedBytes) {
  return {{"signature", base64Encode(key.sign(signedBytes))}, {"bag", base64Encode(bag)}};
}

inline std::string signedStorebag(const TestSigningKey& key, const Dictionary& payload) {
  const std::string bag = *writeXMLPropertyList(payload);
  return *writeXMLPropertyList(storebagDocument(key, bag, bag));
}

}  // namespace vesk::test
