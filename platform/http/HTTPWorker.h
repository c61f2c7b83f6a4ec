// The client's thread.
#pragma once

#include <curl/curl.h>

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/http/HTTPClient.h"
#include "platform/http/HTTPQueue.h"
#include "platform/http/HTTPSchedule.h"
#include "platform/http/HTTPTransfer.h"
#include "platform/sync/Mutex.h"

namespace vesk {

/// Takes requests from any thread through an inbox and carries them out on a thread of its own, which sleeps
/// without any timeout while there is nothing to do. A want of memory ends the one exchange that suffers from
/// it: nothing that runs on the thread lets an exception out.
class HTTPClient::Worker {
 public:
  /// `postsOnly`: outlives it; who sets it calls `wake`.
  Worker(Options options, std::optional<std::string> authorities, const std::atomic<bool>& postsOnly);
  ~Worker();
  Worker(const Worker&) = delete;
  Worker& operator=(const Worker&) = delete;

  /// Takes both over, unless it throws std::bad_alloc.
  void start(HTTPRequest& request, Completion& completion);
  void wake() noexcept;
  bool waitUntilIdle(std::chrono::milliseconds timeout) { return _outstanding.waitUntilNone(timeout); }

 private:
  using Exchange = HTTPQueue::Exchange;
  struct FreeMulti {
    void operator()(CURLM* multi) const noexcept { curl_multi_cleanup(multi); }
  };

  void run() noexcept;
  /// One round; false when it is time to stop.
  bool turn() noexcept;
  void stop() noexcept;

  bool takeInbox() noexcept;
  void stopAllButPosts() noexcept;
  void startReady() noexcept;
  void begin(Exchange exchange) noexcept;
  /// Whether any transfer ended.
  bool collectFinished() noexcept;
  void conclude(HTTPTransfer& transfer, CURLcode code) noexcept;
  void sleep() noexcept;
  HTTPTransfer& idleTransfer();
  /// Takes a busy transfer out of libcurl's hands; gives what it carried.
  Exchange interrupt(HTTPTransfer& transfer) noexcept;

  // Constant after construction.
  const Options _options;
  std::optional<std::string> _authorities;
  std::unique_ptr<CURLM, FreeMulti> _multi;  ///< the client's thread's, but for waking it up
  const std::atomic<bool>& _postsOnly;

  HTTPOutstanding _outstanding;  // before all that holds exchanges

  // The client's thread only.
  HTTPSchedule _schedule;
  std::vector<std::unique_ptr<HTTPTransfer>> _transfers;
  bool _hasStoppedOthers = false;
  std::vector<HTTPTransfer*> _idle;  ///< those of `_transfers` that hold no exchange; has room for all

  Mutex _mutex;
  HTTPQueue _inbox VESK_GUARDED_BY(_mutex);
  bool _stopping VESK_GUARDED_BY(_mutex) = false;

  std::thread _thread;
};

}  // namespace vesk
