// HTTP requests for tests, made with a client independent of the project's own.
#pragma once

#include <curl/curl.h>

#include <memory>
#include <string>
#include <vector>

namespace vesk::test {

struct WebAnswer {
  CURLcode outcome = CURLE_OK;
  long status = 0;
  std::string body;
};

/// A client that keeps its connection alive between requests, like curl.
class WebClient {
 public:
  /// `authorityFile`: PEM file to verify HTTPS servers with; empty for the system's authorities.
  explicit WebClient(std::string authorityFile = {})
      : _authorityFile(std::move(authorityFile)), _curl(curl_easy_init()) {}

  WebAnswer get(const std::string& url, const std::vector<std::string>& headers = {}) {
    return perform("GET", url, headers, nullptr);
  }
  WebAnswer post(const std::string& url, const std::string& body,
                 const std::vector<std::string>& headers = {}) {
    return perform("POST", url, headers, &body);
  }

 private:
  WebAnswer perform(const std::string& method, const std::string& url,
                    const std::vector<std::string>& headers, const std::string* body);
  struct Cleanup {
    void operator()(CURL* curl) const { curl_easy_cleanup(curl); }
  };
  const std::string _authorityFile;
  std::unique_ptr<CURL, Cleanup> _curl;
};

}  // namespace vesk::test
