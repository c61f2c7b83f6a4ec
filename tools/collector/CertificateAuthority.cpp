#include "tools/collector/CertificateAuthority.h"

#include <arpa/inet.h>

#include <stdexcept>

#include "tools/crypto/OpenSSLObjects.h"
#include "tools/files/WholeFile.h"

namespace vesk {

using namespace openssl;

namespace {

constexpr long kSecondsPerDay = 24L * 60 * 60;
constexpr long kAuthorityDays = 3650;

Key makeKey() { return checked(Key(EVP_EC_gen("P-256")), "make an EC key"); }

void setSerial(X509* certificate) {
  Number number(BN_new());
  require(number && BN_rand(number.get(), 127, BN_RAND_TOP_ANY, BN_RAND_BOTTOM_ANY) == 1 &&
              BN_to_ASN1_INTEGER(number.get(), X509_get_serialNumber(certificate)) != nullptr,
          "set a serial number");
}

/// Creates a certificate for `key` without issuer, extensions and signature. It is valid from an hour ago, so
/// that clients with a slow clock accept it.
Certificate startCertificate(EVP_PKEY* key, const char* commonName, long days) {
  Certificate certificate = checked(Certificate(X509_new()), "allocate a certificate");
  X509_set_version(certificate.get(), X509_VERSION_3);
  setSerial(certificate.get());
  X509_gmtime_adj(X509_getm_notBefore(certificate.get()), -60L * 60);
  X509_gmtime_adj(X509_getm_notAfter(certificate.get()), days * kSecondsPerDay);
  X509_NAME* name = X509_get_subject_name(certificate.get());
  const auto* text = reinterpret_cast<const unsigned char*>(commonName);
  require(X509_NAME_add_entry_by_txt(name, "CN", MBSTRING_UTF8, text, -1, -1, 0) == 1, "name a certificate");
  require(X509_set_pubkey(certificate.get(), key) == 1, "set a certificate's key");
  return certificate;
}

void extend(X509* certificate, X509* issuer, int kind, const std::string& value) {
  X509V3_CTX context;
  X509V3_set_ctx(&context, issuer, certificate, nullptr, nullptr, 0);
  Extension extension(X509V3_EXT_conf_nid(nullptr, &context, kind, value.c_str()));
  require(extension && X509_add_ext(certificate, extension.get(), -1) == 1, "extend a certificate");
}

void sign(X509* certificate, X509* issuer, EVP_PKEY* key) {
  require(X509_set_issuer_name(certificate, X509_get_subject_name(issuer)) == 1, "name an issuer");
  require(X509_sign(certificate, key, EVP_sha256()) > 0, "sign a certificate");
}

bool isAddress(const std::string& name) {
  unsigned char bytes[sizeof(in6_addr)];
  return ::inet_pton(AF_INET, name.c_str(), bytes) == 1 || ::inet_pton(AF_INET6, name.c_str(), bytes) == 1;
}

std::string alternativeNames(const std::vector<std::string>& furtherNames) {
  std::string names = "DNS:localhost,IP:127.0.0.1,IP:::1";
  for (const auto& name : furtherNames) {
    if (name.empty() || name.find_first_of(",\r\n ") != std::string::npos)
      throw std::runtime_error("no certificate can be made for the name '" + name + "'");
    names += (isAddress(name) ? ",IP:" : ",DNS:") + name;
  }
  return names;
}

}  // namespace

CertificateAuthority CertificateAuthority::generate() {
  Key key = makeKey();
  Certificate certificate =
      startCertificate(key.get(), "veskcollector development authority", kAuthorityDays);
  X509* self = certificate.get();
  extend(self, self, NID_basic_constraints, "critical,CA:TRUE,pathlen:0");
  extend(self, self, NID_key_usage, "critical,keyCertSign,cRLSign");
  extend(self, self, NID_subject_key_identifier, "hash");
  sign(self, self, key.get());
  return CertificateAuthority(toPEM(self), toPEM(key.get()));
}

CertificateAuthority CertificateAuthority::openOrCreate(const std::filesystem::path& directory) {
  auto certificatePath = certificateFile(directory);
  auto keyPath = keyFile(directory);
  if (!std::filesystem::exists(certificatePath) && !std::filesystem::exists(keyPath)) {
    CertificateAuthority fresh = generate();
    writeWholeFile(keyPath, fresh._key, 0600);
    writeWholeFile(certificatePath, fresh._certificate, 0644);
    return fresh;
  }
  CertificateAuthority kept(readWholeFile(certificatePath), readWholeFile(keyPath));
  Certificate certificate = certificateFromPEM(kept._certificate);
  Key key = privateKeyFromPEM(kept._key);
  if (!certificate) fail("use the certificate in " + certificatePath.string());
  if (!key) fail("use the key in " + keyPath.string());
  if (X509_check_private_key(certificate.get(), key.get()) != 1)
    throw std::runtime_error(keyPath.string() + " is not the key of " + certificatePath.string());
  if (X509_cmp_current_time(X509_get0_notAfter(certificate.get())) <= 0)
    throw std::runtime_error(certificatePath.string() + " has expired: remove it and " + keyPath.string());
  return kept;
}

TLSIdentity CertificateAuthority::issueServerIdentity(const std::vector<std::string>& furtherNames,
                                                      long days) const {
  Certificate authority = checked(certificateFromPEM(_certificate), "read the authority's certificate");
  Key authorityKey = checked(privateKeyFromPEM(_key), "read the authority's key");
  Key key = makeKey();
  Certificate certificate = startCertificate(key.get(), "localhost", days);
  X509* leaf = certificate.get();
  extend(leaf, authority.get(), NID_basic_constraints, "critical,CA:FALSE");
  extend(leaf, authority.get(), NID_key_usage, "critical,digitalSignature");
  extend(leaf, authority.get(), NID_ext_key_usage, "serverAuth");
  extend(leaf, authority.get(), NID_subject_alt_name, alternativeNames(furtherNames));
  extend(leaf, authority.get(), NID_authority_key_identifier, "keyid:always");
  sign(leaf, authority.get(), authorityKey.get());
  return {toPEM(leaf), toPEM(key.get())};
}

}  // namespace vesk
