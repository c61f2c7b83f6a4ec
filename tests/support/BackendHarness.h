// What a backend needs in a test: a real HTTP client, a real server that records posts, and a settable clock.
#pragma once

#include <VeskReporting/VeskReportingKeys.h>

#include <atomic>
#include <boost/json.hpp>
#include <mutex>
#include <stdexcept>

#include "backends/VeskReportingBackend.h"
#include "platform/queue/QueueThread.h"
#include "tests/support/HandClock.h"
#include "tools/collector/HTTPServer.h"

namespace vesk::test {

/// One post as the server received it.
struct ReceivedPost {
  HTTPReceived request;
  boost::json::object body;

  boost::json::array events() const { return body.at("events").as_array(); }
  boost::json::object event(std::size_t index = 0) const { return events().at(index).as_object(); }
};

class BackendHarness {
 public:
  BackendHarness()
      : services{.http = _http,
                 .clock = clock,
                 .counters = counters,
                 .networkQueues = networkQueues,
                 .persistentIdentifierForDNU =
                     [](bool respects) { return std::string(respects ? "id-respecting" : "id-overriding"); },
                 .diagnosticsSubmissionConsent = [this] { return consent; },
                 .regionCode = [this] { return region; }},
        _server({}, [this](const HTTPReceived& request) { return receive(request); }) {}

  /// All posts so far, after waiting for outstanding requests.
  std::vector<ReceivedPost> posts() {
    if (!_http.waitUntilIdle(std::chrono::seconds(60))) throw std::runtime_error("posts do not end");
    std::lock_guard lock(_mutex);
    return _posts;
  }
  std::string url(const std::string& path = "/post") const { return _server.baseURL() + path; }
  void answerWith(unsigned status, HTTPAnswer::Fault fault = HTTPAnswer::Fault::None) {
    _status = status;
    _fault = fault;
  }

  std::uint64_t dropped(DropReason reason) const {
    std::uint64_t sum = 0;
    for (const auto& count : counters.snapshot()) sum += count.reason == reason ? count.count : 0;
    return sum;
  }

  HandClock clock;
  Counters counters;
  QueueThread networkQueues;
  bool consent = true;
  std::optional<std::string> region = "US";

 private:
  HTTPAnswer receive(const HTTPReceived& request) {
    ReceivedPost post{request, boost::json::parse(request.decodedBody().body.value()).as_object()};
    std::lock_guard lock(_mutex);
    _posts.push_back(std::move(post));
    auto answer = HTTPAnswer::text(_status, "received");
    answer.fault = _fault;
    return answer;
  }

  std::mutex _mutex;
  std::vector<ReceivedPost> _posts;
  std::atomic<unsigned> _status{200};
  std::atomic<HTTPAnswer::Fault> _fault{HTTPAnswer::Fault::None};

 public:
  BackendServices services;  ///< outlives the client, whose last completions use it

 private:
  HTTPServer _server;
  HTTPClient _http;
};

}  // namespace vesk::test
