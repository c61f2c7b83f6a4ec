#include "platform/http/HTTPWorker.h"

#include <pthread.h>
#include <signal.h>

#include <algorithm>
#include <chrono>
#include <limits>
#include <stdexcept>
#include <utility>

#include "platform/log/SystemLog.h"

namespace vesk {

namespace {

constexpr long kKeptConnections = 32;

CURLM* makeMulti(std::size_t connectionsPerHost) {
  // libcurl is never shut down, since other parts of the process may use it.
  static const CURLcode initialised = curl_global_init(CURL_GLOBAL_DEFAULT);
  CURLM* multi = initialised == CURLE_OK ? curl_multi_init() : nullptr;
  if (!multi) throw std::runtime_error("HTTPClient: libcurl can not be initialised");
  curl_multi_setopt(multi, CURLMOPT_MAX_HOST_CONNECTIONS, static_cast<long>(connectionsPerHost));
  curl_multi_setopt(multi, CURLMOPT_MAXCONNECTS, kKeptConnections);
  return multi;
}

// Signals are handled by the main thread. A broken pipe shows as a write error.
void blockSignals() {
  sigset_t all;
  sigfillset(&all);
  pthread_sigmask(SIG_SETMASK, &all, nullptr);
}

int millisecondsUntil(HTTPSchedule::Instant time) {
  auto left = std::chrono::ceil<std::chrono::milliseconds>(time - std::chrono::steady_clock::now());
  return static_cast<int>(std::clamp<long long>(left.count(), 0, std::numeric_limits<int>::max()));
}

}  // namespace

HTTPClient::Worker::Worker(Options options, std::optional<std::string> authorities,
                           const std::atomic<bool>& postsOnly)
    : _options(std::move(options)),
      _authorities(std::move(authorities)),
      _multi(makeMulti(std::max<std::size_t>(_options.maximumConnectionsPerHost, 1))),
      _postsOnly(postsOnly),
      _outstanding(_options.onIdle),
      _schedule(_options),
      _thread([this] { run(); }) {}

HTTPClient::Worker::~Worker() { stop(); }

void HTTPClient::Worker::stop() {
  {
    MutexLock lock(_mutex);
    if (std::exchange(_stopping, true)) return;
  }
  wake();
  _thread.join();
}

void HTTPClient::Worker::wake() noexcept { curl_multi_wakeup(_multi.get()); }

bool HTTPClient::Worker::start(HTTPRequest& request, Completion& completion, PostKeeper::Ticket copy) {
  bool mustWake;
  {
    MutexLock lock(_mutex);
    if (_stopping) return false;
    // If the inbox is not empty, the thread has already been woken.
    mustWake = _inbox.empty();
    _inbox.push_back(std::make_unique<HTTPExchange>(std::move(request), std::move(completion),
                                                    std::chrono::steady_clock::now(), _outstanding, copy));
  }
  if (mustWake) wake();
  return true;
}

void HTTPClient::Worker::run() noexcept {
  blockSignals();
  pthread_setname_np(pthread_self(), "http");
  while (turn()) {
  }
  giveUpAll();
}

bool HTTPClient::Worker::turn() {
  if (!takeInbox()) return false;
  if (_postsOnly) stopAllButPosts();
  const auto now = std::chrono::steady_clock::now();
  _schedule.advance(now);
  if (_options.keeper) keepCopies(now);
  startReady();
  int running = 0;
  curl_multi_perform(_multi.get(), &running);
  bool freed = collectFinished();
  // Ended transfers made room, so the next request starts before the thread sleeps.
  if (!freed) sleep();
  return true;
}

bool HTTPClient::Worker::takeInbox() {
  std::vector<Exchange> arrived;
  {
    MutexLock lock(_mutex);
    if (_stopping) return false;
    arrived.swap(_inbox);
  }
  for (auto& exchange : arrived) {
    if (exchange->ticket != 0) {
      _unwritten.push_back(std::move(exchange));
    } else {
      _schedule.add(std::move(exchange));
    }
  }
  if (!_unwritten.empty()) takeWritten();
  return true;
}

void HTTPClient::Worker::takeWritten() {
  const auto written = _options.keeper->writtenUpTo();
  for (; !_unwritten.empty() && _unwritten.front()->ticket <= written; _unwritten.pop_front()) {
    _schedule.add(std::move(_unwritten.front()));
  }
}

void HTTPClient::Worker::stopAllButPosts() {
  for (auto& transfer : _transfers) {
    if (!transfer->isBusy() || transfer->isPost()) continue;
    _schedule.failed(interrupt(*transfer), {.error = stopped()}, std::chrono::steady_clock::now());
  }
  _schedule.stopAllButPosts();
}

void HTTPClient::Worker::startReady() {
  while (auto exchange = _schedule.next(std::chrono::steady_clock::now())) begin(std::move(exchange));
}

void HTTPClient::Worker::begin(Exchange exchange) {
  HTTPTransfer& transfer = idleTransfer();
  auto error = transfer.prepare(exchange, std::chrono::steady_clock::now());
  if (!error && curl_multi_add_handle(_multi.get(), transfer.handle()) != CURLM_OK) {
    error = HTTPError{HTTPError::Kind::Other, "libcurl did not take the request"};
  }
  if (!error) return;
  if (!exchange) exchange = transfer.release();
  _idle.push_back(&transfer);
  _schedule.failed(std::move(exchange), {.error = std::move(*error)}, std::chrono::steady_clock::now());
}

bool HTTPClient::Worker::collectFinished() {
  bool any = false;
  int left = 0;
  while (CURLMsg* message = curl_multi_info_read(_multi.get(), &left)) {
    if (message->msg != CURLMSG_DONE) continue;
    HTTPTransfer* transfer = nullptr;
    curl_easy_getinfo(message->easy_handle, CURLINFO_PRIVATE, &transfer);
    CURLcode code = message->data.result;
    curl_multi_remove_handle(_multi.get(), message->easy_handle);
    conclude(*transfer, code);
    any = true;
  }
  return any;
}

void HTTPClient::Worker::conclude(HTTPTransfer& transfer, CURLcode code) {
  auto outcome = transfer.finish(code);
  auto exchange = transfer.release();
  _idle.push_back(&transfer);
  const auto now = std::chrono::steady_clock::now();
  if (!outcome.answered) {
    _schedule.failed(std::move(exchange), std::move(outcome.failure), now);
    return;
  }
  _schedule.answered(*exchange, now);
  if (_options.keeper) {
    if (exchange->ticket != 0) _options.keeper->discard(exchange->ticket);
    const auto& response = outcome.result.response;
    if (response && !response->isBusyOrBroken()) _options.keeper->hostAnswered(exchange->host());
  }
  exchange->complete(std::move(outcome.result));
}

void HTTPClient::Worker::sleep() {
  auto next = _schedule.nextAdvance();
  for (const auto& transfer : _transfers) {
    const auto due = copyDue(*transfer);
    if (due && (!next || *due < *next)) next = due;
  }
  int timeout = next ? millisecondsUntil(*next) : std::numeric_limits<int>::max();
  CURLMcode code = curl_multi_poll(_multi.get(), nullptr, 0, timeout, nullptr);
  if (code != CURLM_OK) {
    VESK_LOG_ERROR("HTTPClient: %s", curl_multi_strerror(code));
    std::this_thread::sleep_for(std::chrono::milliseconds(100));  // waiting is not possible at the moment
  }
}

void HTTPClient::Worker::keepCopies(HTTPSchedule::Instant now) {
  for (auto& transfer : _transfers) {
    const auto due = copyDue(*transfer);
    if (!due || *due > now) continue;
    HTTPExchange& post = *transfer->exchange();
    post.discharge();
    post.hasCopy = true;
    post.ticket = _options.keeper->keepCopy(post.request);
  }
}

std::optional<HTTPSchedule::Instant> HTTPClient::Worker::copyDue(const HTTPTransfer& transfer) const {
  const HTTPExchange* exchange = transfer.exchange();
  if (!_options.keeper || !exchange || !exchange->isPost() || exchange->hasCopy) return std::nullopt;
  return exchange->firstAttempt + _options.retryFor;
}

HTTPTransfer& HTTPClient::Worker::idleTransfer() {
  if (_idle.empty()) {
    _transfers.push_back(std::make_unique<HTTPTransfer>(_options, _authorities));
    return *_transfers.back();
  }
  HTTPTransfer* transfer = _idle.back();
  _idle.pop_back();
  return *transfer;
}

HTTPClient::Worker::Exchange HTTPClient::Worker::interrupt(HTTPTransfer& transfer) {
  curl_multi_remove_handle(_multi.get(), transfer.handle());
  _idle.push_back(&transfer);
  return transfer.release();
}

void HTTPClient::Worker::giveUpAll() {
  for (auto& transfer : _transfers) {
    if (transfer->isBusy()) interrupt(*transfer)->giveUp(stopped(), _options.keeper, kWaitAfterWholeBody);
  }
  _schedule.stopAll();
  for (auto& exchange : _unwritten) exchange->giveUp(stopped(), _options.keeper);
  _unwritten.clear();
  std::vector<Exchange> arrived;
  {
    MutexLock lock(_mutex);
    arrived.swap(_inbox);
  }
  for (auto& exchange : arrived) exchange->giveUp(stopped(), _options.keeper);
  _transfers.clear();
}

}  // namespace vesk
