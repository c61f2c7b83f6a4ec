// One libcurl easy handle, which carries one exchange after another.
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

namespace vesk {

/// The header lines of one request in the form that libcurl reads, in two allocations that are kept from one
/// request to the next.
class HTTPHeaderLines {
 public:
  void clear();
  void add(std::string_view name, std::string_view value);
  /// Tells libcurl not to add a header of its own.
  void suppress(std::string_view name);
  /// Valid until the next change.
  curl_slist* link();

 private:
  std::string _text;
  std::vector<std::size_t> _starts;
  std::vector<curl_slist> _nodes;
};

/// Used by the client's thread only. Holds no more than one exchange at a time, which owns the bytes of the
/// body while they are sent.
class HTTPTransfer {
 public:
  struct Outcome {
    HTTPResult result;
    bool answered = false;  ///< some part of an answer arrived
    bool mayRetry = false;  ///< nothing of an answer arrived, and another attempt may do better
  };

  /// `authorities`: file of the certificate authorities, or the system's. Throws std::bad_alloc.
  HTTPTransfer(const HTTPClient::Options& options, const std::optional<std::string>& authorities);

  CURL* handle() const noexcept { return _easy.get(); }
  bool isBusy() const noexcept { return _exchange != nullptr; }
  bool isPost() const noexcept { return _exchange && _exchange->isPost(); }

  /// Makes the handle ready to send `exchange` and takes it over, unless there is an error: then it can't be
  /// sent. Throws std::bad_alloc.
  std::optional<HTTPError> prepare(std::unique_ptr<HTTPExchange>& exchange, HTTPExchange::Instant now);

  /// What became of it, once libcurl is done with the handle.
  Outcome finish(CURLcode code) noexcept;

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
  HTTPError errorFrom(CURLcode code) const noexcept;

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
  bool _outOfMemory = false;
};

}  // namespace vesk
