// The backend that uploads whole files for clients.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "platform/files/LentFile.h"
#include "util/Gzip.h"

namespace vesk {

/// Posts each file, compressed, to the server in the profile, and removes the file once the server has
/// answered "success". The bytes are read through the descriptor that the client passed, so clients can only
/// upload files that they can read; the path only names the file.
class UploadBackend final : public VeskReportingBackend {
 public:
  /// Limit on the size of a file in bytes.
  static constexpr std::uint64_t kMaximumFile = std::uint64_t{256} << 20;

  /// Returns null, with a line in the log, if the profile has no "post_url".
  static std::shared_ptr<UploadBackend> create(const std::string& name,
                                               const std::optional<Dictionary>& profile,
                                               const BackendIdentity& identity,
                                               const BackendServices& services);

  /// Blocks until the server has answered, the transfer has failed or the daemon stops. Returns true if the
  /// file was sent, regardless of the outcome. Returns false if it was refused; the file is unchanged then.
  bool uploadFileAtPath(const std::string& path, const std::string& extensionToken) override;

  std::optional<std::string> uploadURL() const;
  void setUploadURL(const std::optional<std::string>& url);

 private:
  UploadBackend(const std::string& name, const Dictionary& profile, const BackendIdentity& identity,
                const BackendServices& services);

  bool upload(const std::string& path, const std::string& extensionToken, const std::string& uploadURL);
  /// Returns nullopt, with a line in the log, if the file is refused.
  std::optional<CompressedBytes> compressedContentsOf(const LentFile& file) const;
  /// The request without its body; nullopt if the profile's URL is unusable.
  std::optional<HTTPRequest> requestFor(const std::string& path, const std::string& uploadURL) const;
  /// Whether the server has accepted the file.
  bool accepted(const HTTPResult& result, const std::string& uploadURL) const;

  std::optional<std::string> _uploadURL VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
