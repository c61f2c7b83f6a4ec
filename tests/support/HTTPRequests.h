// Requests for tests of the HTTP client.
#pragma once

#include "platform/http/HTTPClient.h"

namespace vesk::test {

inline HTTPRequest fetchFrom(const std::string& url) {
  HTTPRequest request;
  request.url = url;
  return request;
}

inline HTTPRequest postTo(const std::string& url, std::string body = "event",
                          HTTPRequest::Retry retry = HTTPRequest::Retry::UntilSent) {
  HTTPRequest request = fetchFrom(url);
  request.method = "POST";
  request.body = std::move(body);
  request.retry = retry;
  return request;
}

}  // namespace vesk::test
