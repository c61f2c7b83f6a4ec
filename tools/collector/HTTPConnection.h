// One accepted connection of the development HTTP server.
#pragma once

#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/ssl/context.hpp>
#include <cstddef>
#include <memory>
#include <string>

#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// Reads requests and writes answers until either end closes. Everything runs on the server's one thread.
class HTTPConnection {
 public:
  /// The server, as its connections see it; outlives them.
  class Owner {
   public:
    virtual ~Owner() = default;
    /// Never throws.
    virtual HTTPAnswer answerTo(const HTTPReceived& received) noexcept = 0;
    virtual void connectionRefused(const std::string& line) noexcept = 0;
    /// The last call; the owner lets go of the connection.
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
  /// Sends the answer that is held, if there is one.
  virtual void release() = 0;
  /// Ends the connection; what is under way is cancelled.
  virtual void close() = 0;
};

}  // namespace vesk
