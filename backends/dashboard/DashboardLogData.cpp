// Uploads log data and sends a message with its location.
#include "backends/dashboard/DashboardBackend.h"
#include "platform/log/SystemLog.h"
#include "platform/plist/KeyedArchive.h"
#include "platform/unicode/UTF8.h"

namespace vesk {

namespace {

constexpr std::chrono::milliseconds kTransferTimeout{120'000};
constexpr std::uint16_t kAnnouncementMethod = 0;
constexpr std::uint16_t kAnnouncementRespCode = 2;

HTTPRequest requestFor(const std::string& url, std::string body) {
  HTTPRequest request;
  request.method = "POST";
  request.url = url;
  request.headers = {{"Content-Type", "application/octet-stream"}};
  request.body = std::move(body);
  request.timeout = kTransferTimeout;
  return request;
}

/// The reason why `result` has no location; null if it has one. An answer needs a body.
const char* problemWith(const HTTPResult& result) {
  if (result.error) return result.error->description.c_str();
  if (!result.response || result.response->body.empty()) return "(null)";
  return isValidUTF8(result.response->body, false) ? nullptr : "the answer is not UTF-8";
}

}  // namespace

bool DashboardBackend::uploadLogData(const List& logData) {
  if (!_postURL) {
    VESK_LOG_ERROR("DashboardBackend(uploadLogData): Post URL for log data array is nil");
    return false;
  }
  auto archive = archiveValue(logData);
  if (!archive) {
    VESK_LOG_ERROR("DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
    return false;
  }
  const auto pass = _services.uploads->enterWithLogData(_identity._client.user, archive->size());
  if (!pass) {
    VESK_LOG_ERROR("DashboardBackend(uploadLogData): Error uploading log data array (%s)",
                   "too many uploads are under way");
    return false;
  }
  const HTTPResult result =
      _services.uploads->perform(_services.http, requestFor(*_postURL, *std::move(archive)));
  if (const char* problem = problemWith(result)) {
    VESK_LOG_ERROR("DashboardBackend(uploadLogData): Error uploading log data array (%s)", problem);
    return false;
  }
  const std::string& location = result.response->body;
  VESK_LOG_DEBUG("DashboardBackend(uploadLogData): Log data uploaded to %s", location.c_str());
  const Dictionary payload{{Text::literal("LogDataUploadLocation"), location}};
  sendMessage(payload, timevalFrom(_services.clock.now()), kAnnouncementMethod, kAnnouncementRespCode, 0);
  return true;
}

}  // namespace vesk
