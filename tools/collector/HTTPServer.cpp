#include "tools/collector/HTTPServer.h"

#include <atomic>
#include <boost/asio/io_context.hpp>
#include <boost/asio/post.hpp>
#include <boost/asio/steady_timer.hpp>
#include <stdexcept>
#include <thread>
#include <unordered_set>

#include "tools/collector/HTTPConnection.h"

namespace vesk {

namespace asio = boost::asio;
using asio::ip::tcp;
using ErrorCode = boost::system::error_code;

namespace {

std::unique_ptr<asio::ssl::context> makeContext(const TLSIdentity& identity) {
  auto context = std::make_unique<asio::ssl::context>(asio::ssl::context::tls_server);
  try {
    context->set_options(asio::ssl::context::default_workarounds | asio::ssl::context::no_sslv3 |
                         asio::ssl::context::no_tlsv1 | asio::ssl::context::no_tlsv1_1);
    context->use_certificate_chain(asio::buffer(identity.certificateChain));
    context->use_private_key(asio::buffer(identity.privateKey), asio::ssl::context::pem);
  } catch (const std::exception& error) {
    throw std::runtime_error(std::string("the TLS identity can't be used: ") + error.what());
  }
  return context;
}

}  // namespace

class HTTPServer::Core : public HTTPConnection::Owner {
 public:
  Core(Options given, Handler handler)
      : options(std::move(given)),
        _handler(std::move(handler)),
        _tls(options.tls ? makeContext(*options.tls) : nullptr),
        _acceptor(_context),
        _again(_context) {
    listen();
    accept();
    _thread = std::thread([this] { run(); });
  }

  ~Core() override { stop(); }

  void stop() {
    if (!_thread.joinable()) return;
    asio::post(_context, [this] { closeAll(); });
    _thread.join();
  }

  const Options options;
  std::uint16_t port = 0;  // constant after construction
  std::atomic<std::size_t> accepted = 0;

  HTTPAnswer answerTo(const HTTPReceived& received) noexcept override {
    try {
      return _handler(received);
    } catch (const std::exception& error) {
      return HTTPAnswer::text(500, std::string("handler failed: ") + error.what());
    }
  }

  void connectionRefused(const std::string& line) override {
    if (options.onRefused) options.onRefused(line);
  }

  void connectionEnded(const std::shared_ptr<HTTPConnection>& connection) noexcept override {
    _connections.erase(connection);
  }

 private:
  void run() {
    while (true) {
      try {
        _context.run();
        return;
      } catch (const std::exception& error) {
        connectionRefused(std::string("a connection failed: ") + error.what());
      }
    }
  }

  void listen() {
    try {
      tcp::endpoint endpoint(asio::ip::make_address(options.address), options.port);
      _acceptor.open(endpoint.protocol());
      _acceptor.set_option(tcp::acceptor::reuse_address(true));
      _acceptor.bind(endpoint);
      _acceptor.listen();
      port = _acceptor.local_endpoint().port();
    } catch (const boost::system::system_error& error) {
      // what() would contain the name of one of the library's source files.
      const std::string wanted = "port " + std::to_string(options.port);
      throw std::runtime_error("can't listen on " + options.address +
                               (error.code() == asio::error::address_in_use
                                    ? ": " + wanted + " is in use"
                                    : " " + wanted + ": " + error.code().message()));
    }
  }

  void accept() {
    _acceptor.async_accept([this](ErrorCode error, tcp::socket socket) {
      if (error == asio::error::operation_aborted || !_acceptor.is_open()) return;
      if (error) return acceptLater();
      begin(std::move(socket));
      accept();
    });
  }

  /// Accepting fails mostly for lack of descriptors. The listening socket stays readable then, so an
  /// immediate retry would spin.
  void acceptLater() {
    _again.expires_after(std::chrono::milliseconds(100));
    _again.async_wait([this](ErrorCode error) {
      if (!error && _acceptor.is_open()) accept();
    });
  }

  void begin(tcp::socket socket) {
    ++accepted;
    if (_connections.size() >= options.maximumConnections)
      return connectionRefused("a connection over the limit of " +
                               std::to_string(options.maximumConnections));
    ErrorCode ignored;
    socket.set_option(tcp::no_delay(true), ignored);
    auto connection = std::make_shared<HTTPConnection>(
        std::move(socket), HTTPConnection::Setting{options.maximumBody, _tls.get()}, *this);
    _connections.insert(connection);
    connection->start();
  }

  void closeAll() {
    ErrorCode ignored;
    _acceptor.close(ignored);
    _again.cancel();
    for (const auto& connection : std::unordered_set(_connections)) connection->close();
  }

  const Handler _handler;
  const std::unique_ptr<asio::ssl::context> _tls;

  // Only used on `_thread` once it runs.
  asio::io_context _context{1};
  tcp::acceptor _acceptor;
  asio::steady_timer _again;
  std::unordered_set<std::shared_ptr<HTTPConnection>> _connections;

  std::thread _thread;
};

HTTPServer::HTTPServer(Options options, Handler handler)
    : _core(std::make_unique<Core>(std::move(options), std::move(handler))) {}

HTTPServer::~HTTPServer() = default;

std::uint16_t HTTPServer::port() const { return _core->port; }

std::string HTTPServer::baseURL() const {
  bool tls = _core->options.tls.has_value();
  return (tls ? "https://localhost:" : "http://127.0.0.1:") + std::to_string(port());
}

void HTTPServer::stop() { _core->stop(); }

std::size_t HTTPServer::connectionsAccepted() const { return _core->accepted; }

}  // namespace vesk
