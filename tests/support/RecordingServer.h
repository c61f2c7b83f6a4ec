// A server that records requests and answers as the test decides.
#pragma once

#include <mutex>

#include "tools/collector/CertificateAuthority.h"
#include "tools/collector/HTTPServer.h"

namespace vesk::test {

class RecordingServer {
 public:
  /// `count`: the number of earlier requests.
  using Answer = std::function<HTTPAnswer(const HTTPReceived& request, std::size_t count)>;

  explicit RecordingServer(Answer answer = {}, HTTPServer::Options options = {})
      : _options(std::move(options)), _answer(std::move(answer)) {
    start();
  }

  void answerWith(Answer next) {
    std::lock_guard lock(_mutex);
    _answer = std::move(next);
  }
  /// Gives the same answer to all further requests.
  void answerWith(HTTPAnswer next) {
    answerWith([next = std::move(next)](const HTTPReceived&, std::size_t) { return next; });
  }
  /// Stops the server, so that its port refuses connections.
  void stop() { _server->stop(); }
  /// Starts the server again on the same port.
  void start() {
    if (_server) _options.port = _server->port();
    _server = std::make_unique<HTTPServer>(_options,
                                           [this](const HTTPReceived& request) { return receive(request); });
  }
  HTTPServer& server() { return *_server; }
  std::string url(const std::string& path = "/post") const { return _server->baseURL() + path; }

  std::vector<HTTPReceived> requests() const {
    std::lock_guard lock(_mutex);
    return _requests;
  }
  std::vector<std::string> bodies() const {
    std::vector<std::string> all;
    for (const auto& request : requests()) all.push_back(request.body);
    return all;
  }
  std::size_t count() const { return requests().size(); }

 private:
  HTTPAnswer receive(const HTTPReceived& request) {
    std::unique_lock lock(_mutex);
    const std::size_t before = _requests.size();
    _requests.push_back(request);
    const Answer answer = _answer;
    lock.unlock();
    return answer ? answer(request, before) : HTTPAnswer::text(200, "ok");
  }

  HTTPServer::Options _options;
  mutable std::mutex _mutex;
  Answer _answer;
  std::vector<HTTPReceived> _requests;
  std::unique_ptr<HTTPServer> _server;
};

/// An answer delivered with a fault.
inline HTTPAnswer faulty(HTTPAnswer::Fault fault, std::string body = "some text") {
  HTTPAnswer answer;
  answer.fault = fault;
  answer.body = std::move(body);
  return answer;
}

}  // namespace vesk::test
