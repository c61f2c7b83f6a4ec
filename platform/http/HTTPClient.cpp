#include "platform/http/HTTPClient.h"

#include <algorithm>
#include <cstdlib>
#include <exception>
#include <new>
#include <semaphore>

#include "platform/http/HTTPExchange.h"
#include "platform/http/HTTPWorker.h"
#include "platform/text/ASCII.h"

namespace vesk {

namespace {

std::optional<std::string> authoritiesFromEnvironment() {
  const char* file = std::getenv("SSL_CERT_FILE");
  if (!file || !*file) return std::nullopt;
  return file;
}

}  // namespace

std::optional<std::string_view> HTTPResponse::header(std::string_view name) const {
  for (const auto& [key, value] : headers) {
    if (equalsIgnoringASCIICase(key, name)) return value;
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
  if (!_worker) _worker = std::make_unique<Worker>(_options, _authorities, _postsOnly);
  return *_worker;
}

void HTTPClient::start(HTTPRequest request, Completion completion) {
  removeUnsafeHeaders(request);
  HTTPError problem;
  try {
    startedWorker().start(request, completion);
    return;
  } catch (const std::bad_alloc&) {
    problem = outOfMemory();
  } catch (const std::exception& error) {
    problem = httpError(HTTPError::Kind::Other, error.what());
  }
  runCompletion(completion, {std::nullopt, std::move(problem)});
}

HTTPResult HTTPClient::perform(HTTPRequest request) {
  // Shared, because the completion may still be inside `release` when this call returns.
  struct Call {
    HTTPResult result;
    std::binary_semaphore done{0};
  };
  std::shared_ptr<Call> call;
  Completion completion;
  try {
    call = std::make_shared<Call>();
    // Nothing here can fail, so the waiting caller is always released.
    completion = [call](HTTPResult result) noexcept {
      call->result = std::move(result);
      call->done.release();
    };
  } catch (const std::bad_alloc&) {
    return {std::nullopt, outOfMemory()};
  }
  start(std::move(request), std::move(completion));
  call->done.acquire();
  return std::move(call->result);
}

void HTTPClient::stopAllButPosts() {
  _postsOnly = true;
  if (Worker* started = worker()) started->wake();
}

bool HTTPClient::waitUntilIdle(std::chrono::milliseconds timeout) {
  Worker* started = worker();
  return !started || started->waitUntilIdle(timeout);
}

}  // namespace vesk
