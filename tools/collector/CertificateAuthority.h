// A certificate authority of the collector's own, so that clients on this machine can verify it.
#pragma once

#include <filesystem>
#include <string>
#include <vector>

#include "tools/collector/HTTPServer.h"

namespace vesk {

/// Holds an EC P-256 authority key and issues server certificates. Immutable; thread-safe. Whatever fails
/// throws std::runtime_error with a message that names the file or the step.
class CertificateAuthority {
 public:
  /// A new authority that lives in memory only, valid for ten years.
  static CertificateAuthority generate();
  /// The authority kept in `directory` as "ca.pem" and "ca.key" (mode 0600); made there when neither exists.
  /// An expired one, or one file without the other, is refused rather than replaced: clients may trust it.
  static CertificateAuthority openOrCreate(const std::filesystem::path& directory);

  static std::filesystem::path certificateFile(const std::filesystem::path& directory) {
    return directory / "ca.pem";
  }
  static std::filesystem::path keyFile(const std::filesystem::path& directory) {
    return directory / "ca.key";
  }

  /// What clients are to trust (SSL_CERT_FILE).
  const std::string& certificate() const { return _certificate; }

  /// A fresh certificate, valid for so many days, for "localhost", 127.0.0.1, ::1 and the given further names
  /// or numeric addresses.
  TLSIdentity issueServerIdentity(const std::vector<std::string>& furtherNames = {}, long days = 365) const;

 private:
  CertificateAuthority(std::string certificate, std::string key)
      : _certificate(std::move(certificate)), _key(std::move(key)) {}

  std::string _certificate;  // PEM
  std::string _key;          // PEM
};

}  // namespace vesk
