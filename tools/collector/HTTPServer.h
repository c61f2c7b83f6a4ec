// An HTTP/1.1 server for development and tests, with real sockets, TLS and faults on request.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// A TLS server's certificate and key, in PEM form.
struct TLSIdentity {
  std::string certificateChain;  ///< leaf first
  std::string privateKey;
};

/// Listens from construction to `stop`. Answers the requests of a connection in order and keeps it alive.
class HTTPServer {
 public:
  struct Options {
    std::string address = "127.0.0.1";                ///< numeric
    std::uint16_t port = 0;                           ///< 0: any free port
    std::optional<TLSIdentity> tls{};                 ///< HTTPS if set
    std::size_t maximumBody = std::size_t{64} << 20;  ///< bytes; longer bodies are answered with 413
    std::size_t maximumConnections = 1024;            ///< further ones are closed at once
    /// Called on the server's thread with one line about input that never reached the handler: not HTTP, not
    /// TLS, or too large.
    std::function<void(const std::string& line)> onRefused{};
  };

  /// Called on the server's thread, one request at a time. Must not block.
  /// Exceptions become a 500.
  using Handler = std::function<HTTPAnswer(const HTTPReceived&)>;

  /// Listens, then starts the thread. Throws std::runtime_error with a clear message if the address can't be
  /// bound or the identity can't be used. Can bind an address whose previous server has just stopped.
  HTTPServer(Options options, Handler handler);
  ~HTTPServer();
  HTTPServer(const HTTPServer&) = delete;
  HTTPServer& operator=(const HTTPServer&) = delete;

  /// The port, also after `stop`.
  std::uint16_t port() const;
  /// Without a trailing slash: "https://localhost:4711", or "http://127.0.0.1:4711" for plain HTTP.
  std::string baseURL() const;

  /// Closes all connections, including stalled ones, and ends the thread. The handler is not called after
  /// this returns. May be called twice, but not from the handler.
  void stop();

  std::size_t connectionsAccepted() const;

 private:
  class Core;
  std::unique_ptr<Core> _core;
};

}  // namespace vesk
