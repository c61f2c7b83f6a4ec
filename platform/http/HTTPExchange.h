// One request on its way through the client, from `start` to its completion.
#pragma once

#include <chrono>
#include <cstddef>
#include <string_view>
#include <utility>

#include "platform/http/HTTPClient.h"

namespace vesk {

/// Owned by whoever has it in hand: the client's inbox, the schedule or a transfer. Its completion runs
/// exactly once: when nobody else did it, the destructor does, so that no caller waits for ever.
class HTTPExchange {
 public:
  using Instant = std::chrono::steady_clock::time_point;

  HTTPExchange(HTTPRequest wanted, HTTPClient::Completion completion, Instant now)
      : request(std::move(wanted)), started(now), _completion(std::move(completion)) {}
  ~HTTPExchange();
  HTTPExchange(const HTTPExchange&) = delete;
  HTTPExchange& operator=(const HTTPExchange&) = delete;

  bool isPost() const noexcept { return request.retry == HTTPRequest::Retry::UntilSent; }
  /// Scheme, host and port as they stand in the URL.
  std::string_view host() const noexcept;
  /// When a request that is not retried must be over.
  Instant deadline() const noexcept { return started + request.timeout; }
  /// Memory that it holds while it waits, roughly.
  std::size_t cost() const noexcept { return request.body.size() + 1024; }

  void complete(const HTTPResult& result) noexcept;
  void fail(HTTPError error) noexcept { complete(HTTPResult{std::nullopt, std::move(error)}); }

  HTTPRequest request;
  const Instant started;
  Instant firstAttempt{};  ///< once `attempts` is not 0
  unsigned attempts = 0;

 private:
  HTTPClient::Completion _completion;
};

/// Takes out, with a line in the log, every header that could break the request apart.
void removeUnsafeHeaders(HTTPRequest& request);

}  // namespace vesk
