#include "platform/http/HTTPClient.h"

#include <cstdlib>
#include <exception>
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
HTTPClient::~HTTPClient() = default;  // the worker stops

HTTPClient::Worker* HTTPClient::worker() {
  MutexLock lock(_mutex);
  return _worker.get();
}

HTTPClient::Worker* HTTPClient::startedWorker() {
  MutexLock lock(_mutex);
  if (!_worker && !_stopped) _worker = std::make_unique<Worker>(_options, _authorities, _postsOnly);
  return _worker.get();
}

void HTTPClient::start(HTTPRequest request, Completion completion) {
  removeUnsafeHeaders(request);
  HTTPError problem = stopped();
  PostKeeper::Ticket ticket = 0;
  if (_options.keepsFirst && _options.keeper && request.retry == HTTPRequest::Retry::UntilSent) {
    ticket = _options.keeper->keepCopy(request);
    if (request.account) request.account->noteKept(ticket);
  }
  try {
    Worker* started = startedWorker();
    if (started && started->start(request, completion, ticket)) return;
  } catch (const std::exception& error) {
    problem = {HTTPError::Kind::Other, error.what()};
  }
  if (ticket != 0) {
    _options.keeper->sendLater(ticket, std::chrono::seconds(0));
    problem.deferred = true;
  } else if (_options.keeper && request.retry == HTTPRequest::Retry::UntilSent) {
    problem.deferred = _options.keeper->keep(std::move(request), std::chrono::seconds(0));
  }
  runCompletion(completion, {std::nullopt, std::move(problem)});
}

void HTTPClient::keptPostsWereWritten() {
  if (Worker* started = worker()) started->wake();
}

HTTPResult HTTPClient::perform(HTTPRequest request) {
  // Shared, because the completion may still be inside `release` when this call returns.
  struct Call {
    HTTPResult result;
    std::binary_semaphore done{0};
  };
  auto call = std::make_shared<Call>();
  start(std::move(request), [call](HTTPResult result) {
    call->result = std::move(result);
    call->done.release();
  });
  call->done.acquire();
  return std::move(call->result);
}

void HTTPClient::stop() {
  {
    MutexLock lock(_mutex);
    _stopped = true;
  }
  if (Worker* started = worker()) started->stop();
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
