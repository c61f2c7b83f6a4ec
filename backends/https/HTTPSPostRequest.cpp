// The JSON body of a post, the post itself, and what the server's answer does to the backend.
#include <VeskReporting/VeskReportingKeys.h>

#include <algorithm>
#include <cmath>

#include "backends/https/HTTPSPostBackend.h"
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

// JSON has no number that is not finite.
bool fitsIntoBody(const Value& value) {
  if (const double* number = value.real()) return std::isfinite(*number);
  return value.isNumber() || value.text() != nullptr;
}

// Dates become seconds; what JSON events can't carry is removed and reported, or it would cost the whole
// batch.
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

// A line break in a name from a client must not become a header of its own.
std::string headerValue(const Text& text) {
  std::string value = text.string();
  std::erase_if(value, [](char c) { return static_cast<unsigned char>(c) < 0x20 || c == 0x7f; });
  return value;
}

}  // namespace

std::string HTTPSPostBackend::clientIdentifier() const {
  if (_settings._extrasOnInternal != 0 && _identity._isInternal && !_identity._udid.empty())
    return _identity._udid;
  return _settings._dnuType == 0 ? _uuidRespectDnu : _uuidOverrideDnu;
}

std::optional<std::string> HTTPSPostBackend::buildAndPost(PostToBuild post) {
  EventBatch& events = *post->events;
  std::size_t eventCount = events.size();
  try {
    // Events held before the user info arrived get it now.
    if (post->lateUserInfo) {
      noteDropped(events, events.addUserInfo(*post->lateUserInfo));
      eventCount = events.size();
    }
    std::optional<std::string> pretty;
    auto body = createMessageForPostAndLogging(*post, &pretty);
    post->events.reset();
    if (body) {
      postJSONMessage(std::move(*post), std::move(*body), eventCount);
      return pretty;
    }
  } catch (...) {
    // No memory for it, and the events are given up already.
    _services.counters.count(_name, DropReason::BodyNotBuilt, eventCount);
    throw;
  }
  _services.counters.count(_name, DropReason::BodyNotBuilt, eventCount);
  return std::nullopt;
}

std::optional<std::string> HTTPSPostBackend::createMessageForPostAndLogging(
    Post& post, std::optional<std::string>* prettyJsonString) const {
  double postTime = finiteOrMinusOne(secondsFromTimeval(timevalFrom(_services.clock.now())));
  auto& events = post.events->events();
  for (auto& held : events) sanitize(held.event);

  auto serialize = [&](JSONStyle style) {
    constexpr std::size_t kExpectedEventSize = 768;
    JSONWriter writer(style, 128 + events.size() * kExpectedEventSize);
    writer.beginObject();
    writer.key("postTime");
    writer.value(postTime);
    writer.key("clientId");
    writer.value(post.clientID);
    writer.key("events");
    writer.beginArray();
    for (const auto& held : events) writer.value(held.event);
    writer.endArray();
    writer.endObject();
    return writer.finish();
  };

  auto body = serialize(JSONStyle::Compact);
  if (body && prettyJsonString && post.isPrintable) *prettyJsonString = serialize(JSONStyle::Pretty);
  return body;
}

HTTPSPostBackend::Headers HTTPSPostBackend::postHeaders(std::optional<std::uint16_t> method,
                                                        std::optional<std::uint16_t> responseCode) const {
  Headers headers;
  if (_userInfoDict) {
    if (auto name = _userInfoDict->text(kVeskReportingUserInfoClientName)) {
      headers.emplace_back("X-Vesk-Client-Name", headerValue(*name));
    }
    if (auto name = _userInfoDict->text(kVeskReportingUserInfoServiceName)) {
      headers.emplace_back("X-Vesk-Service-Name", headerValue(*name));
    }
  }
  if (_identity._isInternal) headers.emplace_back("X-Vesk-Internal-Build", "1");
  if (auto sender = senderCodeForClientType(_identity._compType))
    headers.emplace_back("X-Vesk-Sender", *sender);
  if (method && responseCode) {
    headers.emplace_back("X-Vesk-Event-Map", std::to_string(*method) + " " + std::to_string(*responseCode));
  }
  headers.emplace_back("Accept", "application/json");
  headers.emplace_back("Content-Type", "application/json");
  return headers;
}

void HTTPSPostBackend::postJSONMessage(Post post, std::string json, std::size_t eventCount) {
  if (!post.url) {
    _services.counters.count(_name, DropReason::NoURL, eventCount);
    return;
  }
  HTTPRequest request;
  request.method = "POST";
  request.url = std::move(*post.url);
  request.retry = HTTPRequest::Retry::UntilSent;
  request.owner = _identity._user;
  request.headers = std::move(post.headers);
  auto compressed = gzipDeflate(json);
  bool sendCompressed = compressed && compressed->size() < json.size();
  request.body = sendCompressed ? std::move(*compressed) : std::move(json);
  request.headers.emplace_back("Content-Length", std::to_string(request.body.size()));
  if (sendCompressed) request.headers.emplace_back("Content-Encoding", "gzip");

  // The completion keeps the backend alive; at a session's end it may be its last holder.
  auto self = std::static_pointer_cast<HTTPSPostBackend>(shared_from_this());
  _services.http.start(std::move(request), [self, eventCount](const HTTPResult& result) {
    self->postCompleted(result, eventCount);
  });
}

void HTTPSPostBackend::postCompleted(const HTTPResult& result, std::size_t eventCount) {
  if (result.error) {
    VESK_LOG_ERROR("HTTPSPostBackend(postJsonMessage): post error: %s", result.error->description.c_str());
  }
  const long status = result.response ? result.response->status : 0;
  if (status < 500 || status > 599) {
    if (status >= 200 && status <= 299) return;
    const auto reason = status == 0 ? DropReason::TransportError : DropReason::ServerRefused;
    _services.counters.count(_name, reason, eventCount);
    if (status != 0) _services.refusedPosts->note(_name, status, eventCount);
    return;
  }
  VESK_LOG_INFO("postJSONMessage: backend %s disabled by server %ld return code", _name.c_str(), status);
  setState(BackendStateDisabled);
  _services.counters.count(_name, DropReason::ServerError5xx, eventCount);
}

}  // namespace vesk
