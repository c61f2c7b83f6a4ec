// A queue of exchanges.
#pragma once

#include <memory>
#include <utility>

#include "platform/http/HTTPExchange.h"

namespace vesk {

/// First in, first out. Uses the exchanges' own links and never allocates, so an existing exchange can always
/// be queued.
class HTTPQueue {
 public:
  using Exchange = std::unique_ptr<HTTPExchange>;

  HTTPQueue() = default;
  HTTPQueue(const HTTPQueue&) = delete;
  HTTPQueue& operator=(const HTTPQueue&) = delete;
  /// Destroys the exchanges one by one, since destroying a long chain would recurse.
  ~HTTPQueue() {
    while (pop()) {
    }
  }

  bool empty() const noexcept { return !_first; }
  /// The first exchange, or null. Follow `next` for the others.
  const HTTPExchange* front() const noexcept { return _first.get(); }

  void pushBack(Exchange exchange) noexcept {
    HTTPExchange* last = exchange.get();
    (_last ? _last->next : _first) = std::move(exchange);
    _last = last;
  }
  void pushFront(Exchange exchange) noexcept {
    exchange->next = std::move(_first);
    _first = std::move(exchange);
    if (!_last) _last = _first.get();
  }
  /// Removes and returns the first exchange, or null.
  Exchange pop() noexcept {
    Exchange first = std::move(_first);
    if (first) _first = std::move(first->next);
    if (!_first) _last = nullptr;
    return first;
  }
  void swap(HTTPQueue& other) noexcept {
    std::swap(_first, other._first);
    std::swap(_last, other._last);
  }

 private:
  Exchange _first;
  HTTPExchange* _last = nullptr;
};

}  // namespace vesk
