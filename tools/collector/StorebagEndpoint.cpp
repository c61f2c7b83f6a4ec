#include "tools/collector/StorebagEndpoint.h"

#include <stdexcept>

#include "tools/collector/HTTPDate.h"
#include "tools/storebag/StorebagDocument.h"

namespace vesk {

namespace {

std::string describeRequest(const HTTPReceived& received) {
  return received.method + " " + received.target.substr(0, 200) + " from " + received.peer;
}

bool isUnchangedSince(const HTTPReceived& received, std::time_t lastModified) {
  auto since = received.header("If-Modified-Since");
  auto time = since ? timeFromHTTPDate(*since) : std::nullopt;
  return time && lastModified <= *time;
}

}  // namespace

StorebagEndpoint::StorebagEndpoint(const CollectorServices& services, StorebagFolder& folder,
                                   const SigningKey& key, std::optional<std::chrono::seconds> maximumAge)
    : FaultyEndpoint(services, FaultTarget::Storebag), _folder(folder), _key(key), _maximumAge(maximumAge) {}

HTTPAnswer StorebagEndpoint::serve(const HTTPReceived& received, const CollectorFault* fault) {
  const bool signWell = fault == nullptr || fault->kind != CollectorFault::Kind::BadSignature;
  if (received.method != "GET") return _refuse.wrongMethod(received, "GET");
  std::string_view path = received.path();
  std::string name(path.substr(path.rfind('/') + 1));
  auto found = _folder.find(name);
  if (!found)
    return _refuse(received, 404,
                   "no " + name + ".toml or " + name + ".json in " + _folder.directory().string());
  if (signWell && isUnchangedSince(received, found->lastModified)) {
    ++_stats.storebagsUnchanged;
    _console.note(describeRequest(received) + ": unchanged");
    HTTPAnswer answer;
    answer.status = 304;
    answer.headers = headersFor(found->lastModified);
    return answer;
  }
  return send(received, *found, signWell);
}

HTTPAnswer StorebagEndpoint::send(const HTTPReceived& received, const StorebagFolder::Found& found,
                                  bool signWell) {
  HTTPAnswer answer;
  answer.headers = headersFor(found.lastModified);
  answer.headers.emplace_back("Content-Type", "application/xml");
  Dictionary payload;
  try {
    StorebagSource source = _folder.read(found);
    if (found.isNew)
      for (const auto& warning : source.warnings) _console.problem("warning: " + warning);
    payload = source.payload;
    answer.body = signWell ? signStorebag(payload, _key) : signStorebagBadly(payload, _key);
  } catch (const std::runtime_error& error) {
    return _refuse(received, 500, error.what());
  }
  ++_stats.storebagsSent;
  auto version = payload.text("version");
  _console.note(describeRequest(received) + ": " + std::to_string(answer.body.size()) + " bytes, version " +
                (version ? version->string() : "none"));
  return answer;
}

HTTPHeaderList StorebagEndpoint::headersFor(std::time_t lastModified) const {
  HTTPHeaderList headers{{"Last-Modified", httpDate(lastModified)}};
  if (_maximumAge) headers.emplace_back("Cache-Control", "max-age=" + std::to_string(_maximumAge->count()));
  return headers;
}

}  // namespace vesk
