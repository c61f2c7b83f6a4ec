#include "tools/collector/HTTPConnection.h"

#include <sys/socket.h>

#include <array>
#include <boost/asio/ssl/stream.hpp>
#include <boost/asio/steady_timer.hpp>
#include <boost/asio/write.hpp>
#include <boost/beast/core/flat_buffer.hpp>
#include <boost/beast/core/tcp_stream.hpp>
#include <boost/beast/http/parser.hpp>
#include <boost/beast/http/read.hpp>
#include <boost/beast/http/string_body.hpp>
#include <boost/beast/ssl/ssl_stream.hpp>
#include <optional>
#include <type_traits>

namespace vesk {

namespace asio = boost::asio;
namespace beast = boost::beast;
namespace http = boost::beast::http;
using ErrorCode = boost::system::error_code;

namespace {

constexpr std::chrono::seconds kIdleTimeout{300};   // between requests, and for a request's head
constexpr std::chrono::seconds kBodyTimeout{120};   // for a request's body, and for writing an answer
constexpr std::chrono::seconds kGoodbyeTimeout{2};  // for the peer to read the last answer and close
constexpr std::uint32_t kMaximumHead = 64 * 1024;   // bytes
constexpr std::size_t kMaximumDrain = 256UL << 20;  // bytes read and discarded after a refusal
constexpr std::size_t kSlowPieces = 10;
constexpr std::string_view kGarbage = "\x16\x03\x03 this is no HTTP \xff\xfe\r\n\r\n";

using PlainStream = beast::tcp_stream;
using TLSStream = beast::ssl_stream<beast::tcp_stream>;

std::string nameOf(const asio::ip::tcp::socket& socket) {
  ErrorCode error;
  auto endpoint = socket.remote_endpoint(error);
  if (error) return "unknown peer";
  std::string address = endpoint.address().to_string();
  if (endpoint.address().is_v6()) address = "[" + address + "]";
  return address + ":" + std::to_string(endpoint.port());
}

template <class Stream>
class StreamConnection final : public HTTPConnection,
                               public std::enable_shared_from_this<StreamConnection<Stream>> {
 public:
  static constexpr bool kTLS = std::is_same_v<Stream, TLSStream>;

  template <class... StreamArguments>
  StreamConnection(Setting setting, Owner& owner, std::string peer, StreamArguments&&... arguments)
      : _setting(setting),
        _owner(owner),
        _peer(std::move(peer)),
        _stream(std::forward<StreamArguments>(arguments)...),
        _pause(_stream.get_executor()) {}

  void start() override {
    if constexpr (kTLS) {
      tcp().expires_after(kBodyTimeout);
      _stream.async_handshake(asio::ssl::stream_base::server, bound(&StreamConnection::onHandshake));
    } else {
      readHead();
    }
  }

  void release() override {
    if (!_held) return;
    _answer = std::move(*_held);
    _held.reset();
    _answer.fault = HTTPAnswer::Fault::None;
    deliver();
  }

  void close() override {
    if (_ended) return;
    _ended = true;
    _pause.cancel();
    tcp().close();
    _owner.connectionEnded(this->shared_from_this());
  }

 private:
  /// Wraps a completion handler: it keeps the connection alive and is skipped once the connection has ended.
  template <class... Arguments>
  auto bound(void (StreamConnection::*method)(ErrorCode, Arguments...)) {
    return [self = this->shared_from_this(), method](ErrorCode error, Arguments... arguments) {
      if (!self->_ended) ((*self).*method)(error, arguments...);
    };
  }

  beast::tcp_stream& tcp() { return beast::get_lowest_layer(_stream); }

  void onHandshake(ErrorCode error) {
    if (error) {
      _owner.connectionRefused(_peer + ": no TLS connection: " + error.message());
      return close();
    }
    readHead();
  }

  // --- Reading a request ---

  void readHead() {
    _parser.emplace();
    _parser->header_limit(kMaximumHead);
    _parser->body_limit(_setting.maximumBody);
    tcp().expires_after(kIdleTimeout);
    http::async_read_header(_stream, _buffer, *_parser, bound(&StreamConnection::onHead));
  }

  void onHead(ErrorCode error, std::size_t) {
    if (error) return onReadError(error);
    tcp().expires_after(kBodyTimeout);
    if (!beast::iequals(_parser->get()[http::field::expect], "100-continue")) return readBody();
    _out = "HTTP/1.1 100 Continue\r\n\r\n";
    asio::async_write(_stream, asio::buffer(_out), bound(&StreamConnection::onContinueSent));
  }

  void onContinueSent(ErrorCode error, std::size_t) { error ? close() : readBody(); }

  void readBody() { http::async_read(_stream, _buffer, *_parser, bound(&StreamConnection::onRequest)); }

  void onReadError(ErrorCode error) {
    bool isHTTPError = error.category() == make_error_code(http::error::bad_method).category();
    if (!isHTTPError || error == http::error::end_of_stream) return close();
    _owner.connectionRefused(_peer + ": no HTTP request: " + error.message());
    unsigned status = error == http::error::body_limit ? 413 : error == http::error::header_limit ? 431 : 400;
    _answer = HTTPAnswer::text(status, error.message());
    _keepAlive = false;
    _out = answerHead(_answer, _answer.body.size(), false) + _answer.body;
    asio::async_write(_stream, asio::buffer(_out), bound(&StreamConnection::onRefusalSent));
  }

  void onRequest(ErrorCode error, std::size_t) {
    if (error) return onReadError(error);
    HTTPReceived received = takeRequest();
    _isHead = received.method == "HEAD";
    _answer = _owner.answerTo(received);
    deliver();
  }

  HTTPReceived takeRequest() {
    auto message = _parser->release();
    HTTPReceived received;
    received.method = std::string(message.method_string());
    received.target = std::string(message.target());
    for (const auto& field : message)
      received.headers.emplace_back(std::string(field.name_string()), std::string(field.value()));
    received.body = std::move(message.body());
    received.peer = _peer;
    received.connection = _setting.number;
    _keepAlive = message.keep_alive();
    return received;
  }

  // --- Delivering an answer, well or badly ---

  void deliver() {
    using Fault = HTTPAnswer::Fault;
    switch (_answer.fault) {
      case Fault::None:
      case Fault::CloseAfterAnswer:
        return sendAnswer();
      case Fault::Stall:
        return stall();
      case Fault::Hold:
        tcp().expires_never();
        _held = std::move(_answer);
        return;
      case Fault::ResetBeforeAnswer:
        return reset();
      case Fault::CloseWithoutAnswer:
        return close();
      case Fault::ResetMidAnswer:
        return sendHalf(bound(&StreamConnection::onHalfSentReset));
      case Fault::CloseMidAnswer:
        return sendHalf(bound(&StreamConnection::onHalfSentClose));
      case Fault::SlowBody:
        return sendSlowly();
      case Fault::Garbage:
        _out = kGarbage;
        _keepAlive = false;
        return send();
      case Fault::HugeBody:
        return sendHugely();
    }
  }

  std::string head(std::uint64_t length) {
    if (auto value = findHeader(_answer.headers, "Connection"); value && beast::iequals(*value, "close"))
      _keepAlive = false;
    return answerHead(_answer, length, _keepAlive);
  }

  bool hasBody() const { return !_isHead && mayHaveBody(_answer.status); }

  void sendAnswer() {
    _out = head(_answer.body.size());
    if (hasBody()) _out += _answer.body;
    if (_answer.fault == HTTPAnswer::Fault::CloseAfterAnswer) _keepAlive = false;
    send();
  }

  void send() {
    tcp().expires_after(kBodyTimeout);
    asio::async_write(_stream, asio::buffer(_out), bound(&StreamConnection::onAnswerSent));
  }

  void onAnswerSent(ErrorCode error, std::size_t) {
    if (error) return close();
    _keepAlive ? readHead() : sayGoodbye();
  }

  void stall() {
    tcp().expires_never();
    drain();
  }

  void reset() {
    ErrorCode ignored;
    tcp().socket().set_option(asio::socket_base::linger(true, 0), ignored);
    close();
  }

  template <class Completion>
  void sendHalf(Completion completion) {
    _out = head(_answer.body.size()) + _answer.body.substr(0, _answer.body.size() / 2);
    if (_answer.body.empty()) _out.resize(_out.size() / 2);
    asio::async_write(_stream, asio::buffer(_out), std::move(completion));
  }
  void onHalfSentReset(ErrorCode, std::size_t) { reset(); }
  void onHalfSentClose(ErrorCode, std::size_t) { close(); }

  void sendSlowly() {
    _out = head(_answer.body.size());
    _sent = 0;
    tcp().expires_never();
    asio::async_write(_stream, asio::buffer(_out), bound(&StreamConnection::onSlowPieceSent));
  }

  void onSlowPieceSent(ErrorCode error, std::size_t) {
    if (error) return close();
    if (_sent == _answer.body.size() || !hasBody()) return _keepAlive ? readHead() : sayGoodbye();
    _pause.expires_after(_answer.pause);
    _pause.async_wait(bound(&StreamConnection::onPaused));
  }

  void onPaused(ErrorCode) {
    std::size_t piece = std::min(_answer.body.size() / kSlowPieces + 1, _answer.body.size() - _sent);
    auto bytes = asio::buffer(_answer.body.data() + _sent, piece);
    _sent += piece;
    asio::async_write(_stream, bytes, bound(&StreamConnection::onSlowPieceSent));
  }

  void sendHugely() {
    _out = head(_answer.hugeBody);
    _left = _answer.hugeBody;
    tcp().expires_never();
    asio::async_write(_stream, asio::buffer(_out), bound(&StreamConnection::onHugePieceSent));
  }

  void onHugePieceSent(ErrorCode error, std::size_t) {
    if (error) return close();
    if (_left == 0 || !hasBody()) return _keepAlive ? readHead() : sayGoodbye();
    _out.assign(std::min<std::uint64_t>(_left, 64 * 1024), 'x');
    _left -= _out.size();
    asio::async_write(_stream, asio::buffer(_out), bound(&StreamConnection::onHugePieceSent));
  }

  // --- Ending ---

  /// Ends the stream and waits for the peer to close, so that no reset discards data it has yet to read.
  void sayGoodbye() {
    tcp().expires_after(kGoodbyeTimeout);
    if constexpr (kTLS) {
      _stream.async_shutdown(bound(&StreamConnection::onShutdown));
    } else {
      ErrorCode ignored;
      tcp().socket().shutdown(asio::socket_base::shutdown_send, ignored);
      drain();
    }
  }
  void onShutdown(ErrorCode) { close(); }

  /// The peer of a refused request may still be sending it, and reads the answer only afterwards.
  void onRefusalSent(ErrorCode error, std::size_t) {
    if (error) return close();
    tcp().expires_after(kGoodbyeTimeout);
    drain();
  }

  void drain() { _stream.async_read_some(asio::buffer(_scratch), bound(&StreamConnection::onDrained)); }

  void onDrained(ErrorCode error, std::size_t count) {
    _drained += count;
    if (error || _drained > kMaximumDrain) return close();
    drain();
  }

  const Setting _setting;
  Owner& _owner;
  const std::string _peer;

  Stream _stream;
  asio::steady_timer _pause;
  beast::flat_buffer _buffer;
  std::optional<http::request_parser<http::string_body>> _parser;
  bool _ended = false;

  // The request being answered.
  HTTPAnswer _answer;
  std::optional<HTTPAnswer> _held;
  bool _keepAlive = false;
  bool _isHead = false;
  std::string _out;         // what is being written
  std::size_t _sent = 0;    // bytes sent of a slow body
  std::uint64_t _left = 0;  // bytes left of a huge body

  std::array<char, 16 * 1024> _scratch;
  std::size_t _drained = 0;
};

}  // namespace

std::shared_ptr<HTTPConnection> HTTPConnection::make(asio::ip::tcp::socket socket, Setting setting,
                                                     Owner& owner) {
  std::string peer = nameOf(socket);
  if (setting.tls != nullptr)
    return std::make_shared<StreamConnection<TLSStream>>(setting, owner, std::move(peer), std::move(socket),
                                                         *setting.tls);
  return std::make_shared<StreamConnection<PlainStream>>(setting, owner, std::move(peer), std::move(socket));
}

}  // namespace vesk
