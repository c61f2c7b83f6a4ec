#include "backends/https/PostBody.h"

#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <cmath>

#include "backends/https/SenderCodes.h"
#include "platform/json/JSONWriter.h"
#include "platform/log/SystemLog.h"
#include "platform/unicode/UTF8.h"
#include "util/Gzip.h"
#include "util/ReportingdUtil.h"
#include "values/Conversions.h"

namespace vesk {

namespace {

constexpr std::size_t kLongestKeyInLog = 200;
constexpr std::size_t kLongestValueInLog = 100;

// JSON has no numbers that are not finite.
bool fitsIntoBody(const Value& value) {
  if (const double* number = value.real()) return std::isfinite(*number);
  return value.isNumber() || value.text() != nullptr;
}

// Converts dates to seconds. Removes and reports what JSON can't carry, to save the rest of the batch.
void sanitize(MutableDictionary& event) {
  std::erase_if(event.entries(), [](DictionaryEntry& entry) {
    if (fitsIntoBody(entry.value)) return false;
    if (const Date* date = entry.value.date()) {
      entry.value = finiteOrMinusOne(date->secondsSince1970);
      return false;
    }
    VESK_LOG_WARNING(
        "HTTPSPostBackend(createMessageForPostAndLogging): TreeWriter unable to handle key: %s, value: %s",
        cutToWholeCharacters(entry.key.view(), kLongestKeyInLog).c_str(),
        describe(entry.value, kLongestValueInLog).c_str());
    return true;
  });
}

// A line break in a name from a client must not start another header.
std::string headerValue(const Text& text) {
  std::string value = text.string();
  std::erase_if(value, [](char c) { return static_cast<unsigned char>(c) < 0x20 || c == 0x7f; });
  return value;
}

}  // namespace

std::optional<PostBody> createMessageForPostAndLogging(EventBatch& events, const std::string& clientID,
                                                       WallTime postTime, bool isPrintable) {
  for (auto& held : events.events()) sanitize(held.event);
  const auto serialize = [&](JSONStyle style) {
    constexpr std::size_t kExpectedEventSize = 768;
    JSONWriter writer(style, 128 + events.size() * kExpectedEventSize);
    writer.beginObject();
    writer.key("postTime");
    writer.value(finiteOrMinusOne(secondsFromTimeval(timevalFrom(postTime))));
    writer.key("clientId");
    writer.value(clientID);
    writer.key("events");
    writer.beginArray();
    for (const auto& held : events.events()) writer.value(held.event);
    writer.endArray();
    writer.endObject();
    return writer.finish();
  };
  auto json = serialize(JSONStyle::Compact);
  if (!json) return std::nullopt;
  return PostBody{std::move(*json), isPrintable ? serialize(JSONStyle::Pretty) : std::nullopt};
}

PostHeaders postHeaders(const BackendIdentity& identity, const std::optional<Dictionary>& userInfo,
                        std::optional<std::uint16_t> method, std::optional<std::uint16_t> responseCode) {
  PostHeaders headers;
  const auto addFromUserInfo = [&](const char* header, std::string_view key) {
    if (auto name = userInfo ? userInfo->text(key) : std::nullopt)
      headers.emplace_back(header, headerValue(*name));
  };
  addFromUserInfo("X-Vesk-Client-Name", kVeskReportingUserInfoClientName);
  addFromUserInfo("X-Vesk-Service-Name", kVeskReportingUserInfoServiceName);
  if (identity._isInternal) headers.emplace_back("X-Vesk-Internal-Build", "1");
  if (auto sender = senderCodeForClientType(identity._compType))
    headers.emplace_back("X-Vesk-Sender", *sender);
  if (method && responseCode) {
    headers.emplace_back("X-Vesk-Event-Map", std::to_string(*method) + " " + std::to_string(*responseCode));
  }
  headers.emplace_back("Accept", "application/json");
  headers.emplace_back("Content-Type", "application/json");
  return headers;
}

HTTPRequest postRequest(std::string url, PostHeaders headers, std::string json, const BackendClient& client) {
  HTTPRequest request;
  request.method = "POST";
  request.url = std::move(url);
  request.retry = HTTPRequest::Retry::UntilSent;
  request.owner = client.user;
  request.account = client.posts;
  request.headers = std::move(headers);
  auto compressed = gzipDeflate(json);
  const bool sendCompressed = compressed && compressed->size() < json.size();
  request.body = sendCompressed ? std::move(*compressed) : std::move(json);
  request.headers.emplace_back("Content-Length", std::to_string(request.body.size()));
  if (sendCompressed) request.headers.emplace_back("Content-Encoding", "gzip");
  return request;
}

}  // namespace vesk
