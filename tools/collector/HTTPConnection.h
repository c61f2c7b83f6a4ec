// One accepted connection of the development HTTP server.
#pragma once

#include <array>
#include <boost/asio/ip/tcp.hpp>
#include <boost/asio/ssl/stream.hpp>
#include <boost/asio/steady_timer.hpp>
#include <boost/beast/core/flat_buffer.hpp>
#include <boost/beast/core/tcp_stream.hpp>
#include <boost/beast/http/parser.hpp>
#include <boost/beast/http/string_body.hpp>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>

#include "tools/collector/HTTPMessage.h"

namespace vesk {

/// Reads requests and writes answers until either end closes. Runs on the server's thread.
class HTTPConnection : public std::enable_shared_from_this<HTTPConnection> {
 public:
  /// The server's interface for its connections. Outlives them.
  class Owner {
   public:
    virtual ~Owner() = default;
    /// Must not throw.
    virtual HTTPAnswer answerTo(const HTTPReceived& received) noexcept = 0;
    virtual void connectionRefused(const std::string& line) = 0;
    /// The connection's last call; the owner drops its reference.
    virtual void connectionEnded(const std::shared_ptr<HTTPConnection>& connection) noexcept = 0;
  };
  struct Setting {
    std::size_t maximumBody = 0;
    boost::asio::ssl::context* tls = nullptr;  ///< null: plain HTTP
  };
  HTTPConnection(boost::asio::ip::tcp::socket socket, Setting setting, Owner& owner);

  void start();
  /// Ends the connection and cancels pending operations.
  void close();

 private:
  using ErrorCode = boost::system::error_code;

  template <class Step>
  auto after(Step step);
  template <class Use>
  void onStream(Use use);
  template <class Step>
  void write(std::string bytes, Step step);

  void readHead();
  void readBody();
  void onReadError(ErrorCode error);
  void takeRequest();

  void deliver();
  std::string head(std::uint64_t length);
  std::string half();
  void sendSlowly(std::size_t sent);
  void sendHugely(std::uint64_t left);
  void send(std::string bytes);
  void answered();

  void reset();
  void sayGoodbye();
  void drain();

  // Constant after construction.
  const Setting _setting;
  Owner& _owner;
  const std::string _peer;

  boost::beast::tcp_stream _tcp;
  std::optional<boost::asio::ssl::stream<boost::beast::tcp_stream&>> _tls;  // on `_tcp`
  boost::asio::steady_timer _pause;
  boost::beast::flat_buffer _buffer;
  std::optional<boost::beast::http::request_parser<boost::beast::http::string_body>> _parser;
  bool _ended = false;

  // The request being answered.
  HTTPAnswer _answer;
  bool _keepAlive = false;
  bool _hasBody = false;
  std::string _out;  // what is being written

  std::array<char, 16 * 1024> _scratch;
  std::size_t _drained = 0;
};

}  // namespace vesk
