// An HTTP/1.1 server for development and tests: real sockets and TLS, and every kind of bad answer on demand.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// What a TLS server shows and proves, as PEM texts.
struct TLSIdentity {
  std::string certificateChain;  ///< leaf first
  std::string privateKey;
};

/// Listens from construction to `stop`. Requests on one connection are answered in their order; connections
/// are kept alive.
class HTTPServer {
 public:
  struct Options {
    std::string address = "127.0.0.1";                ///< numeric
    std::uint16_t port = 0;                           ///< 0: any free one
    std::optional<TLSIdentity> tls{};                 ///< HTTPS when set
    std::size_t maximumBody = std::size_t{64} << 20;  ///< bytes; a longer one is answered with 413
    std::size_t maximumConnections = 1024;            ///< further ones are closed at once
    /// Told, on the server's thread, in one line what arrived that never reached the handler: no HTTP, no
    /// TLS, too large.
    std::function<void(const std::string& line)> onRefused{};
  };

  /// Called on the server's thread, one request at a time; must not block (that is what `Fault::Hold` is
  /// for). What it throws becomes a 500.
  using Handler = std::function<HTTPAnswer(const HTTPReceived&)>;

  /// Listens, then starts the thread. Throws std::runtime_error with a clear message when the address can't
  /// be bound or the identity can't be used. An address whose previous server has just stopped can be bound.
  HTTPServer(Options options, Handler handler);
  ~HTTPServer();
  HTTPServer(const HTTPServer&) = delete;
  HTTPServer& operator=(const HTTPServer&) = delete;

  /// The port that it listens (or listened) on.
  std::uint16_t port() const;
  /// "https://localhost:4711", without a trailing slash; plain HTTP: "http://127.0.0.1:4711".
  std::string baseURL() const;

  /// Sends every answer that is held at this moment. Any thread.
  void releaseHeld();
  /// Closes all connections, stalled ones too, and ends the thread: the handler does not run any more once
  /// this has returned. May be called twice; not from the handler.
  void stop();

  std::size_t connectionsAccepted() const;
  /// Those open at this moment.
  std::size_t connectionsOpen() const;

 private:
  class Core;
  std::unique_ptr<Core> _core;
};

}  // namespace vesk
