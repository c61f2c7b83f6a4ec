// The client's thread.
#pragma once

#include <curl/curl.h>

#include <condition_variable>
#include <cstddef>
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

/// Takes requests from any thread through an inbox and carries them out on a thread of its own, which sleeps
/// without any timeout while there is nothing to do.
class HTTPClient::Worker {
 public:
  Worker(Options options, std::optional<std::string> authorities);
  ~Worker();
  Worker(const Worker&) = delete;
  Worker& operator=(const Worker&) = delete;

  void start(HTTPRequest request, Completion completion);
  bool waitUntilIdle(std::chrono::milliseconds timeout);

 private:
  using Exchange = std::unique_ptr<HTTPExchange>;
  struct FreeMulti {
    void operator()(CURLM* multi) const noexcept { curl_multi_cleanup(multi); }
  };

  void run() noexcept;
  /// One round; false when it is time to stop.
  bool turn();
  void stop() noexcept;

  bool takeInbox();
  void startReady();
  void begin(Exchange exchange);
  /// Whether any transfer ended.
  bool collectFinished();
  void conclude(HTTPTransfer& transfer, CURLcode code);
  void completeGivenUp();
  void complete(Exchange exchange, const HTTPResult& result) noexcept;
  void sleep();
  HTTPTransfer& idleTransfer();

  // Constant after construction.
  const Options _options;
  std::optional<std::string> _authorities;
  std::unique_ptr<CURLM, FreeMulti> _multi;  ///< the client's thread's, but for waking it up

  // The client's thread only.
  HTTPSchedule _schedule;
  std::vector<std::unique_ptr<HTTPTransfer>> _transfers;
  std::vector<HTTPTransfer*> _idle;  ///< those of `_transfers` that hold no exchange
  std::vector<Exchange> _arrived;

  Mutex _mutex;
  std::condition_variable_any _becameIdle;
  std::vector<Exchange> _inbox VESK_GUARDED_BY(_mutex);
  std::size_t _outstanding VESK_GUARDED_BY(_mutex) = 0;
  bool _stopping VESK_GUARDED_BY(_mutex) = false;

  std::thread _thread;
};

}  // namespace vesk
