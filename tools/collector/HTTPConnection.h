// One accepted connection of the development HTTP server.
#pragma once

#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/ssl/context.hpp>
#include <cstddef>
#include <memory>
#include <string>

#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// Reads requests and writes answers until either end closes. Runs on the server's thread.
class HTTPConnection {
 public:
  /// The server's interface for its connections. Outlives them.
  class Owner {
   public:
    virtual ~Owner() = default;
    /// Must not throw.
    virtual HTTPAnswer answerTo(const HTTPReceived& received) noexcept = 0;
    virtual void connectionRefused(const std::string& line) noexcept = 0;
    /// The connection's last call; the owner drops its reference.
    virtual void connectionEnded(const std::shared_ptr<HTTPConnection>& connection) noexcept = 0;
  };

  struct Setting {
    std::size_t number = 0;
    std::size_t maximumBody = 0;
    boost::asio::ssl::context* tls = nullptr;  ///< null: plain HTTP
  };

  static std::shared_ptr<HTTPConnection> make(boost::asio::ip::tcp::socket socket, Setting setting,
                                              Owner& owner);
  virtual ~HTTPConnection() = default;

  virtual void start() = 0;
  /// Sends the held answer, if any.
  virtual void release() = 0;
  /// Ends the connection and cancels pending operations.
  virtual void close() = 0;
};

}  // namespace vesk
