// Uploads whole files that clients hand over.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "backends/VeskReportingBackend.h"
#include "platform/files/LentFile.h"

namespace vesk {

/// Posts each file, compressed, to the server that the profile names, and removes it once the server's answer
/// says "success". The bytes come through the descriptor that the client passed, so nobody can have a file
/// uploaded that he could not read himself; the path only names it.
class UploadBackend final : public VeskReportingBackend {
 public:
  /// Bytes of the largest file.
  static constexpr std::uint64_t kMaximumFile = std::uint64_t{256} << 20;

  /// Nothing, and a line in the log, without a "post_url".
  static std::shared_ptr<UploadBackend> create(const std::string& name,
                                               const std::optional<Dictionary>& profile,
                                               const std::optional<Text>& productFamily,
                                               const BackendServices& services);

  /// Blocks until the server has answered, the transfer has failed or the daemon stops. True when the file
  /// was sent, whatever came of it; false when it was refused, and then it is as it was.
  bool uploadFileAtPath(const std::string& path, const std::string& extensionToken) override;

  std::optional<std::string> uploadURL() const;
  void setUploadURL(const std::optional<std::string>& url);

 private:
  UploadBackend(const std::string& name, const Dictionary& profile, const Text& productFamily,
                const BackendServices& services);

  bool upload(const std::string& path, const std::string& extensionToken, const std::string& uploadURL);
  /// The file's contents; nothing, and a line in the log, when it is refused.
  std::optional<std::string> contentsOf(const LentFile& file) const;
  /// The request but for its body; nothing when the profile's URL is of no use.
  std::optional<HTTPRequest> requestFor(const std::string& path, const std::string& uploadURL) const;
  /// Whether the server has the file.
  bool accepted(const HTTPResult& result, const std::string& uploadURL) const;

  std::optional<std::string> _uploadURL VESK_GUARDED_BY(_mutex);
};

}  // namespace vesk
