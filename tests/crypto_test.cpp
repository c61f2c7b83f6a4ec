// Base64, RSA signatures and UUIDs.
#include <gtest/gtest.h>

#include "platform/crypto/Base64.h"
#include "platform/crypto/Digest.h"
#include "platform/crypto/RSAPublicKey.h"
#include "platform/crypto/UUID.h"
#include "tests/support/TestSigningKey.h"

namespace vesk::test {
namespace {

TEST(Base64, MatchesPublishedVectorsBothWays) {
  const std::pair<std::string, std::string> cases[] = {
      {"", ""},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {std::string(3'000, '\xff'), std::string(4'000, '/')}};  // no line breaks
  for (const auto& [plain, text] : cases) {
    EXPECT_EQ(base64Encode(plain), text);
    EXPECT_EQ(base64Decode(text), plain);
  }
}

TEST(Base64, SkipsWhatIsOutsideTheAlphabetAndTellsWhatIsNone) {
  EXPECT_EQ(base64Decode("Zm9v\r\n\t Ym\xc3\xa4-_Fy!"), "foobar");
  for (const char* text : {"Z", "Zg", "Zg=", "Zm9", "Zg===", "====", "Zg==Zg==", "Z=g=", "=Zg="}) {
    EXPECT_FALSE(base64Decode(text)) << text;
  }
}

TEST(UUID, IsRandomVersionFour) {
  const auto text = uuidText(makeUUID());
  EXPECT_NE(text, uuidText(makeUUID()));
  EXPECT_EQ(text[14], '4');
  EXPECT_NE(std::string("89ab").find(text[19]), std::string::npos);
  EXPECT_EQ(uuidText({0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 255}),
            "00010203-0405-0607-0809-0a0b0c0d0eff");
}

TEST(RSAPublicKey, VerifiesItsOwnSignatureOnlyFromEitherForm) {
  TestSigningKey signer;
  const auto signature = signer.sign("payload");
  auto broken = signature;
  broken.back() = static_cast<char>(broken.back() ^ 1);
  for (const auto& der : {signer.publicKeyInfo(), signer.bareKey()}) {
    auto key = RSAPublicKey::fromDER(der);
    ASSERT_TRUE(key);
    EXPECT_TRUE(key->verifySHA1(sha1("payload"), signature));
    EXPECT_FALSE(key->verifySHA1(sha1("payloaD"), signature));
    for (const auto& other : {std::string(), signature.substr(1), signature + "x", broken,
                              signer.sign("payload", EVP_sha256()), TestSigningKey().sign("payload")})
      EXPECT_FALSE(key->verifySHA1(sha1("payload"), other));
    EXPECT_FALSE(RSAPublicKey::fromDER(der + "x"));
  }
  EXPECT_FALSE(RSAPublicKey::fromDER(TestSigningKey(EVP_EC_gen("P-256")).publicKeyInfo()));
}

}  // namespace
}  // namespace vesk::test
