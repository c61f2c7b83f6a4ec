// A libcurl easy handle that carries one exchange after another.
#pragma once

#include <curl/curl.h>

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/http/HTTPExchange.h"
#include "platform/http/HTTPSchedule.h"

namespace vesk {

/// The header lines of a request in libcurl's form. Its two allocations are reused for the next request.
class HTTPHeaderLines {
 public:
  void clear();
  void add(std::string_view name, std::string_view value);
  /// Prevents libcurl from adding this header.
  void suppress(std::string_view name);
  /// Valid until the next change.
  curl_slist* link();

 private:
  std::string _text;
  std::vector<std::size_t> _starts;
  std::vector<curl_slist> _nodes;
};

/// Used only by the client's thread. Holds at most one exchange, which owns the body while it is sent.
class HTTPTransfer {
 public:
  struct Outcome {
    bool answered = false;          ///< part of an answer arrived
    HTTPResult result;              ///< valid if `answered`
    HTTPSchedule::Failure failure;  ///< valid otherwise
  };

  /// `authorities`: the file of certificate authorities; nullopt for the system's.
  HTTPTransfer(const HTTPClient::Options& options, const std::optional<std::string>& authorities);

  CURL* handle() const noexcept { return _easy.get(); }
  bool isBusy() const noexcept { return _exchange != nullptr; }
  HTTPExchange* exchange() const noexcept { return _exchange.get(); }
  bool isPost() const noexcept { return _exchange && _exchange->isPost(); }

  /// Prepares the handle for `exchange` and takes ownership of it. Returns an error, and leaves the exchange
  /// with the caller, if it can't be sent.
  std::optional<HTTPError> prepare(std::unique_ptr<HTTPExchange>& exchange, HTTPExchange::Instant now);

  /// The outcome, once libcurl has finished with the handle.
  Outcome finish(CURLcode code);

  std::unique_ptr<HTTPExchange> release() noexcept { return std::move(_exchange); }

 private:
  struct FreeEasy {
    void operator()(CURL* easy) const noexcept { curl_easy_cleanup(easy); }
  };
  using Add = bool (HTTPTransfer::*)(std::string_view);
  template <Add add>
  static std::size_t receive(char* bytes, std::size_t size, std::size_t count, void* transfer) noexcept;
  static int prepareSocket(void* transfer, curl_socket_t socket, curlsocktype purpose) noexcept;
  bool addHeader(std::string_view line);
  bool addBody(std::string_view bytes);

  void setMethod(const HTTPRequest& request);
  void setHeaders(const HTTPRequest& request);
  void setTimes(const HTTPExchange& exchange, HTTPExchange::Instant now);
  HTTPSchedule::Failure failureFrom(CURLcode code) const;
  HTTPError errorFrom(CURLcode code) const;

  const std::size_t _maximumBody;
  const long _connectTimeout;  ///< milliseconds
  const std::chrono::milliseconds _acknowledgedWithin;
  std::unique_ptr<CURL, FreeEasy> _easy;
  char _errorText[CURL_ERROR_SIZE] = "";
  HTTPHeaderLines _lines;

  std::unique_ptr<HTTPExchange> _exchange;
  HTTPResponse _response;
  std::size_t _headerBytes = 0;
  bool _answered = false;
  bool _tooLarge = false;
};

}  // namespace vesk
