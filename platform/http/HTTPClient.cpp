#include "platform/http/HTTPClient.h"

#include <algorithm>
#include <cstdlib>
#include <semaphore>

#include "platform/http/HTTPExchange.h"
#include "platform/http/HTTPWorker.h"

namespace vesk {

namespace {

char lower(char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c; }

bool equalsIgnoringCase(std::string_view a, std::string_view b) {
  return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                    [](char x, char y) { return lower(x) == lower(y); });
}

std::optional<std::string> authoritiesFromEnvironment() {
  const char* file = std::getenv("SSL_CERT_FILE");
  if (!file || !*file) return std::nullopt;
  return file;
}

}  // namespace

std::optional<std::string_view> HTTPResponse::header(std::string_view name) const {
  for (const auto& [key, value] : headers) {
    if (equalsIgnoringCase(key, name)) return value;
  }
  return std::nullopt;
}

HTTPClient::HTTPClient(Options options)
    : _options(std::move(options)), _authorities(authoritiesFromEnvironment()) {}
HTTPClient::HTTPClient() : HTTPClient(Options{}) {}
HTTPClient::~HTTPClient() = default;

HTTPClient::Worker* HTTPClient::worker() {
  MutexLock lock(_mutex);
  return _worker.get();
}

HTTPClient::Worker& HTTPClient::startedWorker() {
  MutexLock lock(_mutex);
  if (!_worker) _worker = std::make_unique<Worker>(_options, _authorities);
  return *_worker;
}

void HTTPClient::start(HTTPRequest request, Completion completion) {
  removeUnsafeHeaders(request);
  Worker* worker = nullptr;
  try {
    worker = &startedWorker();
  } catch (const std::exception& error) {
    completion({std::nullopt, HTTPError{HTTPError::Kind::Other, error.what()}});
    return;
  }
  worker->start(std::move(request), std::move(completion));
}

HTTPResult HTTPClient::perform(HTTPRequest request) {
  // Shared, because the completion may still be inside `release` when this call returns.
  struct Call {
    HTTPResult result;
    std::binary_semaphore done{0};
  };
  auto call = std::make_shared<Call>();
  start(std::move(request), [call](const HTTPResult& result) {
    call->result = result;
    call->done.release();
  });
  call->done.acquire();
  return std::move(call->result);
}

bool HTTPClient::waitUntilIdle(std::chrono::milliseconds timeout) {
  Worker* started = worker();
  return !started || started->waitUntilIdle(timeout);
}

}  // namespace vesk
