#include "backends/upload/UploadBackend.h"

#include <cinttypes>

#include "backends/upload/UploadGate.h"
#include "platform/ipc/ExtensionTokens.h"
#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"
#include "storebag/StorebagProfile.h"
#include "util/URLQuery.h"

namespace vesk {

namespace {

constexpr char kDescription[] = "Tellvue MQRC log";

constexpr std::chrono::seconds kLeastTimeout{60};
// Others wait for the memory that a file occupies while it is read.
constexpr std::size_t kLeastRead = std::size_t{32} << 10;  // bytes a second
// A large file may take a day on a slow connection, but a server that accepts less than this hangs.
constexpr std::size_t kLeastSent = std::size_t{1} << 10;

std::chrono::seconds timeoutFor(std::size_t bytes, std::size_t bytesPerSecond) {
  return kLeastTimeout + std::chrono::seconds(bytes / bytesPerSecond);
}

/// Removes trailing slashes, which belong to no component of the path.
std::string withoutTrailingSlashes(const std::string& path) {
  return path.substr(0, path.find_last_not_of('/') + 1);
}

std::string lastComponentOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }

const char* wordsFor(const Error& readError) {
  switch (readError.kind) {
    case Error::Kind::TimedOut:
      return "Input file was not read in time";
    case Error::Kind::Malformed:
      return "Input file has shrunk while it was uploaded";
    default:
      return "Input file is empty";
  }
}

}  // namespace

std::shared_ptr<UploadBackend> UploadBackend::create(const std::string& name,
                                                     const std::optional<Dictionary>& profile,
                                                     const BackendIdentity& identity,
                                                     const BackendServices& services) {
  auto postURL = profile ? profileText(name, *profile, "post_url") : std::nullopt;
  if (!postURL) {
    VESK_LOG_ERROR("UploadBackend(initWithName): can't resolve upload post URL.");
    return nullptr;
  }
  std::shared_ptr<UploadBackend> backend(new UploadBackend(name, *profile, identity, services));
  MutexLock lock(backend->_mutex);
  backend->_uploadURL = postURL;
  backend->_displayURL = profileText(name, *profile, "display_url");
  return backend;
}

UploadBackend::UploadBackend(const std::string& name, const Dictionary& profile,
                             const BackendIdentity& identity, const BackendServices& services)
    : VeskReportingBackend(name, profile, identity, services) {}

std::optional<std::string> UploadBackend::uploadURL() const {
  MutexLock lock(_mutex);
  return _uploadURL;
}

void UploadBackend::setUploadURL(const std::optional<std::string>& url) {
  MutexLock lock(_mutex);
  _uploadURL = url;
}

bool UploadBackend::uploadFileAtPath(const std::string& path, const std::string& extensionToken) {
  VESK_LOG_DEBUG("UploadBackend(uploadFileAtPath): Uploading file %s", path.c_str());
  auto url = uploadURL();
  return url && upload(withoutTrailingSlashes(path), extensionToken, *url);
}

bool UploadBackend::upload(const std::string& path, const std::string& extensionToken,
                           const std::string& uploadURL) {
  ExtensionHandle handle = ExtensionTokens::shared().consume(extensionToken);
  const LentFile file(std::move(handle.descriptor));
  if (!file.isRegularAt(path)) {
    VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): Only upload a regular file.");
    return false;
  }
  if (file.size() > kMaximumFile) {
    VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): Input file has %" PRIu64 " bytes, more than the %" PRIu64
                   " that can be uploaded",
                   file.size(), kMaximumFile);
    return false;
  }
  if (file.size() == 0) {
    VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): Input file is empty");
    return false;
  }
  auto pass = _services.uploads->enter(handle.user, 2 * static_cast<std::size_t>(file.size()));
  if (!pass) {
    VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): Too many uploads are under way");
    return false;
  }
  auto compressed = compressedContentsOf(file);
  if (!compressed) return false;

  auto request = requestFor(path, uploadURL);
  if (!request) {
    VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): Unable to create URL request");
    return false;
  }
  request->timeout = timeoutFor(compressed->size, kLeastSent);
  request->leastBytesPerSecond = kLeastSent;
  request->body.assign(compressed->bytes.get(), compressed->size);
  compressed.reset();
  pass->shrinkTo(request->body.size());
  HTTPResult result = _services.uploads->perform(_services.http, std::move(*request));
  if (accepted(result, uploadURL) && !file.removeFrom(path, handle.user)) {
    VESK_LOG_DEBUG("UploadBackend(uploadFileAtPath): Left in its place: %s", path.c_str());
  }
  return true;
}

std::optional<CompressedBytes> UploadBackend::compressedContentsOf(const LentFile& file) const {
  // A file system may be slow on purpose, and others wait for the memory that this file occupies.
  const auto deadline = std::chrono::steady_clock::now() + timeoutFor(file.size(), kLeastRead);
  const auto contents =
      file.read([&] { return _services.uploads->isOpen() && std::chrono::steady_clock::now() < deadline; });
  if (contents) return compressToBuffer(true, *contents);
  VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): %s", wordsFor(contents.error()));
  return std::nullopt;
}

std::optional<HTTPRequest> UploadBackend::requestFor(const std::string& path,
                                                     const std::string& uploadURL) const {
  HTTPRequest request;
  request.method = "POST";
  request.url = uploadURL + "?uuid=" + _identity._udid + "&sequence=" + std::to_string(_identity._sessionID) +
                "&description=" + encodedForURLQuery(kDescription) +
                "%20(Uploaded%20by%20ZKS)&filename=" + encodedForURLQuery(lastComponentOf(path) + ".gz") +
                "&raw=true";
  if (!isWebURL(request.url)) return std::nullopt;
  request.headers = {{"Content-Type", "application/octet-stream"}, {"Content-Encoding", "gzip"}};
  return request;
}

bool UploadBackend::accepted(const HTTPResult& result, const std::string& uploadURL) const {
  if (result.error || !result.response) {
    VESK_LOG_ERROR("UploadBackend(uploadFileAtPath): post %s",
                   result.error ? result.error->description.c_str() : "(null)");
    _outcomes->count("upload", DropReason::TransportError, 1, [&] { return Dictionary{{"url", uploadURL}}; });
    return false;
  }
  if (_outcomes->isWatched()) {
    _outcomes->show("upload", "sent", {{"url", uploadURL}, {"httpStatus", result.response->status}},
                    result.response->body);
  }
  const std::string& answer = result.response->body;
  const bool isText = isValidUTF8(answer);
  VESK_LOG_DEBUG("UploadBackend(uploadFileAtPath): sending to |%s|, Json output: %s", uploadURL.c_str(),
                 isText ? answer.c_str() : "(null)");
  return isText && answer.find("success") != std::string::npos;
}

}  // namespace vesk
