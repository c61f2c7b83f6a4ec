// The collector's own certificate authority, so that clients on this machine can verify its certificates.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "tools/collector/HTTPServer.h"

namespace vesk {

/// Holds an EC P-256 authority key and issues server certificates. Immutable; thread-safe. Failures throw
/// std::runtime_error with a message that names the file or the step.
class CertificateAuthority {
 public:
  /// Creates an authority in memory, valid for ten years.
  static CertificateAuthority generate();
  /// Opens the authority stored in `directory` as "ca.pem" and "ca.key" (mode 0600), or creates it if neither
  /// file exists. Refuses an expired authority, or one file without the other, and does not replace it, since
  /// clients may trust it.
  static CertificateAuthority openOrCreate(const std::filesystem::path& directory);

  static std::filesystem::path certificateFile(const std::filesystem::path& directory) {
    return directory / "ca.pem";
  }
  static std::filesystem::path keyFile(const std::filesystem::path& directory) {
    return directory / "ca.key";
  }

  /// The certificate that clients should trust (SSL_CERT_FILE).
  const std::string& certificate() const { return _certificate; }

  /// Issues a new certificate, valid for `days` days, for "localhost", 127.0.0.1, ::1 and `furtherNames`,
  /// which may be names or numeric addresses.
  TLSIdentity issueServerIdentity(const std::vector<std::string>& furtherNames = {}, long days = 365) const;

 private:
  CertificateAuthority(std::string certificate, std::string key)
      : _certificate(std::move(certificate)), _key(std::move(key)) {}

  std::string _certificate;  // PEM
  std::string _key;          // PEM
};

}  // namespace vesk
