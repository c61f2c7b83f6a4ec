// The client's thread.
#pragma once

#include <curl/curl.h>

#include <atomic>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/http/HTTPClient.h"
#include "platform/http/HTTPSchedule.h"
#include "platform/http/HTTPTransfer.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Accepts requests from any thread through an inbox and performs them on its own thread, which sleeps
/// without a timeout while idle. No exception leaves the thread.
class HTTPClient::Worker {
 public:
  /// `postsOnly` must outlive the worker; call `wake` after setting it.
  Worker(Options options, std::optional<std::string> authorities, const std::atomic<bool>& postsOnly);
  ~Worker();
  Worker(const Worker&) = delete;
  Worker& operator=(const Worker&) = delete;

  /// Takes ownership of both. Returns false, and leaves both with the caller, after `stop`. `copy`: of a post
  /// that is sent once the keeper has written this copy of it, or 0.
  [[nodiscard]] bool start(HTTPRequest& request, Completion& completion, PostKeeper::Ticket copy);
  /// Gives up all requests and ends the thread. May be called more than once.
  void stop();
  void wake() noexcept;
  bool waitUntilIdle(std::chrono::milliseconds timeout) { return _outstanding.waitUntilNone(timeout); }

 private:
  using Exchange = HTTPSchedule::Exchange;
  struct FreeMulti {
    void operator()(CURLM* multi) const noexcept { curl_multi_cleanup(multi); }
  };

  void run() noexcept;
  /// One iteration. Returns false when it is time to stop.
  bool turn();
  void giveUpAll();

  bool takeInbox();
  void takeWritten();
  void stopAllButPosts();
  void startReady();
  void begin(Exchange exchange);
  /// Returns true if any transfer ended.
  bool collectFinished();
  void conclude(HTTPTransfer& transfer, CURLcode code);
  void sleep();
  HTTPTransfer& idleTransfer();
  /// Removes a busy transfer from libcurl and returns its exchange.
  Exchange interrupt(HTTPTransfer& transfer);
  /// Gives the keeper copies of posts whose attempt takes long, so that they would survive the process's end.
  void keepCopies(HTTPSchedule::Instant now);
  /// The time at which the keeper gets a copy of the post in `transfer`; nullopt if it gets none.
  std::optional<HTTPSchedule::Instant> copyDue(const HTTPTransfer& transfer) const;

  // Constant after construction.
  const Options _options;
  std::optional<std::string> _authorities;
  std::unique_ptr<CURLM, FreeMulti> _multi;  ///< used by the client's thread, except for waking it
  const std::atomic<bool>& _postsOnly;

  HTTPOutstanding _outstanding;  // declared before everything that holds exchanges

  // Only used by the client's thread.
  std::deque<Exchange> _unwritten;  ///< posts whose copies the keeper has not written yet
  HTTPSchedule _schedule;
  std::vector<std::unique_ptr<HTTPTransfer>> _transfers;
  std::vector<HTTPTransfer*> _idle;  ///< those of `_transfers` without an exchange

  Mutex _mutex;
  std::vector<Exchange> _inbox VESK_GUARDED_BY(_mutex);
  bool _stopping VESK_GUARDED_BY(_mutex) = false;

  std::thread _thread;
};

}  // namespace vesk
