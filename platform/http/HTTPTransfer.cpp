#include "platform/http/HTTPTransfer.h"

#include <netinet/in.h>
#include <netinet/tcp.h>
#include <sys/socket.h>

#include <algorithm>
#include <chrono>
#include <new>

#include "platform/text/ASCII.h"

namespace vesk {

namespace {

using Kind = HTTPError::Kind;

constexpr std::size_t kMaximumHeaders = std::size_t{256} << 10;  // bytes of an answer's header lines

[[noreturn]] void outOfMemory() { throw std::bad_alloc(); }

template <class Value>
void set(CURL* easy, CURLoption option, Value value) {
  if (curl_easy_setopt(easy, option, value) == CURLE_OUT_OF_MEMORY) outOfMemory();
}

bool startsWithScheme(std::string_view url, std::string_view scheme) {
  return url.size() > scheme.size() && equalsIgnoringASCIICase(url.substr(0, scheme.size()), scheme);
}

Kind kindOf(CURLcode code) {
  switch (code) {
    case CURLE_COULDNT_CONNECT:
      return Kind::Connect;
    case CURLE_COULDNT_RESOLVE_HOST:
    case CURLE_COULDNT_RESOLVE_PROXY:
      return Kind::Resolve;
    case CURLE_OPERATION_TIMEDOUT:
      return Kind::Timeout;
    case CURLE_SSL_CONNECT_ERROR:
    case CURLE_PEER_FAILED_VERIFICATION:
    case CURLE_SSL_CACERT_BADFILE:
    case CURLE_SSL_CERTPROBLEM:
    case CURLE_SSL_CIPHER:
    case CURLE_SSL_ISSUER_ERROR:
    case CURLE_SSL_INVALIDCERTSTATUS:
      return Kind::TLS;
    case CURLE_SEND_ERROR:
    case CURLE_RECV_ERROR:
    case CURLE_GOT_NOTHING:
    case CURLE_PARTIAL_FILE:
    case CURLE_HTTP2:
    case CURLE_HTTP2_STREAM:
      return Kind::Interrupted;
    case CURLE_URL_MALFORMAT:
      return Kind::BadURL;
    case CURLE_OUT_OF_MEMORY:
      return Kind::OutOfMemory;
    default:
      return Kind::Other;
  }
}

/// Whether a failure without an answer is temporary.
bool passes(CURLcode code, CURL* easy) {
  switch (kindOf(code)) {
    case Kind::Connect:
    case Kind::Resolve:
    case Kind::Interrupted:
      return true;
    case Kind::TLS:
      // The server may have gone down during the handshake. A certificate that can't be verified may come
      // from a captive portal before the user has logged in.
      return code == CURLE_SSL_CONNECT_ERROR || code == CURLE_PEER_FAILED_VERIFICATION ||
             code == CURLE_SSL_ISSUER_ERROR || code == CURLE_SSL_INVALIDCERTSTATUS;
    case Kind::Timeout: {
      // Only if the request was not sent: a server that has it may still be processing it.
      curl_off_t sent = 0;
      curl_easy_getinfo(easy, CURLINFO_PRETRANSFER_TIME_T, &sent);
      return sent == 0;
    }
    default:
      return false;
  }
}

}  // namespace

void HTTPHeaderLines::clear() {
  _text.clear();
  _starts.clear();
}

void HTTPHeaderLines::add(std::string_view name, std::string_view value) {
  _starts.push_back(_text.size());
  _text += name;
  // libcurl's form for a header without a value.
  value = trimmed(value);
  if (value.empty()) {
    _text += ';';
  } else {
    (_text += ": ") += value;
  }
  _text += '\0';
}

void HTTPHeaderLines::suppress(std::string_view name) {
  _starts.push_back(_text.size());
  (_text += name) += ':';
  _text += '\0';
}

curl_slist* HTTPHeaderLines::link() {
  _nodes.resize(_starts.size());
  for (std::size_t i = 0; i < _nodes.size(); ++i) {
    _nodes[i].data = _text.data() + _starts[i];
    _nodes[i].next = i + 1 < _nodes.size() ? &_nodes[i + 1] : nullptr;
  }
  return _nodes.empty() ? nullptr : _nodes.data();
}

HTTPTransfer::HTTPTransfer(const HTTPClient::Options& options, const std::optional<std::string>& authorities)
    : _maximumBody(options.maximumBody),
      _connectTimeout(static_cast<long>(options.connectTimeout.count())),
      _acknowledgedWithin(options.acknowledgedWithin),
      _easy(curl_easy_init()) {
  if (!_easy) outOfMemory();
  CURL* easy = _easy.get();
  set(easy, CURLOPT_NOSIGNAL, 1L);
  set(easy, CURLOPT_PROTOCOLS_STR, "http,https");
  set(easy, CURLOPT_FOLLOWLOCATION, 0L);
  set(easy, CURLOPT_HTTP_VERSION, static_cast<long>(CURL_HTTP_VERSION_2TLS));
  set(easy, CURLOPT_USERAGENT, options.userAgent.c_str());
  // A name server that does not answer must not delay other requests or the end of the process.
  set(easy, CURLOPT_QUICK_EXIT, 1L);
  if (authorities) {
    set(easy, CURLOPT_CAINFO, authorities->c_str());
    set(easy, CURLOPT_CAPATH, static_cast<const char*>(nullptr));
  }
  // A proxy's answer to CONNECT is not the server's.
  set(easy, CURLOPT_SUPPRESS_CONNECT_HEADERS, 1L);
  set(easy, CURLOPT_SOCKOPTFUNCTION, &HTTPTransfer::prepareSocket);
  set(easy, CURLOPT_SOCKOPTDATA, this);
  set(easy, CURLOPT_PRIVATE, this);
  set(easy, CURLOPT_ERRORBUFFER, _errorText);
  set(easy, CURLOPT_HEADERFUNCTION, &HTTPTransfer::receive<&HTTPTransfer::addHeader>);
  set(easy, CURLOPT_HEADERDATA, this);
  set(easy, CURLOPT_WRITEFUNCTION, &HTTPTransfer::receive<&HTTPTransfer::addBody>);
  set(easy, CURLOPT_WRITEDATA, this);
}

std::optional<HTTPError> HTTPTransfer::prepare(std::unique_ptr<HTTPExchange>& exchange,
                                               HTTPExchange::Instant now) {
  const HTTPRequest& request = exchange->request;
  if (!startsWithScheme(request.url, "http://") && !startsWithScheme(request.url, "https://")) {
    return HTTPError{Kind::BadURL, "not an http or https URL"};
  }
  _response = {};
  _headerBytes = 0;
  _answered = _tooLarge = false;
  _errorText[0] = '\0';

  set(handle(), CURLOPT_URL, request.url.c_str());
  // libcurl resends a request that failed on a kept connection. Requests that must not be sent twice get a
  // new connection.
  set(handle(), CURLOPT_FRESH_CONNECT, exchange->isPost() ? 0L : 1L);
  setMethod(request);
  setHeaders(request);
  setTimes(*exchange, now);
  _exchange = std::move(exchange);
  return std::nullopt;
}

void HTTPTransfer::setMethod(const HTTPRequest& request) {
  CURL* easy = handle();
  set(easy, CURLOPT_CUSTOMREQUEST, static_cast<const char*>(nullptr));
  if (request.method == "HEAD") {
    set(easy, CURLOPT_NOBODY, 1L);
    return;
  }
  if (request.method == "POST" || !request.body.empty()) {
    set(easy, CURLOPT_POST, 1L);
    set(easy, CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(request.body.size()));
    set(easy, CURLOPT_POSTFIELDS, request.body.data());
    if (request.method != "POST") set(easy, CURLOPT_CUSTOMREQUEST, request.method.c_str());
  } else {
    set(easy, CURLOPT_HTTPGET, 1L);
    if (request.method != "GET") set(easy, CURLOPT_CUSTOMREQUEST, request.method.c_str());
  }
}

void HTTPTransfer::setHeaders(const HTTPRequest& request) {
  _lines.clear();
  bool hasType = false;
  for (const auto& [name, value] : request.headers) {
    _lines.add(name, value);
    hasType = hasType || equalsIgnoringASCIICase(name, "Content-Type");
  }
  _lines.suppress("Expect");
  if (!hasType) _lines.suppress("Content-Type");
  set(handle(), CURLOPT_HTTPHEADER, _lines.link());
}

void HTTPTransfer::setTimes(const HTTPExchange& exchange, HTTPExchange::Instant now) {
  auto timeout = exchange.request.timeout;
  if (!exchange.isPost()) {
    timeout = std::chrono::duration_cast<std::chrono::milliseconds>(exchange.deadline() - now);
  }
  // libcurl takes 0 for "no limit".
  long limit = std::max<long>(static_cast<long>(timeout.count()), 1);
  set(handle(), CURLOPT_TIMEOUT_MS, limit);
  set(handle(), CURLOPT_LOW_SPEED_LIMIT, exchange.request.leastBytesPerSecond);
  set(handle(), CURLOPT_LOW_SPEED_TIME, static_cast<long>(exchange.request.slowFor.count()));
  set(handle(), CURLOPT_CONNECTTIMEOUT_MS, std::clamp<long>(_connectTimeout, 1, limit));
}

HTTPTransfer::Outcome HTTPTransfer::finish(CURLcode code) {
  Outcome outcome;
  outcome.answered = _answered || code == CURLE_OK;
  if (!outcome.answered) {
    outcome.failure = failureFrom(code);
    return outcome;
  }
  if (code != CURLE_OK) {
    outcome.result.error = errorFrom(code);
    _response.body.clear();
  }
  curl_easy_getinfo(handle(), CURLINFO_RESPONSE_CODE, &_response.status);
  const bool isInterim = _response.status < 200;
  if (code == CURLE_OK || (_answered && !isInterim)) outcome.result.response = std::move(_response);
  return outcome;
}

HTTPSchedule::Failure HTTPTransfer::failureFrom(CURLcode code) const {
  HTTPSchedule::Failure failure{.error = errorFrom(code), .mayRetry = passes(code, handle())};
  const Kind kind = failure.error.kind;
  failure.mayKeep = kind != Kind::BadURL && kind != Kind::OutOfMemory && kind != Kind::TooLarge;
  curl_off_t sent = 0;
  curl_easy_getinfo(handle(), CURLINFO_SIZE_UPLOAD_T, &sent);
  failure.wasSentWhole =
      !_exchange->request.body.empty() && static_cast<std::size_t>(sent) >= _exchange->request.body.size();
  return failure;
}

HTTPError HTTPTransfer::errorFrom(CURLcode code) const {
  if (_tooLarge) {
    return {Kind::TooLarge, "the answer is longer than " + std::to_string(_maximumBody) + " bytes"};
  }
  return {kindOf(code), _errorText[0] ? _errorText : curl_easy_strerror(code)};
}

// An exception must not pass through libcurl, which is written in C.
template <HTTPTransfer::Add add>
std::size_t HTTPTransfer::receive(char* bytes, std::size_t size, std::size_t count, void* transfer) noexcept {
  auto* self = static_cast<HTTPTransfer*>(transfer);
  return (self->*add)({bytes, size * count}) ? size * count : 0;
}

// Only for posts, which are sent again. Other requests should use their whole timeout.
int HTTPTransfer::prepareSocket(void* transfer, curl_socket_t socket, curlsocktype) noexcept {
  const auto* self = static_cast<const HTTPTransfer*>(transfer);
  const auto limit = static_cast<unsigned>(self->_acknowledgedWithin.count());
  if (self->isPost()) (void)::setsockopt(socket, IPPROTO_TCP, TCP_USER_TIMEOUT, &limit, sizeof limit);
  return CURL_SOCKOPT_OK;
}

bool HTTPTransfer::addHeader(std::string_view line) {
  _answered = true;
  _headerBytes += line.size();
  _tooLarge = _headerBytes > kMaximumHeaders;
  if (_tooLarge) return false;
  if (line.starts_with("HTTP/")) {
    // Discards the headers of a preceding interim answer.
    _response.headers.clear();
    return true;
  }
  auto colon = line.find(':');
  if (colon != std::string_view::npos) {
    _response.headers.emplace_back(line.substr(0, colon), trimmed(line.substr(colon + 1)));
  }
  return true;
}

bool HTTPTransfer::addBody(std::string_view bytes) {
  _answered = true;
  _tooLarge = bytes.size() > _maximumBody - _response.body.size();
  if (_tooLarge) return false;
  _response.body += bytes;
  return true;
}

}  // namespace vesk
