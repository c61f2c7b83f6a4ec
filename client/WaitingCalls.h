// The calls that the session's thread has taken and not sent yet.
#pragma once

#include <algorithm>
#include <iterator>
#include <optional>
#include <vector>

#include "client/ClientCall.h"

namespace vesk {

/// A queue that reuses its memory. For one thread.
class WaitingCalls {
 public:
  bool empty() const noexcept { return _next == _calls.size(); }
  std::size_t size() const noexcept { return _calls.size() - _next; }
  ClientCall& front() noexcept { return _calls[_next]; }
  /// 0 is the front.
  ClientCall& at(std::size_t index) noexcept { return _calls[_next + index]; }
  void popFront() noexcept {
    if (_calls[_next].wantsAnswer()) --_answered;
    _calls[_next++] = ClientCall{};
    if (empty()) clear();
  }

  /// Appends `calls` and leaves them empty. When it throws std::bad_alloc, nothing has changed.
  void append(std::vector<ClientCall>& calls) {
    std::size_t answered = 0;
    for (const ClientCall& call : calls) answered += call.wantsAnswer() ? 1 : 0;
    if (empty()) {
      _calls.swap(calls);
      _next = 0;
    } else {
      if (_next > _calls.size() / 2) removeGone();
      std::size_t needed = _calls.size() + calls.size();
      if (needed > _calls.capacity()) _calls.reserve(std::max(needed, 2 * _calls.capacity()));
      for (ClientCall& call : calls) _calls.push_back(std::move(call));
    }
    calls.clear();
    _answered += answered;
  }

  /// Moves those whose answer is overdue to `overdue`, in order. What they leave behind in the daemon is
  /// wanted all the same: such a call stays, one way, and only its end is moved (`call.member` is null). With
  /// `mayReplace`, it takes the place of one just before it that does the same. When it throws
  /// std::bad_alloc, all stay.
  void moveOverdue(std::vector<ClientCall>& overdue, ClientCall::Time now, bool mayReplace) {
    overdue.reserve(2 * _answered);
    removeGone();
    auto kept = _calls.begin();
    for (auto call = _calls.begin(); call != _calls.end(); ++call) {
      if (call->wantsAnswer() && call->deadline <= now) {
        --_answered;
        if (call->effect == CallEffect::None) {
          overdue.push_back(std::move(*call));
          continue;
        }
        overdue.emplace_back().end = std::move(call->end);
        if (mayReplace && kept != _calls.begin() && std::prev(kept)->isPlain() &&
            std::prev(kept)->effect == call->effect) {
          overdue.push_back(std::move(*--kept));
        }
      }
      if (kept++ != call) *std::prev(kept) = std::move(*call);
    }
    _calls.erase(kept, _calls.end());
  }

  /// When the first of the answers owed is due.
  std::optional<ClientCall::Time> firstDeadline() const noexcept {
    std::optional<ClientCall::Time> first;
    if (_answered == 0) return first;
    for (std::size_t i = _next; i < _calls.size(); ++i) {
      if (_calls[i].wantsAnswer() && (!first || _calls[i].deadline < *first)) first = _calls[i].deadline;
    }
    return first;
  }

 private:
  void clear() noexcept {
    _calls.clear();
    _next = 0;
  }
  void removeGone() {
    _calls.erase(_calls.begin(), _calls.begin() + static_cast<std::ptrdiff_t>(_next));
    _next = 0;
  }

  std::vector<ClientCall> _calls;
  std::size_t _next = 0;
  std::size_t _answered = 0;  ///< calls that want an answer
};

}  // namespace vesk
