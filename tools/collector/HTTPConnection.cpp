#include "tools/collector/HTTPConnection.h"

#include <boost/asio/write.hpp>
#include <boost/beast/http/read.hpp>

namespace vesk {

namespace asio = boost::asio;
namespace beast = boost::beast;
namespace http = boost::beast::http;

namespace {

constexpr std::chrono::seconds kIdleTimeout{300};   // between requests, and for a request's head
constexpr std::chrono::seconds kBodyTimeout{120};   // for a request's body, and for writing an answer
constexpr std::chrono::seconds kGoodbyeTimeout{2};  // for the peer to read the last answer and close
constexpr std::uint32_t kMaximumHead = 64 * 1024;   // bytes
constexpr std::size_t kMaximumDrain = 256UL << 20;  // bytes read and discarded after a refusal
constexpr std::size_t kSlowPieces = 10;
constexpr std::uint64_t kHugeBody = std::uint64_t{1} << 30;  // bytes
constexpr std::size_t kHugePiece = 64 * 1024;                // bytes
constexpr std::string_view kGarbage = "\x16\x03\x03 this is no HTTP \xff\xfe\r\n\r\n";

std::string nameOf(const asio::ip::tcp::socket& socket) {
  boost::system::error_code error;
  auto endpoint = socket.remote_endpoint(error);
  if (error) return "unknown peer";
  std::string address = endpoint.address().to_string();
  if (endpoint.address().is_v6()) address = "[" + address + "]";
  return address + ":" + std::to_string(endpoint.port());
}

}  // namespace

HTTPConnection::HTTPConnection(asio::ip::tcp::socket socket, Setting setting, Owner& owner)
    : _setting(setting),
      _owner(owner),
      _peer(nameOf(socket)),
      _tcp(std::move(socket)),
      _pause(_tcp.get_executor()) {
  if (setting.tls != nullptr) _tls.emplace(_tcp, *setting.tls);
}

/// Makes `step`, which gets the error, a completion handler: it keeps the connection alive and is skipped
/// once the connection has ended.
template <class Step>
auto HTTPConnection::after(Step step) {
  return [self = shared_from_this(), step = std::move(step)](ErrorCode error, std::size_t size = 0) mutable {
    if (self->_ended) return;
    if constexpr (std::is_invocable_v<Step&, ErrorCode, std::size_t>) {
      step(error, size);
    } else {
      error ? self->close() : step();
    }
  };
}

template <class Use>
void HTTPConnection::onStream(Use use) {
  _tls ? use(*_tls) : use(_tcp);
}

template <class Step>
void HTTPConnection::write(std::string bytes, Step step) {
  _out = std::move(bytes);
  onStream([&](auto& stream) { asio::async_write(stream, asio::buffer(_out), after(std::move(step))); });
}

void HTTPConnection::start() {
  if (!_tls) return readHead();
  _tcp.expires_after(kBodyTimeout);
  _tls->async_handshake(asio::ssl::stream_base::server, after([this](ErrorCode error, std::size_t) {
                          if (!error) return readHead();
                          _owner.connectionRefused(_peer + ": no TLS connection: " + error.message());
                          close();
                        }));
}

void HTTPConnection::close() {
  if (_ended) return;
  _ended = true;
  _pause.cancel();
  _tcp.close();
  _owner.connectionEnded(shared_from_this());
}

// --- Reading a request

void HTTPConnection::readHead() {
  _parser.emplace();
  _parser->header_limit(kMaximumHead);
  _parser->body_limit(_setting.maximumBody);
  _tcp.expires_after(kIdleTimeout);
  auto onHead = [this](ErrorCode error, std::size_t) {
    if (error) return onReadError(error);
    _tcp.expires_after(kBodyTimeout);
    if (!beast::iequals(_parser->get()[http::field::expect], "100-continue")) return readBody();
    write("HTTP/1.1 100 Continue\r\n\r\n", [this] { readBody(); });
  };
  onStream([&](auto& stream) { http::async_read_header(stream, _buffer, *_parser, after(onHead)); });
}

void HTTPConnection::readBody() {
  auto onBody = [this](ErrorCode error, std::size_t) { error ? onReadError(error) : takeRequest(); };
  onStream([&](auto& stream) { http::async_read(stream, _buffer, *_parser, after(onBody)); });
}

void HTTPConnection::onReadError(ErrorCode error) {
  bool isHTTPError = error.category() == make_error_code(http::error::bad_method).category();
  if (!isHTTPError || error == http::error::end_of_stream) return close();
  _owner.connectionRefused(_peer + ": no HTTP request: " + error.message());
  unsigned status = error == http::error::body_limit ? 413 : error == http::error::header_limit ? 431 : 400;
  _answer = HTTPAnswer::text(status, error.message());
  // The peer may still be sending the request, and reads the answer only afterwards.
  write(answerHead(_answer, _answer.body.size(), false) + _answer.body, [this] {
    _tcp.expires_after(kGoodbyeTimeout);
    drain();
  });
}

void HTTPConnection::takeRequest() {
  auto message = _parser->release();
  HTTPReceived received;
  received.method = std::string(message.method_string());
  received.target = std::string(message.target());
  for (const auto& field : message)
    received.headers.emplace_back(std::string(field.name_string()), std::string(field.value()));
  received.body = std::move(message.body());
  received.peer = _peer;
  _keepAlive = message.keep_alive();
  _answer = _owner.answerTo(received);
  _hasBody = received.method != "HEAD" && mayHaveBody(_answer.status);
  deliver();
}

// --- Delivering an answer, well or badly

void HTTPConnection::deliver() {
  using Fault = HTTPAnswer::Fault;
  const std::string& body = _answer.body;
  switch (_answer.fault) {
    case Fault::None:
      return send(head(body.size()) + (_hasBody ? body : ""));
    case Fault::CloseAfterAnswer: {
      std::string promising = head(body.size()) + (_hasBody ? body : "");
      _keepAlive = false;
      return send(std::move(promising));
    }
    case Fault::Stall:
      _tcp.expires_never();
      return drain();
    case Fault::ResetBeforeAnswer:
      return reset();
    case Fault::CloseWithoutAnswer:
      return close();
    case Fault::ResetMidAnswer:
      return write(half(), [this] { reset(); });
    case Fault::CloseMidAnswer:
      return write(half(), [this] { close(); });
    case Fault::SlowBody:
      _tcp.expires_never();
      return write(head(body.size()), [this] { sendSlowly(_hasBody ? 0 : _answer.body.size()); });
    case Fault::Garbage:
      _keepAlive = false;
      return send(std::string(kGarbage));
    case Fault::HugeBody:
      _tcp.expires_never();
      return write(head(kHugeBody), [this] { sendHugely(_hasBody ? kHugeBody : 0); });
  }
}

std::string HTTPConnection::head(std::uint64_t length) {
  if (auto value = findHeader(_answer.headers, "Connection"); value && beast::iequals(*value, "close"))
    _keepAlive = false;
  return answerHead(_answer, length, _keepAlive);
}

std::string HTTPConnection::half() {
  std::string bytes = head(_answer.body.size());
  return _answer.body.empty() ? bytes.substr(0, bytes.size() / 2)
                              : bytes + _answer.body.substr(0, _answer.body.size() / 2);
}

void HTTPConnection::sendSlowly(std::size_t sent) {
  if (sent == _answer.body.size()) return answered();
  std::string piece = _answer.body.substr(sent, _answer.body.size() / kSlowPieces + 1);
  _pause.expires_after(_answer.pause);
  _pause.async_wait(
      after([this, sent, piece] { write(piece, [this, now = sent + piece.size()] { sendSlowly(now); }); }));
}

void HTTPConnection::sendHugely(std::uint64_t left) {
  if (left == 0) return answered();
  const std::size_t size = std::min<std::uint64_t>(left, kHugePiece);
  write(std::string(size, 'x'), [this, left, size] { sendHugely(left - size); });
}

void HTTPConnection::send(std::string bytes) {
  _tcp.expires_after(kBodyTimeout);
  write(std::move(bytes), [this] { answered(); });
}

void HTTPConnection::answered() { _keepAlive ? readHead() : sayGoodbye(); }

// --- Ending

void HTTPConnection::reset() {
  ErrorCode ignored;
  _tcp.socket().set_option(asio::socket_base::linger(true, 0), ignored);
  close();
}

/// Ends the stream and waits for the peer to close, so that no reset discards data it has yet to read.
void HTTPConnection::sayGoodbye() {
  _tcp.expires_after(kGoodbyeTimeout);
  if (_tls) return _tls->async_shutdown(after([this] { close(); }));
  ErrorCode ignored;
  _tcp.socket().shutdown(asio::socket_base::shutdown_send, ignored);
  drain();
}

void HTTPConnection::drain() {
  auto onDrained = [this](ErrorCode error, std::size_t count) {
    _drained += count;
    if (error || _drained > kMaximumDrain) return close();
    drain();
  };
  onStream([&](auto& stream) { stream.async_read_some(asio::buffer(_scratch), after(onDrained)); });
}

}  // namespace vesk
